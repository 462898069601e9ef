"""Reads movies and streams with independent programs: ffprobe and ffmpeg, and mediainfo, whose reader is another.

The example application shows a flash and plays a beep at once; the headless device besides numbers its pictures.
"""
import array
import json
import math
import os
import shutil
import socket
import subprocess
import sys
import urllib.parse

from stage.processes import check
from stage.testsignal import FLASH_DURATION, FRAME_INTERVAL, Picture

WIDTH, HEIGHT = 256, 144  # the smallest picture whose cells are 16 pixels wide
RATE = 44100
APPLICATION_BEEP, MICROPHONE_BEEP = 1000, 440  # Hz


def run(arguments, seconds=600):
    return subprocess.run(arguments, capture_output=True, timeout=seconds, check=True, stdin=subprocess.DEVNULL).stdout


def run_silently(command):
    """It must find nothing to complain of."""
    done = subprocess.run(command, capture_output=True, timeout=600, stdin=subprocess.DEVNULL)
    check(done.returncode == 0 and not done.stderr,
          f"{command[0]} ended with {done.returncode}: {done.stderr.decode(errors='replace')}")
    return done.stdout


def free_port():
    with socket.socket() as probe:
        probe.bind(("127.0.0.1", 0))
        return probe.getsockname()[1]


def path_in(line):
    """Of the movie whose URL an application prints as "url=..."; empty where there is none."""
    return urllib.parse.unquote(urllib.parse.urlparse(line.split("url=")[1].split(" error=")[0]).path)


def keep(path, directory):
    """A copy that outlives the stage."""
    os.makedirs(directory, exist_ok=True)
    return shutil.copyfile(path, os.path.join(directory, os.path.basename(path)))


def report(path, is_good):
    """The end of a demo."""
    print("movie: " + path, flush=True)
    sys.exit(0 if is_good else 1)


def streams(path):
    """The streams' descriptions by ffprobe, video first."""
    return json.loads(run_silently(["ffprobe", "-v", "error", "-show_streams", "-of", "json", path]))["streams"]


def duration(path):
    return float(run(["ffprobe", "-v", "error", "-show_entries", "format=duration", "-of", "csv=p=0", path]))


def fragment_count(path):
    """How many fragments a movie that is being recorded has so far, the one in writing included."""
    count = 0
    with open(path, "rb") as file:
        while len(head := file.read(8)) == 8:
            size = int.from_bytes(head[:4], "big")
            if size < 8:
                break
            count += head[4:] == b"moof"
            file.seek(size - 8, os.SEEK_CUR)
    return count


def check_decodes(path):
    """Every packet of every stream, at its own time (ffmpeg would round it to a constant rate); and the readers
    agree about a finished movie."""
    run_silently(["ffmpeg", "-nostdin", "-v", "error", "-i", path, "-map", "0", "-vsync", "passthrough",
                  "-enc_time_base", "-1", "-f", "null", "-"])
    if is_finished(path):
        check_durations(path)


def is_finished(path):
    """Whether the movie has its index: in one that a crash left, a "free" stands where its media will."""
    with open(path, "rb") as file:
        file.seek(int.from_bytes(file.read(4), "big") + 4)
        return file.read(4) != b"free"


def check_durations(path):
    media = json.loads(run_silently(["mediainfo", "--Output=JSON", path]))["media"]
    check(media, "mediainfo cannot read the movie")
    found = [float(track["Duration"]) for track in media["track"] if track["@type"] != "General"]
    expected = [float(stream["duration"]) for stream in streams(path)]
    check(len(found) == len(expected) and all(abs(a - b) < 0.0011 for a, b in zip(found, expected)),
          f"mediainfo finds tracks of {found} s, ffprobe of {expected} s")


def frame_times(path):
    """Presentation times in seconds, in the order in which the pictures are shown."""
    text = run(["ffprobe", "-v", "error", "-select_streams", "v", "-of", "csv=p=0", "-show_entries", "frame=pts_time",
                path]).decode()
    return [float(line.strip(",")) for line in text.split()]


def pictures(path, *filters, size):
    """Presentation time and gray pixels of each picture."""
    chain = ",".join([*filters, "format=gray"])
    pixels = run(["ffmpeg", "-nostdin", "-v", "error", "-copyts", "-i", path, "-map", "0:v", "-fps_mode",
                  "passthrough", "-vf", chain, "-f", "rawvideo", "-"])
    times = frame_times(path)
    check(len(pixels) == size * len(times), f"{len(pixels) / size} pictures are decoded of {len(times)}")
    return [(time, pixels[i * size:(i + 1) * size]) for i, time in enumerate(times)]


def sound(path, track=0, rate=RATE):
    """The samples of one audio track from the movie's time 0 on, mono, 16 bits."""
    return array.array("h", run(["ffmpeg", "-nostdin", "-v", "error", "-copyts", "-i", path, "-map", f"0:a:{track}",
                                 "-af", "aresample=async=1:first_pts=0", "-ac", "1", "-ar", str(rate), "-f", "s16le",
                                 "-"]))


def rising(levels, threshold):
    """The times at which the level comes up to the threshold; one that is up at the start does not count."""
    edges, is_up = [], True
    for moment, level in levels:
        if level >= threshold and not is_up:
            edges.append(moment)
        is_up = level >= threshold
    return edges


def flashes(path):
    """When the picture as a whole becomes bright."""
    levels = [(time, pixels[0]) for time, pixels in pictures(path, "scale=1:1:flags=area", size=1)]
    brightness = [level for _, level in levels]
    return rising(levels, (max(brightness) + min(brightness)) / 2) if levels else []


def level(samples, frequency, rate):
    """Of one tone among the samples."""
    angle = 2 * math.pi * frequency / rate
    return math.hypot(sum(sample * math.cos(angle * i) for i, sample in enumerate(samples)),
                      sum(sample * math.sin(angle * i) for i, sample in enumerate(samples)))


def beeps(path, track=0, frequency=APPLICATION_BEEP):
    """When a tone begins."""
    rate = 8000
    samples = sound(path, track, rate)
    window = 2 * rate // frequency
    levels = [((at + window / 2) / rate, level(samples[at:at + window], frequency, rate))
              for at in range(0, len(samples) - window, window // 2)]
    top = max((loudness for _, loudness in levels), default=0)
    return rising(levels, top / 2) if top > 100 else []


def worst_distance(path, margin=0.0):
    """(flashes, the greatest distance in seconds from one to its beep); without those that `margin` leaves out at the
    ends."""
    times = frame_times(path)
    seen = [flash for flash in flashes(path) if times[0] + margin < flash < times[-1] - margin]
    heard = beeps(path)
    return seen, max((min((abs(beep - flash) for beep in heard), default=math.inf) for flash in seen), default=math.inf)


class NumberedFrame:
    """One of the headless device's."""

    def __init__(self, time, pixels):
        picture = Picture(pixels, WIDTH, HEIGHT, WIDTH)
        self.time, self.number, self.shows_flash = time, picture.number(), picture.shows_flash()


def numbered_frames(path):
    """Each can be read, appears once, and in order."""
    frames = [NumberedFrame(time, pixels)
              for time, pixels in pictures(path, f"scale={WIDTH}:{HEIGHT}", size=WIDTH * HEIGHT)]
    numbers = [frame.number for frame in frames]
    check(None not in numbers, f"{numbers.count(None)} of {len(numbers)} pictures cannot be read")
    for former, number in zip(numbers, numbers[1:]):
        check(number > former, f"picture {number} follows {former}")
    return frames


def host_time_of_start(frames, about):
    """The host time of the movie's time 0, found by its flashes, which stand on whole seconds.

    `about` tells which second: the movie began less than 0.3 s before it or 0.7 s after it.
    """
    for former, frame in zip(frames, frames[1:]):
        # A frame that came late tells nothing of the moment of the change.
        if frame.shows_flash != former.shows_flash and frame.time - former.time < 1.5 * FRAME_INTERVAL:
            phase = (0 if frame.shows_flash else FLASH_DURATION) - frame.time
            return phase - (phase - (about - 0.3)) // 1
    raise AssertionError("no flash begins or ends in the movie")
