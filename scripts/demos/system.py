"""A system recording: two applications with a colour and a tone each are on the screen; the system UI records it.
The front changes twice, then the application in front crashes. Tells, second by second, which one is seen and
which one is heard in the movie: they must agree, but for the seconds in which the front changes.

usage: system.py BUILD_DIRECTORY OUTPUT_DIRECTORY
"""
# build: quorveld quorveld-movies quorvel-example-game quorvel-example-system-ui
import math
import os
import sys
import time
from collections import Counter

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), ".."))
from stage.applications import Application  # noqa: E402
from stage.device import Stage  # noqa: E402
from stage.movie import keep, level, path_in, report, run, sound  # noqa: E402

RATE = 22050
LOOKS = 20          # a second
SLOWEST_TAP = 0.5   # seconds until the tone has followed the picture
SECONDS = 4         # each application's turn
# name: (colour, tone in Hz)
CAST = {"Red": ("c00000", 440), "Blue": ("0000c0", 1000)}


class Device(Stage):
    def prepare(self):
        self.allow_system_recordings()
        self.write_device(RegionalBehaviorShutterClick=True)


def record(stage):
    """The movie, after the front has changed and the application in front has gone."""
    cast = {name: Application(stage, name, "--sky", sky, "--tone", str(tone)) for name, (sky, tone) in CAST.items()}
    ui = stage.start_system_ui()
    cast["Red"].bring_to_front()
    time.sleep(1)
    ui.say("start")
    print("system UI: " + ui.expect("started microphone")[1])
    for name in ("Blue", "Red"):
        time.sleep(SECONDS)
        cast[name].bring_to_front()
        print(f"front: {name}")
    time.sleep(SECONDS)
    cast["Red"].crash()
    print("Red crashes")
    time.sleep(SECONDS)
    ui.say("stop")
    line = ui.expect("stopped")[1]
    print("system UI: " + line)
    return path_in(line)


def seen(movie):
    """The application whose colour each picture has, LOOKS a second."""
    # A corner without comets and flashes.
    pixels = run(["ffmpeg", "-nostdin", "-v", "error", "-i", movie, "-map", "0:v", "-vf",
                  f"fps={LOOKS},crop=iw/16:ih/40:0:0,scale=1:1:flags=area,format=rgb24", "-f", "rawvideo", "-"])
    names = []
    for red, _, blue in zip(*[iter(pixels)] * 3):
        names.append("Red" if red > blue + 60 else "Blue" if blue > red + 60 else "nobody")
    return names


def heard(movie):
    """The application whose tone is there, LOOKS a second."""
    samples = sound(movie, rate=RATE)
    step = RATE // LOOKS
    names = []
    for start in range(0, len(samples) - step // 2, step):
        levels = {name: level(samples[start:start + step], tone, RATE) / step for name, (_, tone) in CAST.items()}
        name = max(levels, key=levels.get)
        names.append(name if levels[name] > 500 else "nobody")
    return names


def changes(names):
    """(when, what to) of each change that lasts."""
    found = []
    for i in range(1, len(names) - 2):
        if names[i] != names[i - 1] and names[i] == names[i + 1] == names[i + 2]:
            found.append((i / LOOKS, names[i]))
    return found


def most(names):
    return Counter(names).most_common(1)[0][0] if names else "nobody"


def check_seconds(pictures, tones):
    switches = {int(moment) for moment, _ in changes(pictures)}
    good = True
    # The last piece of a second is too short to judge.
    for second in range(len(pictures) // LOOKS):
        part = slice(second * LOOKS, (second + 1) * LOOKS)
        picture, tone = most(pictures[part]), most(tones[part])
        verdict = "agree" if picture == tone else "front changes" if second in switches else "DIFFER"
        good = good and verdict != "DIFFER" and picture != "nobody"
        print(f"second {second:2}: seen {picture:6} heard {tone:6} {verdict}")
    return good


def check_switches(pictures, tones):
    expected = ["Blue", "Red", "Blue"]
    switches = changes(pictures)
    good = [name for _, name in switches] == expected
    if not good:
        print(f"the picture changes to {[name for _, name in switches]}, NOT to {expected}")
    for moment, name in switches:
        first = round(moment * LOOKS)
        lag = next((i / LOOKS for i, tone in enumerate(tones[first:]) if tone == name), math.inf)
        within = lag <= SLOWEST_TAP
        good = good and within
        print(f"{name} comes to the front at {moment:.2f} s; its tone {lag:.2f} s later, "
              f"{'within' if within else 'NOT within'} {SLOWEST_TAP} s")
    return good


def main():
    build, output = sys.argv[1:]
    with Device(build, screen=(1280, 720)) as stage:
        recorded = record(stage)
        dropped = stage.daemon.expect("movie finished:")[1]
        movie = keep(recorded, output)
    print("daemon: " + dropped[dropped.index("movie finished"):])
    pictures, tones = seen(movie), heard(movie)
    good = check_seconds(pictures, tones)
    good = check_switches(pictures, tones) and good
    report(movie, good)


main()
