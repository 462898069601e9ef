"""A trim: a game that numbers its pictures is recorded for 10 s and stops with 2 s to take off at the start and 3 s at
the end. Tells the first and the last picture of the movie before and after: they must agree to the picture. The
untrimmed movie, which the daemon removes, is kept by a second name (a hard link) made while it was recorded.

usage: trim.py BUILD_DIRECTORY OUTPUT_DIRECTORY
"""
# build: quorveld quorveld-movies quorveld-exports quorvel-example-game
import os
import shutil
import subprocess
import sys
import time
import urllib.parse

ROOT = os.path.dirname(os.path.dirname(os.path.dirname(os.path.abspath(__file__))))
sys.path.insert(0, os.path.join(ROOT, "scripts/stage"))
from stage import Game, Stage  # noqa: E402

WIDTH, HEIGHT, FPS = 1280, 720, 30
SECONDS = 10
START, END = 2.0, 3.0  # seconds to take off
CELLS = 24
ROUNDING = 1e-3        # seconds


class Device(Stage):
    def prepare(self):
        self.allow_recordings()


def record(stage):
    """(what was recorded, what the application got)"""
    game = Game(stage, WIDTH, HEIGHT, FPS, "--numbered", "--trim", f"{START:g},{END:g}")
    game.start()
    kept = os.path.join(stage.directory, "source.mp4")
    time.sleep(SECONDS)
    growing = next(name for name in os.listdir(stage.movies) if name.endswith(".mp4"))
    os.link(os.path.join(stage.movies, growing), kept)
    line = game.ask("s", "stopRecordingWithStartTimeOffset", "stopped")[2]
    print("application: " + line)
    return kept, urllib.parse.unquote(urllib.parse.urlparse(line.split("url=")[1].split()[0]).path)


def number_in(cells):
    code = 0
    for cell in cells:
        code = code << 1 | (cell > 127)
    number = code >> 8
    return number if code & 0xFF == (number ^ number >> 8 ^ 0xA5) & 0xFF else None


def pictures(movie):
    """(time, number) of each, as ffmpeg shows them: each cell of the number is scaled to one pixel."""
    times = subprocess.run(["ffprobe", "-v", "error", "-select_streams", "v", "-show_entries", "frame=pts_time", "-of",
                            "csv=p=0", movie], capture_output=True, text=True, check=True, timeout=120).stdout.split()
    pixels = subprocess.run(
        ["ffmpeg", "-nostdin", "-v", "error", "-i", movie, "-map", "0:v", "-fps_mode", "passthrough", "-vf",
         f"crop=iw:ih/20:0:ih-ih/20,scale={CELLS}:1:flags=area", "-f", "rawvideo", "-pix_fmt", "gray", "-"],
        capture_output=True, check=True, timeout=120).stdout
    numbers = [number_in(pixels[i:i + CELLS]) for i in range(0, len(pixels), CELLS)]
    if len(numbers) != len(times) or None in numbers:
        sys.exit(f"demo: of {len(times)} pictures {len(numbers)} were decoded, {numbers.count(None)} without a number")
    return [(float(moment.strip(",")), number) for moment, number in zip(times, numbers)]


def length_of(movie):
    return float(subprocess.run(["ffprobe", "-v", "error", "-show_entries", "format=duration", "-of", "csv=p=0", movie],
                                capture_output=True, text=True, check=True, timeout=60).stdout)


def tell(name, shown, length):
    print(f"{name}: {length:.3f} s, {len(shown)} pictures, the first {shown[0][1]}, the last {shown[-1][1]}")


def compare(source, result):
    """Whether the result is the source from START to END before its end, picture by picture, each at its time."""
    shown, length = pictures(source), length_of(source)
    trimmed, trimmed_length = pictures(result), length_of(result)
    tell("source", shown, length)
    tell("result", trimmed, trimmed_length)
    nexts = [moment for moment, _ in shown[1:]] + [length]
    wanted = [(max(moment - START, 0.0), number) for (moment, number), following in zip(shown, nexts)
              if following > START + ROUNDING and moment < length - END - ROUNDING]
    print(f"wanted: {length - START - END:.3f} s, {len(wanted)} pictures, the first {wanted[0][1]}, "
          f"the last {wanted[-1][1]}")
    same = [number for _, number in wanted] == [number for _, number in trimmed]
    worst = max((abs(a[0] - b[0]) for a, b in zip(wanted, trimmed)), default=0)
    print(f"pictures: {'the same' if same else 'NOT the same'}; times: {worst * 1000:.2f} ms off at most")
    return same and worst < ROUNDING and abs(trimmed_length - (length - START - END)) < ROUNDING


def main():
    build, output = sys.argv[1:]
    with Device(ROOT, build, screen=(WIDTH, HEIGHT)) as stage:
        kept, recorded = record(stage)
        os.makedirs(output, exist_ok=True)
        source = shutil.copyfile(kept, os.path.join(output, "trim-source.mp4"))
        movie = shutil.copyfile(recorded, os.path.join(output, os.path.basename(recorded)))
    good = compare(source, movie)
    print("movie: " + movie)
    sys.stdout.flush()
    sys.exit(0 if good else 1)


main()
