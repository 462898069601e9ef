"""What broadcasts cost: a table of target, measurement and verdict. Exits 1 where a target is missed.

Samples: 1280x720 at 30 pictures a second, with sound, to an extension that only notes how late each picture came.
Clips: of 2 s, for --minutes, to an extension that only notes each clip; then what they have left behind.
"""

import argparse
import os
import re
import statistics
import sys
import time

ROOT = os.path.join(os.path.dirname(os.path.abspath(__file__)), "../..")
sys.path.insert(0, os.path.join(ROOT, "scripts"))
from stage import processes  # noqa: E402
from stage.device import Stage  # noqa: E402

IDENTIFIER = "com.example.quorvel.bench.{}.upload"
SETTLING = 2.0  # seconds at both ends that are not measured
CLIP_SECONDS = 2
PICTURES_PER_SECOND = 30


class Device(Stage):
    def prepare(self):
        self.allow_recordings()
        bundles = os.path.join(self.build, "bench/broadcast")
        self.environment["QUORVEL_BUNDLE_PATH"] += ":" + bundles

    def broadcast(self, mode, script, *options):
        """The example application, which broadcasts at once."""
        program = os.path.join(self.build, "examples/game/Game.app/bin/quorvel-example-game")
        return self.start([program, "--broadcast", IDENTIFIER.format(mode), "--script", script, *options])

    def notes(self, mode):
        """The lines of the extension that ran last."""
        path = os.path.join(self.root, "private/var/mobile/Containers", IDENTIFIER.format(mode), "stderr.log")
        with open(path, errors="replace") as file:
            return file.read().splitlines()


class Table:
    def __init__(self):
        self.all_met = True
        print(f"{'':<46} {'target':>12} {'measured':>12}  {'':<7} compared")

    def row(self, what, target, measured, unit, compared=""):
        is_met = measured <= target
        self.all_met = self.all_met and is_met
        self._print(what, f"{target:.4g} {unit}", f"{measured:.4g} {unit}", "met" if is_met else "MISSED", compared)

    def note(self, what, measured, unit, compared=""):
        self._print(what, "", f"{measured:.4g} {unit}", "", compared)

    @staticmethod
    def _print(what, target, measured, verdict, compared):
        print(f"{what:<46} {target:>12} {measured:>12}  {verdict:<7} {compared}".rstrip(), flush=True)


class State:
    """What the daemon holds at this moment."""

    def __init__(self, stage):
        pid = stage.daemon.pid
        self.descriptors = len(os.listdir(f"/proc/{pid}/fd"))
        self.threads = len(os.listdir(f"/proc/{pid}/task"))
        self.kilobytes, _ = processes.resident_kilobytes(pid)
        self.files = sum(len(files) for *_, files in os.walk(stage.movies))
        self.extensions = len(processes.children(pid))

    def __str__(self):
        return (f"{self.descriptors} descriptors, {self.threads} threads, {self.kilobytes / 1024:.1f} MB resident, "
                f"{self.files} files in the store, {self.extensions} processes of extensions")


def progress(text):
    print(text, file=sys.stderr, flush=True)


def load():
    return f"load {os.getloadavg()[0]:.1f}"


# Samples ---------------------------------------------------------------------------------------------


def measure_samples(table, stage, seconds):
    loaded = load()
    game = stage.broadcast("samples", f"record {seconds:g}; stop; quit", "--size", "1280x720", "--fps",
                           str(PICTURES_PER_SECOND))
    began, _ = game.expect("started")
    daemon, threads = processor_use(stage.daemon.pid, began + SETTLING, began + seconds - SETTLING)
    written_by_server = processes.shared_memory_files(stage.display_server.pid)
    line = game.expect("stopped", seconds=60)[1]
    game.process.wait(20)
    stage.end(game)
    if "error=0" not in line:
        raise RuntimeError("the broadcast broke off: " + line)
    noted = dict(line.partition(" ")[::2] for line in stage.notes("samples"))
    latencies = sorted(int(text) / 1000 for text in noted["microseconds"].split())
    compared = f"of {len(latencies)} pictures, {seconds:g} s of 1280x720; {loaded} before, {load()} after"
    table.row("capture to the extension's call: median", 3, statistics.median(latencies), "ms", compared)
    table.row("capture to the extension's call: p99", 15, latencies[int(len(latencies) * 0.99)], "ms",
              f"worst {latencies[-1]:.1f} ms; with the X server's writing of the picture")
    table.row("the daemon's processor", 3, 100 * daemon, "%",
              "of one core; " + ", ".join(f"{name} {100 * used:.2f}" for used, name in threads[:4]))
    files = dict(file.split(":") for file in noted["files"].split())
    foreign = sum(int(inode) not in written_by_server for inode in files)
    rights = " ".join(sorted(set(files.values())))
    table.row("memory files not written by the X server", 0, foreign, "",
              f"of {len(files)} in which the extension found pictures, mapped {rights}; one would be of copied pixels")
    table.row("memory files that the extension may write", 0, sum("w" in right for right in files.values()), "")
    table.row("pictures missing", 1, 100 - 100 * len(latencies) / (seconds * PICTURES_PER_SECOND), "%",
              f"of {PICTURES_PER_SECOND} a second; {noted['sounds']} runs of sound")


def processor_use(pid, begin, end):
    """(processor seconds per second of the process, of its threads [(seconds, name)], the most used first)"""
    time.sleep(max(0.0, begin - time.monotonic()))
    start, used, threads = time.monotonic(), processes.processor_seconds(pid), processes.thread_seconds(pid)
    time.sleep(max(0.0, end - time.monotonic()))
    elapsed = time.monotonic() - start
    names = {}
    for task, (name, seconds) in processes.thread_seconds(pid).items():
        names[name] = names.get(name, 0.0) + (seconds - threads.get(task, (name, 0.0))[1]) / elapsed
    return ((processes.processor_seconds(pid) - used) / elapsed,
            sorted(((seconds, name) for name, seconds in names.items()), reverse=True))


# Clips -----------------------------------------------------------------------------------------------


def settled_state(stage, before, seconds=10.0):
    """What is held once all has gone, or after `seconds` what is held still."""
    deadline = time.monotonic() + seconds
    while True:
        state = State(stage)
        held = (state.descriptors > before.descriptors or state.threads > before.threads or
                state.files + state.extensions > 0)
        if not held or time.monotonic() > deadline:
            return state
        time.sleep(0.2)


def broadcast_clips(stage, seconds, each_minute=lambda minute, state: None):
    game = stage.broadcast("clips", f"record {seconds:g}; stop; quit", "--clip-duration", str(CLIP_SECONDS), "--size",
                           "320x180", "--fps", "10")
    began, _ = game.expect("started")
    for minute in range(1, int(seconds // 60) + 1):
        time.sleep(max(0.0, began + minute * 60 - 1 - time.monotonic()))
        each_minute(minute, State(stage))
    line = game.expect("stopped", seconds=120)[1]
    game.process.wait(20)
    stage.end(game)
    if "error=0" not in line:
        raise RuntimeError("the broadcast broke off: " + line)


def measure_clips(table, stage, seconds):
    # Whatever is made once for the process (encoder libraries, threads that stay) is made by a short one. Then idle
    # threads end, so that they do not hide any that are left.
    broadcast_clips(stage, 2.5 * CLIP_SECONDS)
    time.sleep(5)
    before = settled_state(stage, State(stage), 0)
    progress(f"before: {before}")
    minutes = []

    def note(minute, state):
        minutes.append(state)
        progress(f"minute {minute}: {state}; {len(stage.notes('clips'))} lines; {load()}")

    broadcast_clips(stage, seconds, note)
    after = settled_state(stage, before)
    progress(f"after: {after}")
    found = [re.match(r"clip name=\S*_(\d+)\.mp4 last=(\d) bytes=(\d+) seconds=([\d.]+)", line)
             for line in stage.notes("clips")]
    clips = [(int(match[1]), match[2] == "1", int(match[3]), float(match[4])) for match in found if match]
    check_clips(table, clips, seconds)
    compared = f"after {seconds / 60:.0f} min, {len(clips)} clips of {CLIP_SECONDS} s; {load()}"
    table.row("clips left in the temporary store", 0, after.files, "", compared)
    table.row("descriptors left", 0, after.descriptors - before.descriptors, "",
              f"{before.descriptors} before, {after.descriptors} after")
    table.row("threads left", 0, after.threads - before.threads, "", f"{before.threads} before, {after.threads} after")
    table.row("processes of extensions left", 0, after.extensions, "")
    table.note("memory: after - before", (after.kilobytes - before.kilobytes) / 1024, "MB",
               f"{before.kilobytes / 1024:.1f} MB before")
    if len(minutes) > 2:
        table.note("memory: last minute - second minute", (minutes[-1].kilobytes - minutes[1].kilobytes) / 1024, "MB",
                   f"at most {max(m.descriptors for m in minutes)} descriptors, {max(m.threads for m in minutes)} "
                   f"threads, {max(m.files for m in minutes)} files at once")


def check_clips(table, clips, seconds):
    numbers = [number for number, *_ in clips]
    out_of_order = sum(number != place for place, number in enumerate(numbers, 1))
    table.row("clips out of order, lost or doubled", 0, out_of_order, "", f"1 to {numbers[-1]}" if numbers else "none")
    ends = [number for number, is_last, *_ in clips if is_last]
    table.row("clips wrongly marked as last, or not", 0, int(ends != numbers[-1:] or not ends), "", f"marked: {ends}")
    total = sum(duration for *_, duration in clips)
    table.row("missing of the broadcast's length", 0.5, abs(seconds - total), "s", f"{total:.2f} s in all clips")
    lengths = [duration for *_, duration in clips[:-1]]
    if lengths:
        table.note("length of a clip, median", statistics.median(lengths), "s",
                   f"{min(lengths):.2f} to {max(lengths):.2f} s but the last")


# Main ------------------------------------------------------------------------------------------------


def main():
    parser = argparse.ArgumentParser(prog="scripts/bench broadcast")
    parser.add_argument("--build", default=os.path.join(ROOT, "build/release"))
    parser.add_argument("--minutes", type=float, default=30, help="of clips; 0: none (default: %(default)g)")
    parser.add_argument("--seconds", type=float, default=30, help="of samples; 0: none (default: %(default)g)")
    options = parser.parse_args()
    progress(load())
    with Device(options.build) as stage:
        table = Table()
        if options.seconds > 0:
            measure_samples(table, stage, options.seconds)
        if options.minutes > 0:
            measure_clips(table, stage, options.minutes * 60)
    sys.exit(0 if table.all_met else 1)


main()
