"""The daemon lives on, and says what is wrong, where the world around it is not as it should be."""
import errno
import os
import shutil
import urllib.parse

from harness import Device, check, main, wait_until
from stage import movie
from stage.device import Daemon

FAILED_TO_START, INSUFFICIENT_STORAGE = -5803, -5805


def records(device):
    return 'error=0' in device.run_game('record 1; stop; discard; quit')


def wait_for_growth(device):
    """The movie that is being recorded, with a fragment in it."""
    path, = wait_until('the movie file', device.movie_files)
    wait_until('the movie to grow', lambda: movie.fragment_count(path) >= 1)
    return path


def second_daemon():
    """It must not take the place of the one that serves."""
    with Device() as device:
        first = device.start_daemon()
        game = device.start_game(script='record 2; stop; quit')
        game.expect('started')
        second = device.add(Daemon(device))
        second.expect('the service cannot be opened')
        code = second.wait()
        check(code > 0, f'the second daemon ended with {code}')
        device.end(second)
        game.expect('stopped url=file:')
        game.wait()
        check(first.is_running() and records(device), 'the first daemon serves no longer')


def client_dies_in_alert():
    """The start of a client that died during its alert is over; its successor's is its own."""
    with Device(alert='never', log='notice') as device:
        device.write_device(internalBuild=True)
        daemon = device.start_daemon()
        for _ in range(2):
            mark = daemon.mark()
            game = device.start_game(script='record 1; stop; quit')
            daemon.expect('QVRecordingManager:showAcknowledgementAlert', mark)
            game.kill()
            daemon.expect('QVRecordingManager: applicationDisconnected', mark)
        # From now on nobody is asked, so that the next start can succeed.
        device.write_preferences({'QVSuppressAlert': True})
        check(records(device), 'the next client is not served')


def disk_without_room():
    """No recording begins with 100 MB free or less; when there is room again, one does."""
    with Device() as device:
        device.mount_disk(device.media, '120m')
        device.start_daemon()
        check(records(device), 'no recording with room enough')
        device.write(os.path.join(device.media, 'ballast'), bytes(30_000_000))
        output = device.run_game('record 1; stop; quit', code=1)
        check(f'error code={INSUFFICIENT_STORAGE} ' in output, output)
        check(not device.movie_files(), 'the refused recording has a file')
        os.remove(os.path.join(device.media, 'ballast'))
        check(records(device), 'no recording with room again')


def fill_disk(path, room):
    """Leaves about `room` bytes free."""
    with open(path, 'wb', buffering=0) as file:
        status = os.fstatvfs(file.fileno())
        while room == 0 or status.f_bavail * status.f_frsize > room:
            try:
                file.write(bytes(1 << 20))
            except OSError:
                return
            status = os.fstatvfs(file.fileno())


def disk_that_fills():
    """What was recorded before the disk was full can be played; the daemon goes on."""
    for room in (30_000_000, 0):
        record_while_disk_fills(room)


def record_while_disk_fills(room):
    with Device() as device:
        device.mount_disk(device.media, '120m')
        device.start_daemon()
        game = device.start_game(script='record 4; stop; quit')
        game.expect('started')
        path = wait_for_growth(device)
        ballast = os.path.join(device.media, 'ballast')
        fill_disk(ballast, room)
        game.wait()
        output = game.output()
        path, = device.movie_files()
        check(f'stopped url=file://{urllib.parse.quote(path)} error={INSUFFICIENT_STORAGE}\n' in output, output)
        check(float(movie.streams(path)[0]['duration']) > 0.5, 'nothing is left of the recording')
        if room > 0:
            check(movie.fragment_count(path) == 0, 'the movie was not finished')
        movie.check_decodes(path)
        os.remove(ballast)
        check(records(device), 'no recording with room again')


def check_refused_for_store(device, reason):
    """A store that cannot be written refuses a start and says why in the log, until it can."""
    output = device.run_game('record 1; stop; quit', code=1)
    check(f'error code={FAILED_TO_START} ' in output, output)
    device.daemon.expect(f'movies cannot be written, calling handler with error: posix {reason} ')


def read_only_disk():
    with Device() as device:
        device.mount_disk(device.movies, '200m')
        device.start_daemon()
        device.remount(device.movies, 'ro')
        check_refused_for_store(device, errno.EROFS)
        device.remount(device.movies, 'rw')
        check(records(device), 'no recording on a disk that can be written again')


def store_that_cannot_be_made():
    with Device() as device:
        device.write(device.movies, 'not a directory')
        device.start_daemon()
        check_refused_for_store(device, errno.ENOTDIR)
        os.remove(device.movies)
        os.rmdir(device.media)
        check_refused_for_store(device, errno.ENOENT)
        os.makedirs(device.media)
        check(records(device), 'no recording where the store can be made')


BROKEN = ['', '{', '[]', 'null', '{"idiom": 7, "chipID": "x", "Languages": 3, "QVBitRateOverride": "lots"}',
          '{"Languages": [1, {}, "xx-nonsense", ""], "QVBitRateOverride": -5, "QVFullResCapture": "maybe"}',
          '\ufffd\x00\x01' * 50, '[' * 100_000, 'x' * 3_000_000]


def broken_files():
    """Whatever stands in the files that the device's maker and user write, recordings work."""
    for content in BROKEN:
        with Device() as device:
            device.write('etc/quorvel/device.json', content)
            device.write_preferences(content)
            for bundle in ('com.tarnwick.quorveld', 'com.example.quorvel.game'):
                device.write(f'etc/quorvel/entitlements/{bundle}.json', content)
            device.write(os.path.join(device.framework, 'Info.json'), content)
            for directory, _, names in os.walk(os.path.join(device.framework, 'Resources')):
                for name in names:
                    device.write(os.path.join(directory, name), content)
            daemon = device.start_daemon()
            check(records(device), f'no recording with files of {content[:30]!r}')
            check(daemon.is_running(), 'the daemon ended')
    with Device() as device:  # no files at all, and links and directories where files should be
        shutil.rmtree(device.framework)
        description = os.path.join(device.root, 'etc/quorvel/device.json')
        os.remove(description)
        os.makedirs(description)
        preferences = os.path.join(device.media, 'Preferences')
        os.makedirs(preferences)
        os.symlink('com.tarnwick.quorveld.json', os.path.join(preferences, 'com.tarnwick.quorveld.json'))
        device.start_daemon()
        check(records(device), 'no recording without files')


if __name__ == '__main__':
    main({case.__name__: case for case in (
        second_daemon, client_dies_in_alert, disk_without_room, disk_that_fills, read_only_disk,
        store_that_cannot_be_made, broken_files)})
