"""A paused recording: the pause is not in the movie, everything else is, and sound meets picture."""
from harness import Device, check, main
from stage import movie
from stage.testsignal import FRAME_INTERVAL

LARGEST_OFFSET = 0.020  # seconds between the beginnings of a flash and its beep
LONGEST_GAP = 1.0       # seconds without pictures; the pause takes two


def flash_starts(frames):
    """For each flash, when it appears and when the picture before was shown.

    Only between neighbours: after the pause a flash may be cut.
    """
    return [(former.time, frame.time) for former, frame in zip(frames, frames[1:])
            if frame.shows_flash and not former.shows_flash and frame.number == former.number + 1]


def check_beeps(frames, beeps, what):
    """Each flash has its beep. A flash whose first picture came late began before it was seen."""
    flashes = flash_starts(frames)
    for before, shown in flashes:
        late = max(0.0, shown - before - FRAME_INTERVAL)
        offsets = [beep - shown for beep in beeps if -late - LARGEST_OFFSET <= beep - shown <= LARGEST_OFFSET]
        nearest = min((beep - shown for beep in beeps), key=abs, default=None)
        check(offsets, f'{what}: the flash at {shown:.3f} s is {nearest} s from its beep')
    print(f'{what}: {len(flashes)} flashes, each with its beep')
    return len(flashes)


def pause_and_resume(options):
    with Device() as device:
        device.start_daemon()
        output = device.run_game('record 4; pause 2; record 4; stop; quit', *options)
        path = movie.path_in(output)
        movie.check_decodes(path)
        tones = (movie.APPLICATION_BEEP, movie.MICROPHONE_BEEP)[:len(movie.streams(path)) - 1]
        return movie.numbered_frames(path), [movie.beeps(path, track, tone) for track, tone in enumerate(tones)]


def pause(*options):
    frames, tracks = pause_and_resume(options)
    length = frames[-1].time
    check(7 < length < 9.5, f'{length} s are recorded of 4 s, a pause and 4 s')
    gap = max((frame.time - former.time, former.number, frame.number) for former, frame in zip(frames, frames[1:]))
    check(gap[0] < LONGEST_GAP, f'{gap[0]} s pass between the pictures {gap[1]} and {gap[2]}')
    missing = frames[-1].number + 1 - len(frames)
    print(f'{len(frames)} pictures in {length:.3f} s, {missing} left out, longest gap {gap[0]:.3f} s')
    check(len(tracks) == (2 if '--microphone' in options else 1), f'{len(tracks)} tracks of sound')
    # A stop or a pause may take the beep of a flash just before it.
    for name, beeps in zip(('first sound', 'second sound'), tracks):
        check(len(beeps) <= length + 2, f'{name}: too many beeps: {beeps}')
        check(check_beeps([f for f in frames if f.time < 3.5], beeps, f'{name} before the pause') >= 2, 'no flashes')
        check(check_beeps([f for f in frames if 4.5 < f.time < length - 0.5], beeps,
                          f'{name} after the pause') >= 2, 'no flashes')


if __name__ == '__main__':
    main({'pause': pause, 'pause_microphone': lambda: pause('--microphone')})
