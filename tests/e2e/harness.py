"""What the end-to-end tests share: a device in a temporary directory, its daemon, and clients of it.

Nothing of the machine is used but the programs: no display, sound server or bus; and only what was
started here is stopped, by its process id.
"""
import json
import os
import shutil
import signal
import socket
import subprocess
import sys
import tempfile
import time
import traceback

HERE = os.path.dirname(os.path.abspath(__file__))
PATIENCE = 120  # seconds until a wait counts as hanging; nothing is asserted about speed
SKIPPED = 77    # the exit code that ctest shows as "Skipped"
SOCKET = 'com.tarnwick.quorveld'
TEST_BUNDLE_ID = 'com.example.quorvel.test'
PYTHON = os.path.realpath('/usr/bin/python3')
SANITIZER_OPTIONS = ('ASAN_OPTIONS', 'LSAN_OPTIONS', 'UBSAN_OPTIONS', 'TSAN_OPTIONS')


def setting(name):
    """Where ctest says that a part of the build is (see CMakeLists.txt)."""
    value = os.environ.get(name)
    if not value:
        sys.exit(f'{name} is not set; run the test with ctest')
    return value


def is_sanitized():
    return bool(os.environ.get('QV_E2E_SANITIZER'))


def check(condition, message):
    """An assertion that python -O keeps."""
    if not condition:
        raise AssertionError(message)


class Skipped(Exception):
    """The machine does not allow the test."""


def wait_until(condition, what, patience=PATIENCE, step=0.01):
    """Tries until `condition` gives something true, and returns that."""
    deadline = time.monotonic() + patience
    while True:
        value = condition()
        if value:
            return value
        check(time.monotonic() < deadline, f'waited in vain for {what}')
        time.sleep(step)


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


class Daemon:
    """One quorveld process; its log is a file, for a killed daemon tells nothing more."""

    def __init__(self, device, environment):
        self.has_ended = False  # as the test wanted it
        self.log_path = os.path.join(device.path, f'log{len(device.daemons)}')
        self.socket_path = os.path.join(environment['XDG_RUNTIME_DIR'], SOCKET)
        with open(self.log_path, 'wb') as log:
            self.process = subprocess.Popen([setting('QV_E2E_DAEMON')], env=environment, stdin=subprocess.DEVNULL,
                                            stdout=log, stderr=log)

    @property
    def pid(self):
        return self.process.pid

    def is_running(self):
        return self.process.poll() is None

    def log(self):
        with open(self.log_path, errors='replace') as log:
            return log.read()

    def wait_for_service(self):
        def connects():
            check(self.is_running(), f'the daemon ended with {self.process.returncode}:\n{self.log()}')
            with socket.socket(socket.AF_UNIX, socket.SOCK_STREAM) as client:
                return client.connect_ex(self.socket_path) == 0
        wait_until(connects, 'the daemon to serve')

    def wait_for_log(self, text, count=1):
        wait_until(lambda: self.log().count(text) >= count, f'the log line "{text}"')

    def kill(self):
        """As a crash does it: nothing is completed."""
        self.process.kill()
        self.process.wait()
        self.has_ended = True

    def wait_for_end(self):
        """The exit code of a daemon that gives up."""
        code = self.process.wait(PATIENCE)
        self.has_ended = True
        return code

    def stop(self):
        """As the service manager does it; the daemon must still have been there."""
        check(self.is_running(), f'the daemon ended by itself with {self.process.returncode}')
        self.process.send_signal(signal.SIGTERM)
        self.wait_for_end()
        check(self.process.returncode == 0, f'the daemon ended with {self.process.returncode}')
        self.check_sanitizers()

    def check_sanitizers(self):
        for report in ('Sanitizer:', 'runtime error:'):
            check(report not in self.log(), f'a report of a sanitizer:\n{self.log()}')


class Device:
    """A device root with everything that belongs to it. A context manager.

    At its end the daemons that still run are stopped and must end well, and the directory goes away.
    """

    def __init__(self, alert='accept', log='error', has_media_parent=True):
        self.path = tempfile.mkdtemp(prefix='quorveld-e2e-')
        self.root = os.path.join(self.path, 'root')
        self.media = os.path.join(self.root, 'private/var/mobile/Library')
        self.movies = os.path.join(self.media, 'Quorvel')
        self.preferences = os.path.join(self.media, 'Preferences')
        self.framework = os.path.join(self.root, 'System/Library/Frameworks/Quorvel.framework')
        self.bundles = os.path.join(self.path, 'bundles')
        self.alert = alert
        self.log_level = log
        self.daemons = []
        self.clients = []
        self.mounts = []
        if has_media_parent:
            os.makedirs(self.media)
        shutil.copytree(setting('QV_E2E_FRAMEWORK'), self.framework)
        self._make_test_bundle()

    def _make_test_bundle(self):
        """The daemon knows a client by the bundle around its executable, so the bundle gets an
        interpreter of its own."""
        binaries = os.path.join(self.bundles, 'Test.app/bin')
        os.makedirs(binaries)
        self.python = os.path.join(binaries, 'python3')
        shutil.copy2(PYTHON, self.python)
        self.write('Test.app/Info.json',
                   json.dumps({'CFBundleIdentifier': TEST_BUNDLE_ID, 'CFBundleName': 'Test'}), self.bundles)

    def write(self, name, content, directory=None):
        path = os.path.join(directory or self.root, name)
        os.makedirs(os.path.dirname(path), exist_ok=True)
        with open(path, 'w' if isinstance(content, str) else 'wb') as file:
            file.write(content)

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

    def environment(self):
        environment = {'PATH': os.environ['PATH'], 'HOME': self.path, 'LANG': 'C.UTF-8', 'TMPDIR': self.path,
                       'XDG_RUNTIME_DIR': self.path, 'QUORVEL_DEVICE_ROOT': self.root, 'QUORVEL_LOG': self.log_level,
                       'QUORVEL_BUNDLE_PATH': f'{self.bundles}:{setting("QV_E2E_GAME_BUNDLES")}',
                       'QUORVEL_HEADLESS_ALERT': self.alert,
                       # Nothing is there: sound comes from the headless backend.
                       'PULSE_SERVER': f'unix:{self.path}/no-sound-server'}
        environment.update({name: os.environ[name] for name in SANITIZER_OPTIONS if name in os.environ})
        return environment

    def start_daemon(self, expect_service=True):
        daemon = Daemon(self, self.environment())
        self.daemons.append(daemon)
        if expect_service:
            daemon.wait_for_service()
        return daemon

    def start_client(self, script, *arguments):
        """A Python program that is an application to the daemon; its lines are to be read from stdout."""
        environment = self.environment()
        environment.update(PYTHONHOME='/usr', PYTHONPATH=HERE, PYTHONDONTWRITEBYTECODE='1')
        return self._start([self.python, '-u', os.path.join(HERE, script), *arguments], environment)

    def start_game(self, script, *options, size='640x360'):
        return self._start([setting('QV_E2E_GAME'), '--headless', '--no-sound', '--size', size, *options,
                            '--script', script], self.environment())

    def _start(self, command, environment):
        client = subprocess.Popen(command, env=environment, stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
                                  text=True)
        self.clients.append(client)
        return client

    def run_client(self, script, *arguments):
        return self._run(self.start_client(script, *arguments))

    def run_game(self, script, *options, **keywords):
        return self._run(self.start_game(script, *options, **keywords))

    @staticmethod
    def _run(client):
        output, _ = client.communicate(timeout=5 * PATIENCE)
        check(client.returncode == 0, f'the client ended with {client.returncode}:\n{output}')
        return output

    def movie_files(self):
        if not os.path.isdir(self.movies):
            return []
        return [os.path.join(self.movies, name) for name in sorted(os.listdir(self.movies)) if name.endswith('.mp4')]

    def __enter__(self):
        return self

    def __exit__(self, kind, error, trace):
        try:
            if kind is None:
                for daemon in self.daemons:
                    if not daemon.has_ended:
                        daemon.stop()
            elif not issubclass(kind, Skipped):
                self._show_logs()
        finally:
            self._tear_down()

    def _show_logs(self):
        for daemon in self.daemons:
            print(f'--- log of daemon {daemon.pid}\n{daemon.log()[-8000:]}', file=sys.stderr)

    def _tear_down(self):
        for process in self.clients + [daemon.process for daemon in self.daemons]:
            if process.poll() is None:
                process.kill()
                process.wait()
            if process.stdout:
                process.stdout.close()
        for directory in reversed(self.mounts):
            subprocess.run(['umount', directory], check=True)
        shutil.rmtree(self.path, ignore_errors=True)


def wait_for_line(client, start):
    """The next line of the client's output that begins so."""
    for line in client.stdout:
        if line.startswith(start):
            return line.strip()
    raise AssertionError(f'the client ended without a line "{start}"')
