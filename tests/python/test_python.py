"""The Python package against the real daemon.

A case starts the daemon, and runs itself once more as the application, by the interpreter of a bundle.
"""
import asyncio
import gc
import os
import re
import subprocess
import sys
import time

HERE = os.path.dirname(os.path.abspath(__file__))
ROOT = os.path.dirname(os.path.dirname(HERE))
sys.path[:0] = [os.path.join(ROOT, name) for name in ('python', 'tests/e2e', 'scripts')]
import harness  # noqa: E402
from harness import check, main, wait_until  # noqa: E402
from stage import device as stages, movie as movies  # noqa: E402
from stage.processes import PATIENCE  # noqa: E402
from stage.testsignal import Picture  # noqa: E402

import quorvel  # noqa: E402
from quorvel import ErrorCode, RecordingError  # noqa: E402
from quorvel.bundle import make_bundle  # noqa: E402
from quorvel.samples import AudioFormat, AudioSample, AudioSource, SoundTimeline  # noqa: E402

SIZE = (640, 360)
ME = os.getpid()  # a device without windows knows an application's context by its process
STOP = 'QVRecordingManager: stopRecordingWithHandler'
CLIPS = 'com.example.quorvel.game.clips.upload'


class Device(harness.Device):
    def start_application(self, case):
        environment = {**self.environment, 'PYTHONPATH': os.path.join(ROOT, 'python'), 'PYTHONDONTWRITEBYTECODE': '1'}
        made = subprocess.run([harness.PYTHON, '-m', 'quorvel.bundle', os.path.join(self.bundles, 'Python.app'),
                               '--identifier', 'com.example.python', '--name', 'Python'],
                              env=environment, check=True, capture_output=True, text=True)
        return self.start([made.stdout.strip(), '-u', '-X', 'dev', '-W', 'error::ResourceWarning', __file__,
                           'application', case], stdin=subprocess.PIPE, QV_BUILD=harness.BUILD,
                          PYTHONDONTWRITEBYTECODE='1')

    def end_application(self, application):
        code = application.wait()
        check(code == 0, f'the application ended with {code}:\n{application.output()}')
        print(application.output(), end='')


def as_application(case):
    with Device() as device:
        device.start_daemon()
        device.end_application(device.start_application(case))


async def refused(request):
    """The error with which it fails."""
    try:
        await request
    except RecordingError as error:
        check(error.text and str(error) == error.text, f'{error!r} has no text')
        return error
    raise AssertionError('it succeeded')


async def within(awaitable):
    return await asyncio.wait_for(awaitable, PATIENCE)


# In the application --------------------------------------------------------------------------------

async def movie():
    """Errors, a pause, the movie itself, its ways to its application and to the library."""
    async with quorvel.Recorder() as recorder:
        await recorder.did_become_active()
        check((await refused(recorder.stop())).code is ErrorCode.UNKNOWN, 'a stop without a recording')
        check((await refused(recorder.start([], 0, 0))).code is ErrorCode.FAILED_TO_START, 'a size that is none')
        check((await refused(recorder.start([], *SIZE, system=True))).code is ErrorCode.ENTITLEMENTS, 'no right')

        check(await recorder.start([ME], *SIZE) == quorvel.Started(False, False), 'it has a microphone')
        began = time.monotonic()
        check((await recorder.current_state()).recording, 'the state knows of no recording')
        check((await refused(recorder.discard())).code is ErrorCode.UNKNOWN, 'a running recording can be discarded')
        await asyncio.sleep(1)
        await recorder.pause()
        paused = time.monotonic()
        await asyncio.sleep(2)
        await recorder.resume(ME)
        resumed = time.monotonic()
        await asyncio.sleep(1)
        url = await recorder.stop()
        expected = paused - began + time.monotonic() - resumed
        with await recorder.open_movie(url) as file, open(quorvel.file_path(url), 'rb') as original:
            check(file.read() == original.read(), 'another movie is opened')
        movies.check_decodes(quorvel.file_path(url))
        length = movies.duration(quorvel.file_path(url))
        check(abs(length - expected) < 1, f'{length} s are recorded of {expected} s')

        await recorder.save_video_to_camera_roll(url)
        check((await refused(recorder.open_movie(url))).code is ErrorCode.FAILED_TO_SAVE, 'a movie that was saved')
        print(f'{length:.2f} s of movie')


def lies_in_shared_memory(array):
    """Whether the kernel says that it lies in memory that the daemon made."""
    address = array.__array_interface__['data'][0]
    with open('/proc/self/maps') as maps:
        for line in maps:
            first, last = (int(word, 16) for word in line.split()[0].split('-'))
            if first <= address < last:
                return 'memfd:quorvel' in line and line.split()[1].startswith('r--s')
    return False


def number_of(frame, pixels):
    number = Picture(pixels.reshape(-1), frame.width, frame.height, frame.stride, 4).number()
    check(number is not None, 'a picture cannot be read')
    return number


async def take_sounds(sounds):
    count, ends = 0, 0
    async for sample in sounds:
        check(sample.samples.shape == (sample.frame_count, sample.format.channels), sample.format)
        check(sample.presentation_time >= ends - 1, 'sound goes back in time')
        ends, count = sample.presentation_time, count + 1
    return count


async def capture():
    """Numbers and times rise, nothing is copied, what is held stays as it is, and everything is given back."""
    async with quorvel.Recorder() as recorder:
        await recorder.did_become_active()
        descriptors = len(os.listdir('/proc/self/fd'))
        frames, sound = recorder.frames(), asyncio.create_task(take_sounds(recorder.sounds()))
        await asyncio.sleep(0)
        await recorder.start([ME], *SIZE, capture=True)
        first = await within(anext(frames))
        held, held_number = first.pixels, number_of(first, first.pixels)
        check(lies_in_shared_memory(held) and not held.flags.writeable, 'the pixels were copied')
        check(first.rgb().tolist()[0][0] == held[0, 0, 2::-1].tolist(), 'the colours are exchanged')
        last_number, last_time = held_number, first.presentation_time
        del first
        for _ in range(60):
            with await within(anext(frames)) as frame:
                number = number_of(frame, frame.pixels)
                check(number > last_number and frame.presentation_time > last_time, f'{number} after {last_number}')
                last_number, last_time = number, frame.presentation_time
            check(frame.is_released, 'the frame is not given back')
        again = Picture(held.reshape(-1), held.shape[1], held.shape[0], held.strides[0], 4).number()
        check(again == held_number, f'picture {held_number} became {again} while it was held')
        dropped = recorder.dropped_samples
        while recorder.dropped_samples == dropped:  # nobody takes them
            await asyncio.sleep(0.01)
        check(await recorder.stop() is None, 'a capture has a movie')
        rest = [frame async for frame in frames]
        check(len(rest) == 3, f'{len(rest)} frames waited')
        del held, frame, rest, frames
        print(f'{last_number} pictures, {await within(sound)} runs of sound')
        gc.collect()
        check(len(os.listdir('/proc/self/fd')) == descriptors, 'descriptors were kept')


async def broadcasts():
    """What a device without a network can: the extensions, set-ups, what the state shows."""
    async with quorvel.Recorder() as recorder:
        known = await recorder.system_broadcast_extensions()
        check(CLIPS in [extension.bundle_id for extension in known], known)
        early = await refused(recorder.start([ME], *SIZE, broadcast=True))
        check(early.code is ErrorCode.INVALID_BROADCAST_SESSION, f'a broadcast without a set-up: {early.key}')
        configuration = quorvel.BroadcastConfiguration(2, {'AverageBitRate': 2_000_000, 'ProfileLevel': 'none'})
        await recorder.setup_broadcast('com.example.python', CLIPS, configuration,
                                       {'list': [1, 0.5, b'x', {'y': True}]})
        check((await refused(recorder.setup_broadcast('com.example.other', CLIPS))).code is ErrorCode.ENTITLEMENTS, '')
        unknown = await refused(recorder.setup_broadcast('com.example.python', 'com.nobody.x'))
        check(unknown.code is ErrorCode.INVALID_BROADCAST_SESSION, unknown.key)
        await recorder.set_broadcast_url('https://example.com/live')
        await recorder.set_microphone_enabled_persistent(True)
        state = await recorder.current_state()
        expected = quorvel.State(microphone_enabled_persistent=True, broadcast_url='https://example.com/live')
        check(state == expected, state)
        try:
            await recorder.start([-1], *SIZE)
            raise AssertionError('a window below 0 was sent')
        except ValueError:
            pass
        for user_info in ({'x': 2**63}, {1: 'x'}, {'x': object()}):
            try:
                await recorder.setup_broadcast('com.example.python', CLIPS, user_info=user_info)
            except (ValueError, TypeError):
                continue
            raise AssertionError(f'{user_info} was sent')
        check((await recorder.current_broadcast_images()).host_app == b'', 'an icon of nobody')


async def short_movie(recorder):
    await recorder.start([ME], *SIZE)
    store = os.environ['QUORVEL_DEVICE_ROOT'] + '/private/var/mobile/Library/Quorvel'
    while not any(os.stat(os.path.join(store, name)).st_size > 8000 for name in os.listdir(store)):
        await asyncio.sleep(0.01)
    return await recorder.stop()


async def cancellation():
    """A start that nobody awaits any more is taken back, an answer that nobody awaits is closed."""
    async with quorvel.Recorder() as recorder:
        await recorder.did_become_active()
        url = await short_movie(recorder)
        descriptors = len(os.listdir('/proc/self/fd'))
        for request in (recorder.open_movie(url), recorder.start([ME], *SIZE)):
            task = asyncio.create_task(request)
            await asyncio.sleep(0)
            task.cancel()
            check(isinstance((await asyncio.gather(task, return_exceptions=True))[0], asyncio.CancelledError), task)
        print('cancelled')
        await asyncio.to_thread(sys.stdin.readline)
        check(len(os.listdir('/proc/self/fd')) == descriptors, 'a descriptor was kept')
        check(not (await recorder.current_state()).recording, 'it still records')


async def lost_daemon():
    """What is awaited ends at once, and the recorder finds the next daemon."""
    check((await refused(quorvel.StatusReader().device())).code is ErrorCode.CONNECTION_INVALID, 'a daemon is there')
    told, connected = [], asyncio.Event()
    events = quorvel.Events(stopped=lambda error: told.append(error.code), connected=connected.set,
                            interrupted=lambda: told.append('interrupted'))
    async with quorvel.Recorder(events) as recorder:
        recorder.keep_connected(True)
        print('alone')
        await within(connected.wait())
        connected.clear()
        await recorder.start([ME], *SIZE, capture=True)
        frames = recorder.frames()
        pending = asyncio.create_task(refused(recorder.start([ME], *SIZE, microphone=True)))
        print('waiting')
        while [frame async for frame in frames]:
            pass
        code = (await within(pending)).code
        check(code in (ErrorCode.CONNECTION_INTERRUPTED, ErrorCode.CONNECTION_INVALID), code)
        check(told == [ErrorCode.CONNECTION_INTERRUPTED, 'interrupted'], told)
        print('lost')
        await within(connected.wait())
        check(not (await recorder.current_state()).recording, 'the recording goes on')


# Around it -----------------------------------------------------------------------------------------

def run_cancellation():
    with Device(log='notice') as device:
        device.start_daemon()
        application = device.start_application('cancellation')
        application.expect('cancelled')
        wait_until('the second stop', lambda: sum(STOP in line for _, line in device.daemon.lines) == 2)
        wait_until('the movie to go', lambda: not device.movie_files())
        application.say('')
        device.end_application(application)


def run_lost_daemon():
    with Device() as device:
        application = device.start_application('lost_daemon')
        application.expect('alone')
        device.start_daemon()
        application.expect('waiting')
        device.daemon.kill()
        device.end(device.daemon)
        application.expect('lost')
        device.start_daemon()
        device.end_application(application)


async def ask_status():
    async with quorvel.StatusReader() as reader:
        unmet = {entry['condition']: entry.get('code') for entry in await reader.start_conditions('com.nobody')
                 if not entry['met']}
        check(unmet.get('bundle') == ErrorCode.FAILED_TO_START and (await reader.device())['freeBytes'] > 0, unmet)
        check(await reader.recordings() == await reader.movies() == [], 'nothing was recorded yet')


def status():
    """By a process of no bundle: this one."""
    with Device() as device:
        device.start_daemon()
        os.environ['XDG_RUNTIME_DIR'] = device.directory
        asyncio.run(ask_status())


class Stage(stages.Stage):
    def prepare(self):
        self.allow_recordings()


def examples():
    """Both of examples/python, under a display: a still shows what the window drew."""
    from PIL import Image  # pylint: disable=import-outside-toplevel
    with Stage(harness.BUILD, (1024, 600)) as stage:
        python = make_bundle(os.path.join(stage.bundles, 'Python.app'), 'com.example.python', 'Python')
        environment = {'PYTHONPATH': os.path.join(ROOT, 'python'), 'PYTHONDONTWRITEBYTECODE': '1'}
        for program, *arguments in (('stills.py', '2', stage.directory), ('live_view.py', '2')):
            example = stage.start([python, os.path.join(ROOT, 'examples/python', program), *arguments], **environment)
            check(example.wait() == 0, f'{program} said {example.output()}')
            print(example.output(), end='')
        check(int(example.output().split()[0]) > 10, f'{example.output()} are too few')
        stills = [Image.open(os.path.join(stage.directory, f'still-{number}.png')) for number in (1, 2)]
        for still in stills:
            colours = dict((colour, count) for count, colour in still.getcolors(1000))
            check(still.size == (320, 240) and colours.get((255, 192, 64)) == 3600, f'{still} has {colours}')
        check(stills[0].tobytes() != stills[1].tobytes(), 'both stills are one')


def sound_timeline():
    """The sound after a pause overlaps what was given; so much is cut off, and a source's times only grow."""
    form = AudioFormat(1000, 1, 16, 2, False, True, True)
    timeline, second = SoundTimeline(), 1_000_000_000

    def placed(milliseconds, frames, pauses=0, source=AudioSource.APPLICATION):
        sample = AudioSample(source, bytes(2 * frames), form, frames, milliseconds * second // 1000, None)
        there = timeline.place(sample, pauses * second // 1000)
        return there and (sample.presentation_time * 1000 // second, sample.frame_count, len(sample.data))
    check(placed(1000, 100) == (1000, 100, 200), 'the first')
    check(placed(3050, 100, 2000) == (1100, 50, 100), 'half of it overlaps')
    check(placed(3050, 100, 2000, AudioSource.MICROPHONE) == (1050, 100, 200), 'another source')
    check(placed(3060, 50, 2000) is False, 'all of it overlaps')
    check(placed(100, 50, 2000) is False, 'pauses longer than time')


def error_codes():
    """They are the daemon's, all of them."""
    with open(os.path.join(ROOT, 'protocol/RecordingErrors.def')) as file:
        lines = re.findall(r'^QV_RECORDING_ERROR\((-\d+), \w+, (\w+)\)', file.read(), re.M)
    codes = {key: int(code) for code, key in lines}
    check(codes == {code.name: code.value for code in ErrorCode}, 'the codes differ')
    check(RecordingError(-5801).key == 'RECORDING_ERROR_USER_DECLINED', 'the key')


APPLICATION = {case.__name__: case for case in (movie, capture, broadcasts, cancellation, lost_daemon)}

if __name__ == '__main__':
    if 'application' in sys.argv:
        sys.stderr = sys.stdout  # what the test hears
    main({'application': lambda case: asyncio.run(APPLICATION[case]()), 'sound_timeline': sound_timeline,
          'error_codes': error_codes, 'examples': examples, 'status': status,
          'cancellation': run_cancellation, 'lost_daemon': run_lost_daemon,
          **{case: lambda case=case: as_application(case) for case in ('movie', 'capture', 'broadcasts')}})
