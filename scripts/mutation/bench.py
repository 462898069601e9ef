"""Where mutants are built and tested: a copy of the tree, its build, and all that runs there."""
import ctypes
import os
import re
import shutil
import signal
import subprocess
import sys
import tempfile
from concurrent.futures import ThreadPoolExecutor

SHARDS = os.cpu_count() or 1


def tracked_files(root):
    """What git knows or would add."""
    listed = subprocess.run(["git", "-C", root, "ls-files", "-co", "--exclude-standard", "-z"], capture_output=True,
                            text=True, check=True).stdout.split("\0")
    return sorted(path for path in listed if path and os.path.isfile(os.path.join(root, path)))


class Bench:
    """The copy of the tree, its build, and what runs there. Leaving it ends all that, by process id."""

    def __init__(self, root):
        self.root = root

    def __enter__(self):
        # A process whose parent was killed comes to us, so that it can be ended.
        ctypes.CDLL(None).prctl(36, 1, 0, 0, 0)  # PR_SET_CHILD_SUBREAPER
        self.running = set()
        self.directory = tempfile.mkdtemp(prefix="mutants-")
        self.tree, self.build = os.path.join(self.directory, "tree"), os.path.join(self.directory, "tree/build/release")
        self.scratch = os.path.join(self.directory, "tmp")
        os.makedirs(self.scratch)
        self.for_builds = {**os.environ, "CCACHE_BASEDIR": self.tree, "CCACHE_NOHASHDIR": "1"}
        # Nothing of the caller's session reaches the tests.
        self.for_tests = {name: os.environ[name] for name in ("PATH", "HOME", "USER") if name in os.environ}
        self.for_tests.update(TMPDIR=self.scratch, LC_ALL="C.UTF-8", LANGUAGE="en")
        return self

    def __exit__(self, *_):
        for process in list(self.running):
            self.end(process)
        self.end_orphans()
        shutil.rmtree(self.directory, ignore_errors=True)

    def start(self, arguments, environment, output):
        process = subprocess.Popen(arguments, env=environment, start_new_session=True, cwd=self.scratch,
                                   stdin=subprocess.DEVNULL, stdout=output, stderr=subprocess.STDOUT)
        self.running.add(process)
        return process

    @staticmethod
    def kill(process):
        try:
            os.killpg(process.pid, signal.SIGKILL)
        except ProcessLookupError:
            pass

    def end(self, process):
        self.kill(process)
        process.wait()
        self.running.discard(process)

    def orphans(self):
        """Children that we did not start: what a killed test or build left."""
        own = {process.pid for process in self.running}
        with open(f"/proc/self/task/{os.getpid()}/children", encoding="ascii") as file:
            return [int(pid) for pid in file.read().split() if int(pid) not in own]

    def end_orphans(self):
        while orphans := self.orphans():  # the children of each come to us when it ends
            for orphan in orphans:
                os.kill(orphan, signal.SIGKILL)
                os.waitpid(orphan, 0)

    def build_step(self, arguments, **more):
        """Its output, and whether it ended well."""
        process = self.start(arguments, {**self.for_builds, **more}, subprocess.PIPE)
        try:
            output = process.communicate()[0]
            return output.decode(errors="replace"), process.returncode == 0
        finally:
            self.end(process)

    def copy_tree(self):
        for path in tracked_files(self.root):
            target = os.path.join(self.tree, path)
            os.makedirs(os.path.dirname(target), exist_ok=True)
            shutil.copy2(os.path.join(self.root, path), target)
            if path.startswith("tests/") and path.endswith((".h", ".cpp")):
                self.keep_here(target)

    def keep_here(self, path):
        """Tests make their folders in /tmp. What a killed one leaves there is to go with the copy."""
        with open(path, encoding="utf-8") as file:
            source = file.read()
        changed = re.sub(r'"/tmp/(?=[\w-]*XXXXXX")', f'"{self.scratch}/', source)
        if changed != source:
            with open(path, "w", encoding="utf-8") as file:
                file.write(changed)

    def make(self, programs, **more):
        return self.build_step(["ninja", "-C", self.build, "--quiet", *(os.path.basename(name) for name in programs)], **more)

    def configure(self):
        launcher = ["-DCMAKE_CXX_COMPILER_LAUNCHER=ccache"] if shutil.which("ccache") else []
        output, is_good = self.build_step(["cmake", "--preset", "release", "-S", self.tree, "-B", self.build, *launcher])
        if not is_good:
            sys.exit("mutants: the tree cannot be configured\n" + output)

    def test(self, programs, timeout):
        """The program that failed, with a word on how; None where all passed. Ends the others when one fails."""
        jobs = [(name, shard) for name in programs for shard in range(SHARDS)]
        failed = []

        def one(job):
            name, shard = job
            if failed:
                return
            process = self.start([os.path.join(self.build, "tests", name), "--gtest_fail_fast", "--gtest_brief=1"],
                                 {**self.for_tests, "GTEST_TOTAL_SHARDS": str(SHARDS), "GTEST_SHARD_INDEX": str(shard)},
                                 subprocess.DEVNULL)
            started.append(process)
            if failed:
                self.kill(process)
            try:
                process.wait(timeout)
                how = "" if process.returncode == 0 else f"{name}, status {process.returncode}"
            except subprocess.TimeoutExpired:
                how = f"{name}, not in time"
            self.end(process)
            if how and not failed:
                stop(how)

        def stop(how):
            failed.append(how)
            for process in started:
                if process.poll() is None:
                    self.kill(process)

        started = []
        with ThreadPoolExecutor(SHARDS) as pool:
            try:
                list(pool.map(one, jobs))
            except BaseException:
                stop("interrupted")
                raise
        self.end_orphans()
        for left in os.listdir(self.scratch):
            shutil.rmtree(os.path.join(self.scratch, left), ignore_errors=True)
        return failed[0] if failed else None
