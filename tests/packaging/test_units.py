"""Asks the service manager's own checker of the units. Run by ctest with the directory of the units."""
import os
import re
import shutil
import subprocess
import sys
import tempfile
import unittest

UNITS = sys.argv.pop(1)
MOST_EXPOSURE = 2.0  # of the daemon, which reads what others send; without extensions it needs little


def analyze(*arguments):
    ended = subprocess.run(["systemd-analyze", "--no-pager", *arguments], capture_output=True, text=True, check=False)
    return ended.stdout + ended.stderr


def values(unit, key):
    with open(os.path.join(UNITS, unit), encoding="utf-8") as file:
        return re.findall(rf"^{key}=(.*)$", file.read(), re.MULTILINE)


class Units(unittest.TestCase):
    @unittest.skipUnless(shutil.which("systemd-analyze"), "no systemd-analyze")
    def test_the_daemon_is_little_exposed_and_every_line_is_understood(self):
        said = analyze("security", "--offline=true", os.path.join(UNITS, "quorveld.service"))
        level = re.search(r"exposure level for quorveld.service: ([\d.]+)", said)
        self.assertIsNotNone(level, said)
        self.assertLessEqual(float(level[1]), MOST_EXPOSURE, said)
        with tempfile.TemporaryDirectory() as folder:
            for name in os.listdir(UNITS):
                with open(os.path.join(UNITS, name), encoding="utf-8") as file:
                    text = re.sub("^ExecStart=.*", "ExecStart=/bin/true", file.read(), flags=re.MULTILINE)
                with open(os.path.join(folder, name), "w", encoding="utf-8") as copy:
                    copy.write(text)
            said = analyze("verify", "--man=no", *(os.path.join(folder, name) for name in os.listdir(folder)))
            self.assertEqual([line for line in said.splitlines() if folder in line], [])

    def test_the_daemon_asks_where_the_extension_service_listens(self):
        told = values("quorveld.service", "Environment")
        listening = values("quorveld-extensions.socket", "ListenSequentialPacket")
        self.assertEqual(told, ["QUORVEL_EXTENSION_SERVICE=" + path for path in listening])
        self.assertEqual(len(listening), 1)


if __name__ == "__main__":
    unittest.main()
