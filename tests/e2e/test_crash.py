"""A recording survives the daemon's death at any moment, but for its last second."""
import concurrent.futures
import os
import random
import time

from harness import Device, check, is_sanitized, main, wait_until
from stage import movie
from stage.testsignal import FRAME_INTERVAL

SEED = 20240229
SHORTEST, LONGEST = 1.7, 4.0  # seconds of media until the kill
# Together longer than a second: the file then holds a flash, by which it is placed in time.
FEWEST_FRAGMENTS = 2
# The pictures of a sanitized build may wait for long at the encoder; that is no loss of the file's.
LARGEST_LOSS = 4.0 if is_sanitized() else 1.0 + FRAME_INTERVAL


def record_and_kill(device, length, killed_path=None):
    """The moments of the start and the kill. Pictures follow CLOCK_MONOTONIC, as time.monotonic() does. The file is
    moved to `killed_path`, or stays where a daemon that starts finds it."""
    daemon = device.start_daemon()
    game = device.start_game(script='record 600; stop')
    game.expect('started')
    started = time.monotonic()
    path, = wait_until('the movie file', device.movie_files)
    wait_until('the moment to kill', lambda: movie.fragment_count(path) >= FEWEST_FRAGMENTS and
               time.monotonic() >= started + length, step=0.001)
    killed = time.monotonic()
    daemon.kill()
    daemon.check_sanitizers()
    device.end(daemon)
    game.expect('stopped')  # the client is told
    device.end(game)
    if killed_path:
        os.rename(path, killed_path)
    return started, killed


def judge(path, started, killed):
    """How much is missing, in seconds."""
    video, audio = movie.streams(path)[:2]
    movie.check_decodes(path)
    frames = movie.numbered_frames(path)
    check(frames[0].number == 0, f'the movie begins with picture {frames[0].number}')
    captured = killed - movie.host_time_of_start(frames, started)
    loss = captured - float(video['duration'])
    missing = frames[-1].number + 1 - len(frames)
    print(f'{captured:.3f} s captured, picture {video["duration"]} s, sound {audio["duration"]} s: {loss:.3f} s lost, '
          f'{missing} pictures left out', flush=True)
    return loss


def kill_at_random_moments(rounds):
    moments = random.Random(SEED)
    with Device() as device, concurrent.futures.ThreadPoolExecutor(1) as judges:
        losses = []
        for index in range(int(rounds)):
            path = os.path.join(device.directory, f'killed{index}.mp4')
            times = record_and_kill(device, moments.uniform(SHORTEST, LONGEST), path)
            losses.append(judges.submit(judge, path, *times))
        worst = max(loss.result() for loss in losses)
        check(worst <= LARGEST_LOSS, f'{worst:.3f} s of a movie are lost')
        # The daemon after all these goes on where they left off.
        device.start_daemon()
        check('error=0' in device.run_game('record 1; stop; quit'), 'no recording after the crashes')


def salvage_at_the_next_start():
    """The killed recording is finished, and the application's next one leaves it alone."""
    with Device(log='notice') as device:
        started, killed = record_and_kill(device, SHORTEST)
        daemon = device.start_daemon()
        daemon.expect('finished an unfinished movie')
        kept, = device.movie_files()
        loss = judge(kept, started, killed)
        check(loss <= LARGEST_LOSS, f'{loss:.3f} s of the movie are lost')
        check(movie.fragment_count(kept) == 0, 'the movie is not finished')
        with open(kept, 'rb') as file:
            content = file.read()
        check('error=0' in device.run_game('record 1; stop; quit'), 'no recording after the salvage')
        check(len(device.movie_files()) == 2, f'{device.movie_files()}')
        with open(kept, 'rb') as file:
            check(file.read() == content, 'the next recording changed the movie')


if __name__ == '__main__':
    main({'kill': kill_at_random_moments, 'salvage': salvage_at_the_next_start})
