"""A client of the daemon on nothing but python3-dbus (docs/protocol.md is all it knows)."""
import ctypes
import ctypes.util
import mmap
import os
import signal
import struct
from fractions import Fraction

import dbus
import dbus.connection
import dbus.service
from dbus.mainloop.glib import DBusGMainLoop

from stage.device import SOCKET
from stage.processes import PATIENCE
from stage.testsignal import Picture

PATH = '/com/tarnwick/quorveld'
NAME = 'com.tarnwick.quorveld'
DAEMON = NAME + '.QVDaemonProtocol'
CLIENT = NAME + '.QVClientProtocol'
START_SIGNATURE = 'au(dd)bbbbbah'

# python3-dbus brings the sources of GLib's main loop, but nothing to run it.
glib = ctypes.CDLL(ctypes.util.find_library('glib-2.0'))


def times(timing):
    """Duration, presentation and decode time in seconds, exactly; None where invalid."""
    def seconds(value, timescale, flags, _epoch):
        return Fraction(value, timescale) if flags & 1 else None
    return [seconds(*fields) for fields in struct.iter_unpack('=qiIq', bytes(timing))]


class VideoFrame:
    def __init__(self, sample, timing):
        memory, lease = sample[0].take(), sample[1].take()
        self.width, self.height, self.stride, self.pixel_format = (int(value) for value in sample[2:6])
        self.timing_size = len(timing)
        self.presentation_time = times(timing)[1]
        with mmap.mmap(memory, self.stride * self.height, prot=mmap.PROT_READ) as pixels:
            picture = Picture(pixels, self.width, self.height, self.stride, 4)
            self.number, self.shows_flash = picture.number(), picture.shows_flash()
        os.close(memory)
        os.close(lease)


class AudioSample:
    def __init__(self, sample, description, item_count, buffer_type, timing):
        self.sample, self.description, self.timing = bytes(sample), bytes(description), bytes(timing)
        self.item_count, self.buffer_type = int(item_count), int(buffer_type)


class Receiver(dbus.service.Object):
    """What the daemon calls."""

    def __init__(self, connection):
        super().__init__(connection, PATH)
        self.frames, self.audio, self.stops = [], [], []

    @dbus.service.method(CLIENT, in_signature='(hhuuuu)ay', byte_arrays=True)
    def captureHandlerWithSample(self, sample, timing):
        self.frames.append(VideoFrame(sample, timing))

    @dbus.service.method(CLIENT, in_signature='ayayxxay', byte_arrays=True)
    def captureHandlerWithAudioSample(self, sample, description, item_count, buffer_type, timing):
        self.audio.append(AudioSample(sample, description, item_count, buffer_type, timing))

    @dbus.service.method(CLIENT, in_signature='a{sv}s')
    def stopRecordingWithError(self, error, url):
        self.stops.append((dict(error), str(url)))


class Client:
    def __init__(self):
        self.connection = dbus.connection.Connection(f'unix:path={os.environ["XDG_RUNTIME_DIR"]}/{SOCKET}',
                                                     mainloop=DBusGMainLoop())
        self.received = Receiver(self.connection)

    def call(self, member, signature='', *arguments, interface=DAEMON):
        """The reply's values: none, one, or a tuple."""
        return self.connection.call_blocking(None, PATH, interface, member, signature, arguments, timeout=PATIENCE)

    def refusal(self, member, signature='', *arguments, interface=DAEMON):
        """The name of the D-Bus error with which the call fails."""
        try:
            self.call(member, signature, *arguments, interface=interface)
        except dbus.DBusException as error:
            return error.get_dbus_name()
        return None

    def state(self):
        return {str(key): value for key, value in self.call('synchronousGetCurrentState').items()}

    def start(self, contexts=None, system=False, capture=False):
        """The error's code, 0 for none. A process is its own context on a device without windows."""
        contexts = [os.getpid()] if contexts is None else contexts
        error, _microphone, _camera = self.call('startRecordingWindowLayerContextIDs', START_SIGNATURE, contexts,
                                                (640.0, 360.0), False, False, False, system, capture, [])
        return code_of(error)

    def stop(self):
        """The movie's URL and the error's code."""
        url, error = self.call('stopRecordingWithHandler')
        return str(url), code_of(error)

    def run_until(self, condition, what):
        """Serves the daemon's calls until `condition` holds."""
        def give_up(*_):
            raise AssertionError(f'waited in vain for {what}')
        signal.signal(signal.SIGALRM, give_up)
        signal.alarm(PATIENCE)
        while not condition():
            glib.g_main_context_iteration(None, True)
        signal.alarm(0)


def code_of(error):
    """An error's code after a look at its shape; 0 for none."""
    if not error:
        return 0
    assert error['domain'] == 'com.tarnwick.Quorvel.QVRecordingErrorDomain', error
    assert len(error['userInfo']['localizedDescription']) > 0, error
    return int(error['code'])
