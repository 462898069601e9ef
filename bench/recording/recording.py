"""What a recording costs on this machine, beside two ways of doing the same work. No check: read the table.

Each round records the example application's window with the daemon, then grabs the same picture with
`ffmpeg -f x11grab`, then encodes the same scene with the bare encoder; ratios are of one round, and the
table has their median. Processor time is of whole seconds in the middle of a recording, so starts and
finishes are in none of the figures.
"""

import argparse
import json
import os
import subprocess
import sys
import time
import urllib.parse
from dataclasses import dataclass, field

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), "../../scripts"))
import table
from stage import processes
from stage.applications import Game
from stage.device import Stage

SETTLING = 1.0  # seconds at both ends of a recording that are not measured


@dataclass
class Mode:
    name: str
    width: int
    height: int
    fps: int

    @property
    def bit_rate(self):
        return 5000 if self.width >= 1920 else 3000  # kbit/s, the daemon's own choice


MODES = [Mode("720p60", 1280, 720, 60), Mode("1080p30", 1920, 1080, 30), Mode("1080p60", 1920, 1080, 60)]


@dataclass
class Round:
    daemon: float
    x11grab: float
    bare: float
    frames: float  # movie's pictures per picture that the game should have shown
    dropped: int
    x11grab_frames: float
    server: float  # the X server's processor time beside the daemon
    server_x11grab: float
    threads: dict = field(default_factory=dict)


def probe_frames(path):
    """(pictures, seconds, kinds of the tracks)"""
    arguments = ["ffprobe", "-v", "error", "-count_packets", "-of", "json", "-show_entries",
                 "stream=codec_type,nb_read_packets,duration", path]
    probe = subprocess.run(arguments, capture_output=True, text=True, check=True, timeout=60)
    streams = json.loads(probe.stdout)["streams"]
    video = next(stream for stream in streams if stream["codec_type"] == "video")
    return int(video["nb_read_packets"]), float(video["duration"]), [stream["codec_type"] for stream in streams]


class Bench:
    def __init__(self, stage, seconds):
        self.stage, self.seconds = stage, seconds

    # The daemon -------------------------------------------------------------------------------------

    def measured(self, pid, begin, end):
        """(processor seconds per second of the process, of the X server, of each thread by name)"""
        sleep_until(begin)
        server = self.stage.display_server.pid
        before = time.monotonic(), processes.processor_seconds(pid), processes.processor_seconds(server)
        threads_before = processes.thread_seconds(pid)
        sleep_until(end)
        after = time.monotonic(), processes.processor_seconds(pid), processes.processor_seconds(server)
        elapsed = after[0] - before[0]
        threads = {}
        for task, (name, seconds) in processes.thread_seconds(pid).items():
            used = seconds - threads_before.get(task, (name, 0.0))[1]
            threads[name] = threads.get(name, 0.0) + used / elapsed
        return (after[1] - before[1]) / elapsed, (after[2] - before[2]) / elapsed, threads

    def record(self, game, mode):
        _, started, line = game.start()
        if "microphone=1" not in line:
            raise RuntimeError("the recording has no microphone")
        daemon, server, threads = self.measured(self.stage.daemon.pid, started + SETTLING,
                                                started + self.seconds - SETTLING)
        sleep_until(started + self.seconds)
        mark = self.stage.daemon.mark()
        requested, stopped, line = game.stop()
        said = self.stage.daemon.expect("movie finished:", mark)[1]
        dropped = int(said.split("pictures, ")[1].split()[0])
        path = urllib.parse.unquote(urllib.parse.urlparse(line.split("url=")[1].split(" error=")[0]).path)
        pictures, duration, kinds = probe_frames(path)
        if sorted(kinds) != ["audio", "audio", "video"]:
            raise RuntimeError(f"the movie has {kinds}")
        frames = pictures / (duration * mode.fps)
        return Round(daemon, 0, 0, frames, dropped, 0, server, 0, threads), stopped - requested

    # The same by other means ------------------------------------------------------------------------

    def x11grab_command(self, mode, output):
        rate = mode.bit_rate
        return (f"ffmpeg -v error -y -thread_queue_size 64 -f x11grab -draw_mouse 0 -framerate {mode.fps} "
                f"-video_size {mode.width}x{mode.height} -i {self.stage.environment['DISPLAY']} "
                "-thread_queue_size 512 -f pulse -i appout.monitor -thread_queue_size 512 -f pulse -i mic "
                f"-t {self.seconds:g} -map 0:v -map 1:a -map 2:a -c:a aac -aac_coder fast -b:a 128k -ac 2 -ar 44100 "
                "-c:v libx264 -preset ultrafast -profile:v high -x264-params "
                "cabac=1:8x8dct=1:no-deblock=0:deblock=0,0:analyse=i4x4,i8x8 "
                f"-b:v {rate}k -maxrate {rate * 3 // 2}k -bufsize {rate * 2}k -qmin 10 -bf 0 -g 60 -pix_fmt yuv420p "
                f"{output}")

    def x11grab(self, mode, round_):
        output = os.path.join(self.stage.directory, "x11grab.mp4")
        child = self.stage.start([*self.x11grab_command(mode, output).split(), "-progress", "pipe:1"])
        # Its first report comes with the first pictures.
        begun, _ = child.expect("out_time_us=")
        round_.x11grab, round_.server_x11grab, _ = self.measured(child.pid, begun + SETTLING,
                                                                 begun + self.seconds - SETTLING)
        child.process.wait(30)
        self.stage.end(child)
        pictures, duration, _ = probe_frames(output)
        round_.x11grab_frames = pictures / (duration * mode.fps)
        os.remove(output)

    def bare_command(self, mode):
        return [os.path.join(self.stage.build, "bench/recording/bench_bare_encoder"), str(mode.width), str(mode.height),
                str(mode.fps), str(mode.bit_rate * 1000), f"{self.seconds - 2 * SETTLING:g}"]

    def bare(self, mode):
        return float(self.stage.run(self.bare_command(mode)).stdout)

    def cost(self, mode, rounds):
        game = Game(self.stage, mode.width, mode.height, mode.fps)
        results, stops = [], []
        for number in range(rounds):
            round_, stop = self.record(game, mode)
            idle = processes.wake_ups(self.stage.daemon.pid)
            self.x11grab(mode, round_)
            self.woken_beside_game = processes.woken_since(idle, self.stage.daemon.pid)
            round_.bare = self.bare(mode)
            results.append(round_)
            stops.append(stop)
            progress(f"{mode.name} round {number + 1}: daemon {round_.daemon:.3f}, x11grab {round_.x11grab:.3f}, "
                     f"bare encoder {round_.bare:.3f} processor s/s")
        game.quit()
        return results, stops

    # Times ------------------------------------------------------------------------------------------

    def first_start(self, game):
        """The alert is answered by the keyboard.

        (seconds from the key, and from the answer's arrival, to the start's reply)
        """
        asked, said = self.stage.daemon.mark(), game.child.mark()
        self.stage.press("r")
        self.stage.daemon.expect("showAcknowledgementAlert", asked)
        # The alert has the keyboard when the game has lost it.
        self.stage.daemon.expect("clientDidResignActiveWithBundleID", asked)
        time.sleep(1.0)  # a fast user reads
        self.stage.press("Right")
        pressed = time.monotonic()
        self.stage.press("Return")
        acknowledged, _ = self.stage.daemon.expect("user acknowledged recording", asked)
        started, _ = game.child.expect("started", said)
        return started - pressed, started - acknowledged

    def times(self):
        game = Game(self.stage, 1280, 720, 60)
        first = self.first_start(game)
        time.sleep(10)
        requested, stopped, _ = game.stop()
        first_stop = stopped - requested
        starts, stops = [], []
        for _ in range(5):
            requested, started, _ = game.start()
            starts.append(started - requested)
            time.sleep(0.5)
            requested, stopped, _ = game.stop()
            stops.append(stopped - requested)
        game.quit()
        return first, first_stop, starts

    # Capture ----------------------------------------------------------------------------------------

    def capture(self, mode):
        """(median latency in ms, daemon's processor s/s, the game's line, frames shared by all, the game's rights to
        them, the game's processor seconds for a picture)"""
        game = Game(self.stage, mode.width, mode.height, mode.fps)
        _, started, _ = game.ask("c", "QVRecordingManager:startRecordingWindowLayerContextID", "started")
        drawing = processes.processor_seconds(game.child.pid)
        daemon, _, _ = self.measured(self.stage.daemon.pid, started + SETTLING, started + 4)
        drawing = (processes.processor_seconds(game.child.pid) - drawing) / (time.monotonic() - started) / mode.fps
        frames, rights = self.shared_frames(game.child.pid)
        said = game.child.mark()
        game.stop()
        line = game.child.expect("captured", said)[1]
        game.quit()
        return float(line.split("latency_ms=")[1].split()[0]), daemon, line, frames, rights, drawing

    def shared_frames(self, game):
        """How many frames the X server, the daemon and the game map at the same time, and the game's rights.

        Server and daemon keep their frames mapped; the game maps one only while it has it, a fraction of a
        picture's time, so it is looked at again and again.
        """
        kept = set.intersection(*(set(processes.shared_memory_files(pid)) for pid in
                                  (self.stage.display_server.pid, self.stage.daemon.pid)))
        frames, rights = set(), set()
        until = time.monotonic() + 2
        while time.monotonic() < until:
            seen = processes.shared_memory_files(game)
            for inode in kept.intersection(seen):
                frames.add(inode)
                rights.add(seen[inode])
        return len(frames), "".join(sorted(rights))


def sleep_until(when):
    time.sleep(max(0.0, when - time.monotonic()))


def progress(text):
    print(text, file=sys.stderr, flush=True)



def idle(pid, seconds):
    before = processes.wake_ups(pid)
    time.sleep(seconds)
    return (*processes.resident_kilobytes(pid), processes.woken_since(before, pid))


def main():
    parser = argparse.ArgumentParser(prog="scripts/bench recording")
    parser.add_argument("--build", default="build/release", help="build directory (default: %(default)s)")
    parser.add_argument("--rounds", type=int, default=2, help="of each mode (default: %(default)s)")
    parser.add_argument("--seconds", type=float, default=8, help="of each recording (default: %(default)s)")
    parser.add_argument("--modes", default=",".join(mode.name for mode in MODES), help="default: %(default)s")
    options = parser.parse_args()
    modes = [mode for mode in MODES if mode.name in options.modes.split(",")]
    idle_seconds = 10

    with Stage(options.build) as stage:
        bench = Bench(stage, options.seconds)
        load_before = os.getloadavg()[0]
        before = idle(stage.daemon.pid, idle_seconds)
        progress("the first start, and stops")
        first, first_stop, starts = bench.times()
        costs, stops = [], []
        for mode in modes:
            rounds, durations = bench.cost(mode, options.rounds)
            costs.append((mode, rounds))
            stops += durations
        progress("capture")
        captures = [(mode, bench.capture(mode)) for mode in modes if mode.fps == 60]
        time.sleep(1)
        after = idle(stage.daemon.pid, idle_seconds)

        print(f"One run on {os.cpu_count()} processors that others share: load {load_before:.1f} before it, "
              f"{os.getloadavg()[0]:.1f} after. Compare ratios, not seconds.")
        for mode, rounds in costs:
            table.print_costs(mode, rounds)
        table.print_times(first, first_stop, starts, stops)
        table.print_capture(captures)
        table.print_idle(before, after, bench.woken_beside_game, idle_seconds)
        print("\nCompared with, here for the first mode:")
        print("  " + bench.x11grab_command(modes[0], "x11grab.mp4"))
        bare = bench.bare_command(modes[0])
        print("  " + " ".join([os.path.relpath(bare[0]), *bare[1:]]))


if __name__ == "__main__":
    main()
