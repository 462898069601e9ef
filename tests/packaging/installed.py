"""The built packages on a fresh Debian 12: installed, used and removed. `scripts/test packages` runs it, as root.

    installed.py DIRECTORY_OF_PACKAGES DIRECTORY_FOR_ROOTS
"""
import glob
import os
import sys
import unittest

SOURCE = os.path.dirname(os.path.dirname(os.path.dirname(os.path.abspath(__file__))))
sys.path.insert(0, os.path.join(SOURCE, "scripts"))
from stage import movie  # noqa: E402
from stage.freshroot import FreshRoot, in_own_namespaces  # noqa: E402
from stage.processes import wait_until  # noqa: E402

USER = "tv"
LIBRARY = "/private/var/mobile/Media/Movies"
SESSION = "/etc/quorvel/session.env"
GAME = "/Applications/Game.app/bin/quorvel-example-game"
LIVE = "com.example.quorvel.game.live.upload"
DISPLAY = ":7"
GUIDES = ("docs/app-developers.md", "docs/c.md", "docs/python.md", "docs/quorvelctl.md")
# What changes on any Debian that installs and removes a package: its package manager's own books, logs and caches, the
# copies that tools for users and groups keep of their files, what the service manager notes, and files for a while.
NOT_COMPARED = ("/var/lib/apt/", "/var/lib/dpkg/", "/var/cache/", "/var/log/", "/var/lib/systemd/", "/var/tmp/", "/tmp/", "/run/",
                "/etc/group-", "/etc/gshadow-", "/etc/.pwd.lock")


class Installed(unittest.TestCase):
    """In the order of their numbers, on one root: each goes on from where the one before it has left the device."""

    def apt(self, *words):
        return self.root.run("apt-get", "-y", "--no-install-recommends", *words).stdout

    def unit(self, name):
        return self.root.run("systemctl", "is-active", name, check=False).stdout.strip()

    def set_session(self, *lines):
        """The daemon reads it at its start, which is the next client's doing."""
        with open(self.root.outside(SESSION), "w", encoding="utf-8") as file:
            file.write("\n".join((f"QUORVEL_SESSION_USER={USER}", *lines, "")))
        self.root.run("systemctl", "stop", "quorveld.service")

    def check_movie(self, path, seconds):
        movie.check_decodes(path)
        self.assertAlmostEqual(movie.duration(path), seconds, delta=1.5)

    def test_1_they_install_and_the_socket_listens(self):
        said = self.apt("install", *self.root.installed)
        self.assertIn(f" {len(self.root.installed)} newly installed", said)
        self.assertEqual(self.unit("quorveld.socket"), "active")
        self.assertEqual(self.unit("quorveld.service"), "inactive")
        self.root.run("usermod", "-aG", "quorvel", USER)
        version = self.root.run("dpkg-query", "-W", "-f", "${Version}", "quorveld").stdout
        self.assertEqual(self.root.run("quorvelctl", "--version").stdout, f"quorvelctl {version}\n")
        self.assertEqual(self.root.run("/usr/libexec/quorveld", "--version").stdout, f"quorveld {version}\n")

    def test_2_the_example_records_itself(self):
        self.set_session("QUORVEL_HEADLESS_ALERT=accept")
        self.root.run(GAME, "--headless", "--script", "record 3; stop; save; quit", user=USER)
        self.assertEqual(self.unit("quorveld.service"), "active")
        saved = glob.glob(self.root.outside(LIBRARY + "/*"))
        self.assertEqual(len(saved), 1)
        self.check_movie(saved[0], 3)

    def test_3_the_example_broadcasts(self):
        said = self.root.run(GAME, "--headless", "--broadcast", LIVE, "--broadcast-info", "url=udp://127.0.0.1:9",
                             "--script", "record 3; stop; quit", user=USER).stdout
        self.assertIn('state="live"', said)
        self.assertEqual(self.unit("quorveld-extensions.service"), "active")

    def test_4_the_tool_records_the_screen_with_the_example_on_it(self):
        self.root.start("Xvfb", DISPLAY, "-screen", "0", "1280x720x24", "-ac", "-nolisten", "tcp", user=USER)
        wait_until("the display", lambda: os.path.exists(self.root.outside("/tmp/.X11-unix/X" + DISPLAY[1:])))
        self.set_session("DISPLAY=" + DISPLAY)
        self.root.start("env", "DISPLAY=" + DISPLAY, GAME, "--no-sound", "--script", "wait 600; quit", user=USER)
        tour = f"/home/{USER}/tour.mp4"
        self.root.run("env", "DISPLAY=" + DISPLAY, "quorvelctl", "record", "-o", tour, "--seconds", "4", user=USER)
        self.check_movie(self.root.outside(tour), 4)
        # The game flashes once a second.
        self.assertGreaterEqual(len(movie.flashes(self.root.outside(tour))), 2)

    def test_5_the_guides_end_as_they_say(self):
        for page in GUIDES:
            said = self.root.run("env", "PYTHONDONTWRITEBYTECODE=1", "python3", "/sources/tests/guides/run.py",
                                 "/sources/" + page).stdout
            self.assertRegex(said, r"[1-9]\d* blocks done")

    def test_6_purged_they_leave_what_is_the_users(self):
        names = self.root.run("dpkg-query", "-W", "-f", "${Package} ${Maintainer}\n").stdout
        own = [line.split()[0] for line in names.splitlines() if "quorveld maintainers" in line]
        self.assertEqual(len(own), len(self.root.installed))
        self.apt("purge", *own)
        self.assertEqual(self.unit("quorveld.service"), "inactive")
        self.assertEqual(self.unit("quorveld.socket"), "inactive")
        left = {path for path in self.root.files() - self.before if not path.startswith((*NOT_COMPARED, f"/home/{USER}/"))}
        kept = {SESSION} | {path for path in left if path.startswith(LIBRARY + "/")}
        self.assertEqual(len(kept), 2, left)
        folders = {path[:index] for path in kept for index in range(1, len(path)) if path[index] == "/"}
        self.assertEqual(left, (kept | folders) - self.before)


def main(packages, roots):
    in_own_namespaces()
    built = [path for path in glob.glob(os.path.join(packages, "*.deb")) if "-dbgsym_" not in path]
    if not built:
        sys.exit(f"no packages in {packages}")
    with FreshRoot(roots, built) as root:
        root.run("useradd", "--create-home", "--shell", "/bin/sh", USER)
        Installed.root, Installed.before = root, root.files()
        suite = unittest.defaultTestLoader.loadTestsFromTestCase(Installed)
        result = unittest.TextTestRunner(verbosity=2, failfast=True).run(suite)
        if not result.wasSuccessful():
            print(root.run("journalctl", "--no-pager", "-n", "100", check=False).stdout)
    failed, skipped = len(result.failures) + len(result.errors), len(result.skipped)
    print(f"{result.testsRun - failed - skipped} passed, {failed} failed" + (f", {skipped} skipped" if skipped else ""))
    sys.exit(0 if result.wasSuccessful() else 1)


main(*sys.argv[1:])
