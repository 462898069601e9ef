"""A trim: a game that numbers its pictures is recorded for 10 s and stops with 2 s to take off at the start and 3 s at
the end. Tells the first and the last picture of the movie before and after: they must agree to the picture. The
untrimmed movie, which the daemon removes, is kept by a second name (a hard link) made while it was recorded.

usage: trim.py BUILD_DIRECTORY OUTPUT_DIRECTORY
"""
# build: quorveld quorveld-movies quorveld-exports quorvel-example-game
import os
import sys
import time

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), ".."))
from stage import movie as movies  # noqa: E402
from stage.applications import Game  # noqa: E402
from stage.device import Stage  # noqa: E402

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
    kept = os.path.join(stage.directory, "trim-source.mp4")
    time.sleep(SECONDS)
    os.link(stage.movie_files()[0], kept)
    line = game.ask("s", "stopRecordingWithStartTimeOffset", "stopped")[2]
    print("application: " + line)
    return kept, movies.path_in(line)


def number_in(cells):
    code = 0
    for cell in cells:
        code = code << 1 | (cell > 127)
    number = code >> 8
    return number if code & 0xFF == (number ^ number >> 8 ^ 0xA5) & 0xFF else None


def pictures(movie):
    """(time, number) of each, as ffmpeg shows them: each cell of the number is scaled to one pixel."""
    shown = [(moment, number_in(pixels)) for moment, pixels in
             movies.pictures(movie, "crop=iw:ih/20:0:ih-ih/20", f"scale={CELLS}:1:flags=area", size=CELLS)]
    without = sum(number is None for _, number in shown)
    if without:
        sys.exit(f"demo: {without} of {len(shown)} pictures have no number")
    return shown


def tell(name, shown, length):
    print(f"{name}: {length:.3f} s, {len(shown)} pictures, the first {shown[0][1]}, the last {shown[-1][1]}")


def compare(source, result):
    """Whether the result is the source from START to END before its end, picture by picture, each at its time."""
    shown, length = pictures(source), movies.duration(source)
    trimmed, trimmed_length = pictures(result), movies.duration(result)
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
    with Device(build, screen=(WIDTH, HEIGHT)) as stage:
        kept, recorded = record(stage)
        source, movie = movies.keep(kept, output), movies.keep(recorded, output)
    movies.report(movie, compare(source, movie))


main()
