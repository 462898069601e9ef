"""A fresh Debian 12 in a root directory of its own, with its own service manager.

debootstrap makes it once, with the dependencies of the packages that are to be tried; each use sees that through an
overlay in memory. Mounts and processes belong to namespaces which end with the program, so whoever uses this is started
by `in_own_namespaces`. Needs root, and the archive of Debian for the first time.
"""
import hashlib
import os
import shutil
import subprocess
import sys

from stage.processes import PATIENCE, wait_until

SOURCE = os.path.dirname(os.path.dirname(os.path.dirname(os.path.abspath(__file__))))
MIRROR = "http://deb.debian.org/debian"
# What the trials use besides the packages' own dependencies: a service manager, a display, and what the guides tell
# their reader to have.
TOOLS = ("systemd", "ca-certificates", "python3", "xvfb", "gcc", "g++", "make", "cmake", "pkg-config", "libxcb1-dev", "ffmpeg",
         "python3-numpy")
PATH = "/usr/sbin:/usr/bin:/sbin:/bin"
DEVICES = ("null", "zero", "full", "random", "urandom", "tty")
# Runs as the first process of the service manager's namespaces, where what it mounts and hides is its own. What the
# kernel shares with everybody is read-only.
BOOT = """set -e
cd "$1"
mount -t proc proc proc
mount --bind proc/sys proc/sys
mount -o remount,bind,ro proc/sys
mount -t sysfs -o ro sysfs sys
mount -t cgroup2 cgroup2 sys/fs/cgroup
pivot_root . mnt
umount -l mnt
exec env -i container=quorveld-trial PATH="$2" /lib/systemd/systemd --unit=basic.target --log-target=journal --show-status=no
"""


def in_own_namespaces():
    """Starts the program anew as the first process of namespaces of its own, unless it is that."""
    if os.getpid() != 1:
        os.execvp("unshare", ["unshare", "--mount", "--propagation=private", "--pid", "--mount-proc", "--fork",
                              "--kill-child", sys.executable, *sys.argv])


def mount(*arguments):
    subprocess.run(["mount", *arguments], check=True)


def mount_devices(root):
    mount("-t", "tmpfs", "-o", "mode=755", "tmpfs", root + "/dev")
    for name in DEVICES:
        open(f"{root}/dev/{name}", "w", encoding="utf-8").close()
        mount("--bind", "/dev/" + name, f"{root}/dev/{name}")
    for folder, kind, options in (("pts", "devpts", "newinstance,ptmxmode=0666,mode=0620"), ("shm", "tmpfs", "mode=1777")):
        os.mkdir(f"{root}/dev/{folder}")
        mount("-t", kind, "-o", options, kind, f"{root}/dev/{folder}")
    # What the service manager copies for a service with devices of its own.
    os.symlink("pts/ptmx", root + "/dev/ptmx")
    os.symlink("/proc/self/fd", root + "/dev/fd")


def apt_install(root, *arguments):
    """What apt says, in a root whose service manager does not run."""
    script = 'root=$1; shift; mount -t proc proc "$root/proc"; exec chroot "$root" "$@"'
    return subprocess.run(["unshare", "--mount", "--propagation=private", "sh", "-ec", script, "sh", root, "apt-get", "install",
                           "-y", "--no-install-recommends", *arguments], check=True, stdout=subprocess.PIPE, text=True,
                          env={"PATH": PATH, "LC_ALL": "C.UTF-8", "DEBIAN_FRONTEND": "noninteractive"}).stdout


def dependencies(root, packages):
    """What would be installed with these packages, files of the root, and is in the archive."""
    said = apt_install(root, "-s", *packages)
    names = [line.split()[1] for line in said.splitlines() if line.startswith("Inst ")]
    own = {os.path.basename(path).split("_")[0] for path in packages}
    return [name for name in names if name not in own]


class FreshRoot:
    """A context manager: from its beginning to its end the service manager runs. `path` is the root as it lies outside. In it
    are the packages (`installed`: by their files), and in /sources what this project has, to be read.

    Threading: one thread's.
    """

    def __init__(self, folder, packages):
        """`folder` keeps what was made; `packages` are the .deb files that are to be tried."""
        self.folder = os.path.abspath(folder)
        self.packages = sorted(map(os.path.abspath, packages))
        self.path = os.path.join(self.folder, "root")
        self.cgroups = os.path.join(self.folder, "cgroup")
        self.cgroup = os.path.join(self.cgroups, f"quorveld-trial-{os.getppid()}")
        self.installed = ["/debs/" + os.path.basename(path) for path in self.packages]

    def __enter__(self):
        for folder in (self.path, self.cgroups):
            os.makedirs(folder, exist_ok=True)
        self.overlay(self.made_base())
        self.bring_packages(self.path)
        mount("-t", "cgroup2", "cgroup2", self.cgroups)
        os.mkdir(self.cgroup)
        try:
            self.boot()
        except BaseException:
            self.__exit__()
            raise
        return self

    def __exit__(self, *_):
        self.manager.kill()
        self.manager.wait()
        for folder, _, _ in os.walk(self.cgroup, topdown=False):
            wait_until(f"an empty {folder}", lambda folder=folder: not is_busy(folder))

    def made_base(self):
        wanted = hashlib.sha256("".join(map(self.dependency_lines, self.packages)).encode() + repr(TOOLS).encode())
        base = os.path.join(self.folder, "base-" + wanted.hexdigest()[:12])
        if not os.path.isdir(base):
            print("making a Debian 12 in " + base, flush=True)
            for name in os.listdir(self.folder):
                if name.startswith(("base-", "unfinished")):
                    shutil.rmtree(os.path.join(self.folder, name))
            unfinished = os.path.join(self.folder, "unfinished")
            subprocess.run(["debootstrap", "--variant=minbase", "bookworm", unfinished, MIRROR], check=True,
                           stdout=subprocess.DEVNULL)
            self.fill_base(unfinished)
            os.rename(unfinished, base)
        return base

    def dependency_lines(self, package):
        return subprocess.run(["dpkg-deb", "--field", package, "Depends"], check=True, capture_output=True, text=True).stdout

    def fill_base(self, root):
        shutil.copy("/etc/resolv.conf", root + "/etc/resolv.conf")
        self.bring_packages(root)
        apt_install(root, *TOOLS)
        apt_install(root, *dependencies(root, self.installed))
        shutil.rmtree(root + "/debs")

    def bring_packages(self, root):
        os.makedirs(root + "/debs", exist_ok=True)
        for package in self.packages:
            shutil.copy(package, root + "/debs")

    def overlay(self, base):
        memory = os.path.join(self.folder, "memory")
        os.makedirs(memory, exist_ok=True)
        mount("-t", "tmpfs", "tmpfs", memory)
        for name in ("upper", "work"):
            os.mkdir(os.path.join(memory, name))
        mount("-t", "overlay", "overlay", "-o", f"lowerdir={base},upperdir={memory}/upper,workdir={memory}/work", self.path)
        mount_devices(self.path)
        os.mkdir(self.path + "/sources")
        mount("--bind", "-o", "ro", SOURCE, self.path + "/sources")

    def boot(self):
        with open(os.path.join(self.folder, "console.log"), "w", encoding="utf-8") as console:
            self.manager = subprocess.Popen(
                ["unshare", "--mount", "--propagation=private", "--pid", "--cgroup", "--ipc", "--uts", "--fork", "--kill-child",
                 "sh", "-c", BOOT, "boot", self.path, PATH], stdin=subprocess.DEVNULL, stdout=console, stderr=console,
                preexec_fn=lambda: write(os.path.join(self.cgroup, "cgroup.procs"), "0"))
        self.first = wait_until("the service manager's process", self.first_process)
        wait_until("the service manager", lambda: self.run("systemctl", "is-system-running", check=False).stdout.strip()
                   in ("running", "degraded"), step=0.2)

    def first_process(self):
        with open(f"/proc/{self.manager.pid}/task/{self.manager.pid}/children", encoding="utf-8") as file:
            return file.read().strip()

    def inside(self, command, user):
        enter = ["nsenter", "--target", self.first, "--mount", "--pid", "--cgroup", "--ipc", "--uts", "--root", "--wd",
                 "env", "-i", "PATH=" + PATH, "LC_ALL=C.UTF-8", "DEBIAN_FRONTEND=noninteractive"]
        return enter + ([] if user is None else ["runuser", "-u", user, "--"]) + list(command)

    def run(self, *command, user=None, check=True):
        done = subprocess.run(self.inside(command, user), stdin=subprocess.DEVNULL, capture_output=True, text=True, timeout=PATIENCE * 5,
                              check=False)
        if check and done.returncode != 0:
            raise AssertionError(f"{command} ended with {done.returncode}:\n{done.stdout}{done.stderr}")
        return done

    def start(self, *command, user=None):
        """Runs until the root ends, or it ends itself."""
        return subprocess.Popen(self.inside(command, user), stdin=subprocess.DEVNULL)

    def outside(self, path):
        return self.path + path

    def files(self):
        """All of the root that is on its disk: paths as they are inside."""
        found = set()
        for folder, folders, names in os.walk(self.path):
            inside = folder[len(self.path):]
            folders[:] = [name for name in folders if not os.path.ismount(os.path.join(folder, name))]
            found.update(f"{inside}/{name}" for name in folders + names)
        return found


def write(path, text):
    with open(path, "w", encoding="utf-8") as file:
        file.write(text)


def is_busy(cgroup):
    try:
        os.rmdir(cgroup)
    except OSError:
        return True
    return False
