"""Flashes and beeps: what the example application shows and plays at once, found again in a movie or a stream."""

import array
import math
import socket
import subprocess

RATE = 8000
BEEP_HZ = 1000


def run(arguments, seconds=120):
    return subprocess.run(arguments, capture_output=True, timeout=seconds, check=True, stdin=subprocess.DEVNULL).stdout


def free_port():
    with socket.socket() as probe:
        probe.bind(("127.0.0.1", 0))
        return probe.getsockname()[1]


def rising(levels, threshold):
    """The times at which the level comes up to the threshold; one that is up at the start does not count."""
    edges, up = [], True
    for moment, level in levels:
        if level >= threshold and not up:
            edges.append(moment)
        up = level >= threshold
    return edges


def frame_times(movie):
    text = run(["ffprobe", "-v", "error", "-select_streams", "v", "-of", "csv=p=0", "-show_entries", "frame=pts_time",
                movie]).decode()
    return [float(line.strip(",")) for line in text.split()]


def flashes(movie):
    levels = run(["ffmpeg", "-v", "error", "-copyts", "-i", movie, "-map", "0:v", "-vf",
                  "scale=1:1:flags=area,format=gray", "-fps_mode", "passthrough", "-f", "rawvideo", "-"])
    if not levels:
        return []
    return rising(zip(frame_times(movie), levels), (max(levels) + min(levels)) / 2)


def beeps(movie):
    samples = array.array("h", run(["ffmpeg", "-v", "error", "-copyts", "-i", movie, "-map", "0:a:0", "-af",
                                    "aresample=async=1:first_pts=0", "-ac", "1", "-ar", str(RATE), "-f", "s16le",
                                    "-"]))
    window = 2 * RATE // BEEP_HZ
    cosine = [math.cos(2 * math.pi * BEEP_HZ * i / RATE) for i in range(window)]
    sine = [math.sin(2 * math.pi * BEEP_HZ * i / RATE) for i in range(window)]
    levels = []
    for at in range(0, len(samples) - window, window // 2):
        piece = samples[at:at + window]
        levels.append(((at + window / 2) / RATE, math.hypot(sum(a * b for a, b in zip(piece, cosine)),
                                                           sum(a * b for a, b in zip(piece, sine)))))
    top = max((level for _, level in levels), default=0)
    return rising(levels, top / 2) if top > 100 else []


def worst_distance(movie, margin=0.0):
    """(flashes, the greatest distance in seconds from one to its beep); without those that `margin` leaves out at the
    ends."""
    times = frame_times(movie)
    seen = [flash for flash in flashes(movie) if times[0] + margin < flash < times[-1] - margin]
    heard = beeps(movie)
    return seen, max((min((abs(beep - flash) for beep in heard), default=math.inf) for flash in seen), default=math.inf)
