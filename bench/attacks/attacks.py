"""What one hostile local user costs the others: how long another user's question takes during each attack, whether a
recording notices, and what the daemon keeps afterwards. Wants root, for it takes several users.
"""

import argparse
import os
import resource
import signal
import statistics
import subprocess
import sys
import time

HERE = os.path.dirname(os.path.abspath(__file__))
ROOT = os.path.join(HERE, "../..")
sys.path.insert(0, os.path.join(ROOT, "scripts"))
from stage import processes  # noqa: E402
from stage.applications import Game  # noqa: E402
from stage.device import Stage  # noqa: E402

ATTACKS = ("connections", "descriptors", "unfinished messages", "calls")
GROUP, HONEST, HOSTILE = 65534, 65533, 65534
QUERY_INTERVAL = 0.01         # seconds
LONGEST_QUERY = 50            # milliseconds
MORE_KILOBYTES_LEFT = 8_192


class Device(Stage):
    def prepare(self):
        self.allow_recordings()
        self.environment["QUORVEL_SOCKET_GROUP"] = str(GROUP)

    def as_user(self, user, arguments, **streams):
        return subprocess.Popen(["setpriv", f"--reuid={user}", f"--regid={GROUP}", "--clear-groups", *arguments],
                                env=self.environment, stdin=subprocess.DEVNULL, **streams)


class Honest:
    """Another user's program, which asks for the state of his recordings."""

    def __init__(self, stage):
        program = stage.install("Honest", "com.example.honest", os.path.join(stage.build, "bench/clients/bench_client"))
        os.chmod(stage.bundles, 0o755)
        self.process = stage.as_user(HONEST, [program], stdout=subprocess.PIPE, text=True)
        self.process.stdout.readline()

    def ask(self):
        self.process.send_signal(signal.SIGUSR1)
        return float(self.process.stdout.readline().split()[1])

    def ask_for(self, seconds):
        taken, end = [], time.monotonic() + seconds
        while time.monotonic() < end:
            taken.append(self.ask())
            time.sleep(QUERY_INTERVAL)
        return taken


def attacked(stage, honest, attack, seconds):
    """Milliseconds of each question meanwhile."""
    hostile = stage.as_user(HOSTILE, [sys.executable, os.path.join(HERE, "attacker.py"), attack, stage.daemon.socket_path])
    try:
        time.sleep(0.5)  # until it has begun in earnest
        return honest.ask_for(seconds)
    finally:
        hostile.kill()
        hostile.wait()


def describe(taken):
    ordered = sorted(taken)
    return (f"median {statistics.median(ordered):6.2f} ms, 99 % under {ordered[int(len(ordered) * 0.99) - 1]:6.2f} ms, "
            f"longest {ordered[-1]:6.2f} ms of {len(taken)}")


def run(stage, seconds):
    """Whether all targets are met."""
    honest = Honest(stage)
    game = Game(stage, 1280, 720, 60)
    game.start()
    print(f"{'no attack':<22}{describe(honest.ask_for(seconds))}")
    before, is_met = processes.resident_kilobytes(stage.daemon.pid)[1], True
    for attack in ATTACKS:
        taken = attacked(stage, honest, attack, seconds)
        is_met = is_met and max(taken) < LONGEST_QUERY
        print(f"{attack:<22}{describe(taken)} (target: under {LONGEST_QUERY} ms)")
    mark = stage.daemon.mark()
    game.stop()
    finished = stage.daemon.expect("movie finished:", mark)[1]
    game.quit()
    print(f"{'recording beside all':<22}{finished[finished.index('movie finished'):]} (target: 0 dropped)")
    time.sleep(2)  # what the daemon gives back, it gives back when it is quiet
    kept = processes.resident_kilobytes(stage.daemon.pid)[1] - before
    print(f"{'memory kept':<22}{kept / 1024:.1f} MB more than before the attacks, without what files hold "
          f"(target: under {MORE_KILOBYTES_LEFT / 1024:.0f})")
    honest.process.terminate()
    honest.process.wait()
    return is_met and kept < MORE_KILOBYTES_LEFT and " 0 dropped" in finished


def main():
    parser = argparse.ArgumentParser(prog="scripts/bench attacks")
    parser.add_argument("--seconds", type=float, default=5, help="of each attack")
    parser.add_argument("--build", default=os.path.join(ROOT, "build/release"))
    options = parser.parse_args()
    if os.geteuid() != 0:
        sys.exit("this takes several users: run it as root")
    resource.setrlimit(resource.RLIMIT_NOFILE, (resource.getrlimit(resource.RLIMIT_NOFILE)[1],) * 2)
    with Device(options.build) as stage:
        sys.exit(0 if run(stage, options.seconds) else 1)


main()
