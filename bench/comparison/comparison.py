"""The same game recorded by the daemon, and by ffmpeg, which grabs the screen: what either costs, and what is in the movie
when a window comes in front, and when the recorder is killed.

usage: comparison.py [--seconds S] [--build DIR]
"""
import argparse
import os
import signal
import subprocess
import sys
import time

SOURCE = os.path.join(os.path.dirname(os.path.abspath(__file__)), "../..")
sys.path.insert(0, os.path.join(SOURCE, "scripts"))
from stage.applications import Game  # noqa: E402
from stage.device import Stage  # noqa: E402
from stage.movie import frame_times, path_in, pictures, run, worst_distance  # noqa: E402
from stage.processes import processor_seconds, wait_until  # noqa: E402

WIDTH, HEIGHT, RATE = 1280, 720, 60
# Its luma is the same by every matrix of colours. The game is darker in the middle, and a flash is brighter.
GRAY, GRAY_LUMA = "#808080", 126


class Grabber:
    """ffmpeg on the part of the screen where the game's window is, with what the default output plays."""

    def __init__(self, stage, path):
        self.path = path
        queue = ["-thread_queue_size", "512"]
        screen = ["-f", "x11grab", "-framerate", str(RATE), "-video_size", f"{WIDTH}x{HEIGHT}", "-i", stage.environment["DISPLAY"]]
        sound = ["-f", "pulse", "-i", "appout.monitor"]
        codecs = ["-c:v", "libx264", "-preset", "veryfast", "-pix_fmt", "yuv420p", "-c:a", "aac"]
        self.child = stage.start(["ffmpeg", "-v", "error", "-nostdin", "-y", *queue, *screen, *queue, *sound, *codecs, path],
                                 "stderr")
        wait_until("the grabber's file", lambda: os.path.exists(path))

    def stop(self):
        self.child.process.send_signal(signal.SIGINT)
        self.child.wait()


def length_of(path):
    """Seconds that players get of it, whatever its head says: 0 where they take it for no movie."""
    try:
        times = frame_times(path)
    except subprocess.CalledProcessError:
        return 0.0
    return max(times) - min(times) if times else 0.0


def share_of(path, brightness):
    """Of the pictures, those whose middle is that bright (luma)."""
    found = [abs(pixels[0] - brightness) < 6 for _, pixels in pictures(path, "crop=64:64,scale=1:1:flags=area", size=1)]
    return sum(found) / max(len(found), 1)


def count_pictures(path):
    return int(run(["ffprobe", "-v", "error", "-select_streams", "v", "-count_packets", "-show_entries",
                    "stream=nb_read_packets", "-of", "csv=p=0", path]))


def report(name, path, seconds, processor):
    _, flash = worst_distance(path, 0.1)
    print(f"{name}: {processor / seconds * 100:.0f} % of a processor, {count_pictures(path) / length_of(path):.1f} pictures/s, "
          f"{os.path.getsize(path) / length_of(path) / 1e6:.2f} MB/s, flash to beep {flash * 1000:.0f} ms at most")


def steady(stage, game, seconds):
    """One after the other."""
    game.start()
    before, began = processor_seconds(stage.daemon.pid), time.monotonic()
    time.sleep(seconds)
    used, lasted = processor_seconds(stage.daemon.pid) - before, time.monotonic() - began
    movie = path_in(game.stop()[2])
    report("quorveld", movie, lasted, used)
    grabber = Grabber(stage, os.path.join(stage.directory, "grabbed.mp4"))
    before, began = processor_seconds(grabber.child.pid), time.monotonic()
    time.sleep(seconds)
    used, lasted = processor_seconds(grabber.child.pid) - before, time.monotonic() - began
    grabber.stop()
    report("ffmpeg", grabber.path, lasted, used)


def window_in_front(stage, game):
    """A window over the game for the whole time: for how much of the movie is it seen?"""
    game.start()
    grabber = Grabber(stage, os.path.join(stage.directory, "covered.mp4"))
    cover = stage.start(["xterm", "-geometry", "80x24+400+200", "-bg", GRAY, "-fg", GRAY, "-e", "sleep", "60"])
    stage.find_window("--class", "xterm")
    time.sleep(3)
    movie = path_in(game.stop()[2])
    grabber.stop()
    stage.end(cover)
    for name, path in (("quorveld", movie), ("ffmpeg", grabber.path)):
        print(f"{name}: the window in front is in {share_of(path, GRAY_LUMA) * 100:.0f} % of the pictures")


def killed(stage, game, seconds):
    for name in ("killed.mp4", "killed.mkv"):
        grabber = Grabber(stage, os.path.join(stage.directory, name))
        time.sleep(seconds)
        grabber.child.kill()
        print(f"ffmpeg: killed after {seconds} s, {name} plays for {length_of(grabber.path):.1f} s")
    game.start()
    time.sleep(seconds)
    stage.daemon.kill()
    stage.end(stage.daemon)
    stage.start_daemon()
    kept, = (path for path in stage.movie_files() if "_recovered_" in path)
    print(f"quorveld: killed after {seconds} s, and started again, the movie plays for {length_of(kept):.1f} s")


def main():
    arguments = argparse.ArgumentParser()
    arguments.add_argument("--seconds", type=float, default=20)
    arguments.add_argument("--build", default=os.path.join(SOURCE, "build/release"))
    chosen = arguments.parse_args()
    stage = Stage(chosen.build)
    stage.allow_recordings()
    stage.write_device(internalBuild=True, audioCaptureDevice=False)
    with stage:
        game = Game(stage, WIDTH, HEIGHT, RATE)
        steady(stage, game, chosen.seconds)
        window_in_front(stage, game)
        killed(stage, game, 6)


main()
