"""What the end-to-end tests add to the stage: cases by their names, clients in Python, small disks."""
import os
import subprocess
import sys
import traceback

HERE = os.path.dirname(os.path.abspath(__file__))
SCRIPTS = os.path.join(HERE, "../../scripts")
sys.path.insert(0, SCRIPTS)
from stage import device  # noqa: E402
from stage.processes import check, wait_until  # noqa: E402, F401

SKIPPED = 77    # the exit code that ctest shows as "Skipped"
BUILD = os.environ.get('QV_BUILD') or sys.exit('QV_BUILD is not set; run the test with ctest')
PYTHON = os.path.realpath('/usr/bin/python3')


def is_sanitized():
    return bool(os.environ.get('QV_E2E_SANITIZER'))


class Skipped(Exception):
    """The machine does not allow the test."""


def main(cases):
    """Runs the case that the command line names."""
    name = sys.argv[1] if len(sys.argv) > 1 else ''
    if name not in cases:
        sys.exit(f'usage: {sys.argv[0]} {"|".join(cases)}')
    try:
        cases[name](*sys.argv[2:])
    except Skipped as reason:
        print(f'skipped: {reason}', flush=True)
        sys.exit(SKIPPED)
    except Exception:
        traceback.print_exc()
        sys.exit(1)


class Device(device.Device):
    """One without display and sound server, whose alerts answer themselves."""

    def __init__(self, alert='accept', log='error'):
        super().__init__(BUILD, QUORVEL_HEADLESS_ALERT=alert, QUORVEL_LOG=log)
        self.mounts = []

    def release(self):
        for directory in reversed(self.mounts):
            subprocess.run(['umount', directory], check=True)

    def mount_disk(self, directory, size):
        """Puts a small disk of its own at a directory of the device."""
        os.makedirs(directory, exist_ok=True)
        mounted = subprocess.run(['mount', '-t', 'tmpfs', '-o', f'size={size}', 'quorveld-e2e', directory],
                                 capture_output=True, text=True)
        if mounted.returncode != 0:
            raise Skipped(f'no file system can be mounted here: {mounted.stderr.strip()}')
        self.mounts.append(directory)

    @staticmethod
    def remount(directory, option):
        subprocess.run(['mount', '-o', f'remount,{option}', directory], check=True)

    def run_client(self, script, *arguments):
        """A Python program that is an application to the daemon: the daemon knows a client by the bundle around its
        executable, so the bundle gets an interpreter of its own."""
        python = self.install('Test', 'com.example.quorvel.test', PYTHON)
        client = self.start([python, '-u', os.path.join(HERE, script), *arguments], PYTHONHOME='/usr',
                            PYTHONPATH=f'{HERE}:{SCRIPTS}', PYTHONDONTWRITEBYTECODE='1', QV_BUILD=BUILD)
        code = client.wait()
        check(code == 0, f'the client ended with {code}:\n{client.output()}')
        return client.output()
