"""Many connected applications, each of a bundle of its own: what they cost the daemon, and whether a recording
that runs beside them notices. No check: read the table.
"""

import argparse
import os
import resource
import shutil
import signal
import statistics
import subprocess
import sys
import time

ROOT = os.path.join(os.path.dirname(os.path.abspath(__file__)), "../..")
sys.path.insert(0, os.path.join(ROOT, "scripts"))
from stage import processes  # noqa: E402
from stage.applications import Game  # noqa: E402
from stage.device import Stage  # noqa: E402

QUERY_INTERVAL = 0.01  # seconds; of all clients together


class Device(Stage):
    def prepare(self):
        self.allow_recordings()


class Crowd:
    """The clients: processes that share one pipe for their lines."""

    def __init__(self, stage, program):
        self.stage, self.program = stage, program
        self.clients = []
        read_end, self.write_end = os.pipe()
        self.lines = os.fdopen(read_end)

    def _install(self, number):
        """A bundle whose executable is another name of the same file."""
        directory = os.path.join(self.stage.directory, "bundles", f"Client{number}.app")
        executable = os.path.join(directory, "client")
        os.makedirs(directory)
        if not self.clients:
            self.original = shutil.copy2(self.program, executable)
        else:
            os.link(self.original, executable)
        with open(os.path.join(directory, "Info.json"), "w") as file:
            file.write(f'{{"CFBundleIdentifier": "com.example.client{number}"}}')
        return executable

    def add(self):
        """Milliseconds from its connection to its first answer."""
        executable = self._install(len(self.clients))
        self.clients.append(subprocess.Popen([executable], env=self.stage.environment, stdin=subprocess.DEVNULL,
                                             stdout=self.write_end))
        return self._milliseconds("admitted")

    def ask(self, number):
        self.clients[number].send_signal(signal.SIGUSR1)
        return self._milliseconds("state")

    def _milliseconds(self, what):
        said, value = self.lines.readline().split()
        if said != what:
            raise RuntimeError(f"a client said '{said}' in place of '{what}'")
        return float(value)

    def end(self):
        for client in self.clients:
            client.terminate()
        for client in self.clients:
            client.wait()


def query_beside_recording(stage, crowd):
    """(milliseconds of each query, the daemon's line about its movie)"""
    game = Game(stage, 1280, 720, 60)
    game.start()
    taken = []
    for number in range(len(crowd.clients)):
        taken.append(crowd.ask(number))
        time.sleep(QUERY_INTERVAL)
    mark = stage.daemon.mark()
    game.stop()
    finished = stage.daemon.expect("movie finished:", mark)[1]
    game.quit()
    return taken, finished[finished.index("movie finished"):]


def describe(values):
    ordered = sorted(values)
    return (f"median {statistics.median(ordered):.2f} ms, 99 % under {ordered[int(len(ordered) * 0.99) - 1]:.2f} ms, "
            f"longest {ordered[-1]:.2f} ms")


def main():
    parser = argparse.ArgumentParser(prog="scripts/bench clients")
    parser.add_argument("--clients", type=int, default=1000)
    parser.add_argument("--build", default=os.path.join(ROOT, "build/release"))
    options = parser.parse_args()
    resource.setrlimit(resource.RLIMIT_NOFILE, (resource.getrlimit(resource.RLIMIT_NOFILE)[1],) * 2)
    with Device(options.build) as stage:
        crowd = Crowd(stage, os.path.join(stage.build, "bench/clients/bench_client"))
        try:
            crowd.add()  # whatever is made once for all
            before, _ = processes.resident_kilobytes(stage.daemon.pid)
            admissions = [crowd.add() for _ in range(options.clients)]
            after, _ = processes.resident_kilobytes(stage.daemon.pid)
            before_idle = processes.wake_ups(stage.daemon.pid)
            time.sleep(3)
            idle = processes.woken_since(before_idle, stage.daemon.pid)
            queries, finished = query_beside_recording(stage, crowd)
        finally:
            crowd.end()
        deadline = time.monotonic() + 10
        descriptors = lambda: len(os.listdir(f"/proc/{stage.daemon.pid}/fd"))  # noqa: E731
        while descriptors() > 100 and time.monotonic() < deadline:
            time.sleep(0.1)
        left = descriptors()
    print(f"{options.clients} connected clients, each of its own bundle")
    print(f"memory      {(after - before) / options.clients:.1f} KB of the daemon each (target: under 60)")
    print(f"admission   {describe(admissions)} (target: under 2)")
    print(f"idle        {idle} wake-ups in 3 s with all connected")
    print(f"state query {describe(queries)} beside a 720p60 recording (target: median under 1)")
    print(f"recording   {finished} (target: 0 dropped)")
    print(f"afterwards  {left} descriptors of the daemon open once all have gone")


main()
