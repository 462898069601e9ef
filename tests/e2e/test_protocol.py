"""Clients on a stock D-Bus library of another language.

A case starts the daemon and runs itself once more, with the interpreter of a bundle, as the client.
"""
import math
import os
import struct
import sys
import urllib.parse

from harness import Device, check, main, wait_until

INVALID_ARGUMENTS = 'org.freedesktop.DBus.Error.InvalidArgs'
NOT_RECORDING = 'com.tarnwick.quorveld.Error.NotRecording'
ENTITLEMENTS = -5810
APP_AUDIO = 2  # the buffer type


def as_client(case):
    with Device() as device:
        device.start_daemon()
        print(device.run_client(os.path.basename(__file__), 'client', case, device.movies), end='')


# In the client -------------------------------------------------------------------------------------

STATE_KEYS = {'isRecording', 'isBroadcasting', 'microphoneEnabled', 'isSystemRecording', 'hasUserConsentForMicrophone',
              'hasUserConsentForCamera', 'microphoneEnabledPersistent'}


def check_state(client, **expected):
    state = client.state()
    check(set(state) == STATE_KEYS, f'the state has {sorted(state)}')
    for key, value in expected.items():
        check(bool(state[key]) == value, f'{key} is {state[key]}')


def longest_run(numbers):
    """Of numbers that rise by one."""
    longest = length = 1
    for former, number in zip(numbers, numbers[1:]):
        length = length + 1 if number == former + 1 else 1
        longest = max(longest, length)
    return longest


def check_frames(frames):
    for frame in frames:
        check((frame.width, frame.height, frame.pixel_format) == (640, 360, 1), vars(frame))
        check(frame.timing_size == 72, f'{frame.timing_size} timing bytes')
        check(frame.number is not None, 'a captured picture cannot be read')
    for former, frame in zip(frames, frames[1:]):
        check(frame.number > former.number, f'picture {frame.number} follows {former.number}')
        check(frame.presentation_time > former.presentation_time, f'picture {frame.number} goes back in time')
    # The flash tells the host time, so it proves that the presentation time is that of the picture.
    for frame in frames:
        phase = frame.presentation_time % 1
        check(frame.shows_flash == (phase * 10 < 1), f'picture {frame.number} at {float(phase)} s: {frame.shows_flash}')


def check_audio(samples, buffer_type):
    samples = [sample for sample in samples if sample.buffer_type == buffer_type]
    check(samples, f'no audio of type {buffer_type}')
    for sample in samples:
        check(len(sample.description) == 40 and len(sample.timing) == 72,
              f'{len(sample.description)} and {len(sample.timing)} bytes describe audio')
        rate, _, _, _, _, bytes_per_frame, channels, bits, _ = struct.unpack('=d8I', sample.description)
        check(rate > 0 and bits == 16 and bytes_per_frame == 2 * channels, f'{rate} Hz, {bits} bits, {bytes_per_frame}')
        check(len(sample.sample) == sample.item_count * bytes_per_frame,
              f'{len(sample.sample)} bytes are {sample.item_count} items')


def capture(client, _movies):
    """State, refusal of a system recording, capture of picture, sound and microphone, stop."""
    check_state(client, isRecording=False)
    check(client.start(system=True, contexts=[]) == ENTITLEMENTS, 'a system recording is not refused')
    check_state(client, isRecording=False)

    check(client.start(capture=True) == 0, 'the capture is refused')
    check_state(client, isRecording=True, isSystemRecording=False)
    received = client.received

    def captured_enough():
        numbers = [frame.number for frame in received.frames]
        return len(numbers) >= 60 and longest_run(numbers) >= 60 and len(received.audio) >= 10
    client.run_until(captured_enough, 'sixty frames that rise by one, and sound')
    check(client.stop() == ('', 0), 'a capture gives a movie or an error')
    check_state(client, isRecording=False)
    check_frames(received.frames)
    check_audio(received.audio, APP_AUDIO)
    check(received.frames[0].number < 16, f'the first picture is {received.frames[0].number}')

    count = len(received.frames)
    client.call('Ping', interface='org.freedesktop.DBus.Peer')
    check(len(received.frames) == count and not received.stops, 'samples or stops come after the stop')
    print(f'captured {count} frames, {len(received.audio)} audio samples')


def movie(client, movies):
    from stage.movie import check_decodes, streams  # pylint: disable=import-outside-toplevel
    check(client.refusal('stopRecordingWithHandler') == NOT_RECORDING, 'a stop without recording')
    check(client.start() == 0, 'the recording is refused')
    check(client.refusal('discardRecordingWithHandler') is not None, 'a running recording can be discarded')

    def recorded_a_second():
        return any(os.stat(os.path.join(movies, name)).st_size > 8000 for name in os.listdir(movies))
    wait_until('the movie to grow', recorded_a_second)
    url, code = client.stop()
    check(code == 0 and url.startswith('file:///'), f'the stop gives "{url}", {code}')
    path = urllib.parse.unquote(urllib.parse.urlparse(url).path)
    check(os.path.realpath(path).startswith(os.path.realpath(movies)), f'the movie is {path}')
    video, audio = streams(path)[:2]
    check((video['codec_name'], video['profile'], video['width'], video['height']) == ('h264', 'High', 640, 360),
          f'the picture is {video["codec_name"]} {video["profile"]}')
    check((audio['codec_name'], audio['profile']) == ('aac', 'LC'), f'the sound is {audio["codec_name"]}')
    check(float(video['duration']) > 0.5 and abs(float(video['duration']) - float(audio['duration'])) < 0.05,
          f'{video["duration"]} s of picture, {audio["duration"]} s of sound')
    check_decodes(path)
    check(os.stat(path).st_mode & 0o777 == 0o600, f'the movie has mode {os.stat(path).st_mode:o}')
    (descriptor,), error = client.call('openMovieAtURL', 's', url)
    with open(descriptor.take(), 'rb') as opened, open(path, 'rb') as file:
        check(not error and opened.read() == file.read(), f'another movie is opened: {dict(error)}')
    check(not client.received.frames and not client.received.audio, 'samples are handed over without capture')

    check(client.refusal('discardRecordingWithHandler') is None, 'the movie cannot be discarded')
    check(not os.path.exists(path), 'the discarded movie is still there')


def bad_input(client, _movies):
    """Each nonsense is refused, and the connection goes on."""
    def still_serves():
        check_state(client, isRecording=False)

    start, arguments = 'startRecordingWindowLayerContextIDs', [os.getpid()]
    for signature, values in (('', ()), ('s', ('x',)), ('au', (arguments,)),
                              ('ai(dd)bbbbbah', (arguments, (640.0, 360.0), *[False] * 5, [])),
                              ('au(ii)bbbbbah', (arguments, (640, 360), *[False] * 5, [])),
                              ('au(dd)bbbbbahs', (arguments, (640.0, 360.0), *[False] * 5, [], 'more'))):
        refusal = client.refusal(start, signature, *values)
        check(refusal == INVALID_ARGUMENTS, f'{signature}: {refusal}')
    for member, signature, *values in (('setMicrophoneEnabled', 's', 'yes'), ('pauseRecording', 'b', True),
                                       ('stopRecordingWithStartClipDuration', 'ii', 1, 1),
                                       ('setupBroadcastWithHostBundleID', 'ssays', 'a', 'a', b'a', 'a')):
        refusal = client.refusal(member, signature, *values)
        check(refusal == INVALID_ARGUMENTS, f'{member}: {refusal}')
    still_serves()

    unknown = 'org.freedesktop.DBus.Error.Unknown'
    check(client.refusal('eraseTheDisk') == unknown + 'Method', 'an unknown member')
    check((client.refusal('pauseRecording', interface='com.example.Other') or '').startswith(unknown), 'an interface')
    still_serves()

    # What acts on a running recording has nothing to act on; what sets a value takes any.
    for member, signature, *values in (('pauseRecording', ''), ('resumeRecordingWithWindowLayerContextID', 'u', 0),
                                       ('updateProcessIDForAudioCaptureWithPID', 'i', -1),
                                       ('reportCameraUsage', 'i', -2 ** 31), ('setMicrophoneEnabled', 'b', True)):
        check(client.refusal(member, signature, *values) is None, f'{member} is refused')
    check(client.refusal('stopRecordingWithStartClipDuration', 'dd', math.nan, 1e300) == NOT_RECORDING, 'a stop')
    still_serves()


def run_client(case, movies):
    from client import Client  # pylint: disable=import-outside-toplevel
    CLIENT_CASES[case](Client(), movies)


CLIENT_CASES = {'capture': capture, 'movie': movie, 'bad_input': bad_input}

if __name__ == '__main__':
    sys.dont_write_bytecode = True
    main({'client': run_client, **{case: lambda case=case: as_client(case) for case in CLIENT_CASES}})
