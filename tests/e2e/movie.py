"""Reads movies with independent programs, which must find nothing to complain of: ffprobe and ffmpeg, and
mediainfo, whose reader is another."""
import array
import json
import os
import subprocess

from harness import check
from testsignal import FLASH_DURATION, FRAME_INTERVAL, Picture

WIDTH, HEIGHT = 256, 144  # the smallest picture whose cells are 16 pixels wide
RATE = 44100


def run_silently(command):
    done = subprocess.run(command, capture_output=True, timeout=600)
    check(done.returncode == 0 and not done.stderr,
          f'{command[0]} ended with {done.returncode}: {done.stderr.decode(errors="replace")}')
    return done.stdout


def streams(path):
    """The streams' descriptions by ffprobe, video first."""
    output = run_silently(['ffprobe', '-v', 'error', '-show_streams', '-of', 'json', path])
    return json.loads(output)['streams']


def fragment_count(path):
    """How many fragments a movie that is being recorded has so far, the one in writing included."""
    count = 0
    with open(path, 'rb') as file:
        while len(head := file.read(8)) == 8:
            size = int.from_bytes(head[:4], 'big')
            if size < 8:
                break
            count += head[4:] == b'moof'
            file.seek(size - 8, os.SEEK_CUR)
    return count


def check_decodes(path):
    """Every packet of every stream, at its own time (ffmpeg would round it to a constant rate); and the readers
    agree about a finished movie."""
    run_silently(['ffmpeg', '-nostdin', '-v', 'error', '-i', path, '-map', '0', '-vsync', 'passthrough',
                  '-enc_time_base', '-1', '-f', 'null', '-'])
    if is_finished(path):
        check_durations(path)


def is_finished(path):
    """Whether the movie has its index: in one that a crash left, a "free" stands where its media will."""
    with open(path, 'rb') as file:
        file.seek(int.from_bytes(file.read(4), 'big') + 4)
        return file.read(4) != b'free'


def check_durations(path):
    media = json.loads(run_silently(['mediainfo', '--Output=JSON', path]))['media']
    check(media, 'mediainfo cannot read the movie')
    found = [float(track['Duration']) for track in media['track'] if track['@type'] != 'General']
    expected = [float(stream['duration']) for stream in streams(path)]
    check(len(found) == len(expected) and all(abs(a - b) < 0.0011 for a, b in zip(found, expected)),
          f'mediainfo finds tracks of {found} s, ffprobe of {expected} s')


class Frame:
    def __init__(self, time, pixels):
        picture = Picture(pixels, WIDTH, HEIGHT, WIDTH)
        self.time, self.number, self.shows_flash = time, picture.number(), picture.shows_flash()


def frame_times(path):
    """Presentation times in seconds, in order."""
    output = run_silently(['ffprobe', '-v', 'error', '-select_streams', 'v', '-show_entries', 'packet=pts_time',
                           '-of', 'csv=p=0', path])
    return sorted(float(line.split(b',')[0]) for line in output.split() if line)


def video_frames(path):
    times = frame_times(path)
    pixels = run_silently(['ffmpeg', '-nostdin', '-v', 'error', '-i', path, '-map', '0:v', '-vsync', 'passthrough',
                           '-vf', f'scale={WIDTH}:{HEIGHT}', '-f', 'rawvideo', '-pix_fmt', 'gray', '-'])
    size = WIDTH * HEIGHT
    check(len(pixels) == size * len(times), f'{len(pixels) / size} pictures are decoded of {len(times)}')
    return [Frame(time, pixels[i * size:(i + 1) * size]) for i, time in enumerate(times)]


def sound(path, track=0):
    """The samples of one audio track from the movie's time 0 on, mono, 16 bits, at RATE."""
    return array.array('h', run_silently(['ffmpeg', '-nostdin', '-v', 'error', '-i', path, '-map', f'0:a:{track}',
                                          '-af', 'aresample=async=1:first_pts=0', '-ac', '1', '-ar', str(RATE),
                                          '-f', 's16le', '-']))


def beep_starts(samples, threshold=3000, silence=0.02):
    """Times at which sound follows silence, in seconds."""
    starts, last_loud = [], -silence
    for i, sample in enumerate(samples):
        if abs(sample) < threshold:
            continue
        time = i / RATE
        if time - last_loud >= silence and time > 0:
            starts.append(time)
        last_loud = time
    return starts


def check_numbers(frames):
    """Each frame can be read, appears once, and in order."""
    numbers = [frame.number for frame in frames]
    unreadable = numbers.count(None)
    check(unreadable == 0, f'{unreadable} of {len(numbers)} pictures cannot be read')
    for former, number in zip(numbers, numbers[1:]):
        check(number > former, f'picture {number} follows {former}')
    return numbers


def host_time_of_start(frames, about):
    """The host time of the movie's time 0, found by its flashes, which stand on whole seconds.

    `about` tells which second: the movie began less than 0.3 s before it or 0.7 s after it.
    """
    for former, frame in zip(frames, frames[1:]):
        # A frame that came late tells nothing of the moment of the change.
        if frame.shows_flash != former.shows_flash and frame.time - former.time < 1.5 * FRAME_INTERVAL:
            phase = (0 if frame.shows_flash else FLASH_DURATION) - frame.time
            return phase - (phase - (about - 0.3)) // 1
    raise AssertionError('no flash begins or ends in the movie')
