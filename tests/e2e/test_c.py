"""The example in C: a movie of the right length, and clear words where there is none."""
import os
import subprocess

import harness
from harness import BUILD, check, main
from stage import movie

EXAMPLE = 'examples/c-recorder/SquareDance.app/bin/quorvel-example-c-recorder'
SECONDS = 3


class Device(harness.Device):
    def __init__(self, **options):
        super().__init__(**options)
        self.environment['QUORVEL_BUNDLE_PATH'] += ':' + os.path.join(BUILD, 'examples/c-recorder')


def run_example(device, *arguments):
    return subprocess.run([os.path.join(BUILD, EXAMPLE), *arguments], env=device.environment, capture_output=True,
                          text=True, timeout=120)


def c_records():
    with Device() as device:
        device.start_daemon()
        copy = os.path.join(device.directory, 'copy.mp4')
        done = run_example(device, str(SECONDS), copy)
        check(done.returncode == 0 and not done.stderr, f'it ended with {done.returncode}: {done.stderr}')
        path = done.stdout.strip()
        check(path == device.movie_files()[0], f'it told {path}')
        for file in (path, copy):
            movie.check_decodes(file)
            length = movie.duration(file)
            check(SECONDS - 0.5 < length < SECONDS + 1.5, f'{file} is {length} s long')


def c_is_refused():
    """By no daemon, and by one whose user says no: an error in words, and no leak."""
    with Device(alert='cancel') as device:
        for text in ('cannot be reached', 'was not allowed'):
            done = run_example(device, '1')
            check(done.returncode == 1 and text in done.stderr and not done.stdout,
                  f'it ended with {done.returncode}: {done.stdout}{done.stderr}')
            if not hasattr(device, 'daemon'):
                device.start_daemon()
        check(not device.movie_files(), 'a movie was left')


if __name__ == '__main__':
    main({'c_records': c_records, 'c_is_refused': c_is_refused})
