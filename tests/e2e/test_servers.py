"""System recordings on a real display and sound server, which go away in their midst and come back."""
import time

from harness import BUILD, check, main
from stage import movie
from stage.applications import Application
from stage.device import Stage

MEDIA_SERVICES_FAILED = -5817
TURN = 1.5  # seconds of recording on each side of an event


class Device(Stage):
    def __init__(self):
        super().__init__(BUILD, screen=(640, 360))

    def prepare(self):
        self.allow_system_recordings()


def start(ui):
    mark = ui.mark()
    ui.say('start')
    ui.expect('started microphone', mark)
    time.sleep(TURN)


def stop(ui):
    """The movie, which must be a sound one."""
    mark = ui.mark()
    ui.say('stop')
    line = ui.expect('stopped', mark)[1]
    check('error=0' in line, f'the recording ended badly: {line}')
    path = movie.path_in(line)
    movie.check_decodes(path)
    return path


def loud_tenths(samples, end):
    """How many of the five tenths of a second before `end` have sound: a tone has it in all, silence in none."""
    tenth = movie.RATE // 10
    last = int(end * movie.RATE)
    pieces = [samples[start:start + tenth] for start in range(last - 5 * tenth, last, tenth)]
    return sum(max(map(abs, piece), default=0) > 3000 for piece in pieces)


def ends_with_tone(path):
    samples = movie.sound(path)
    # An encoder fills its last frame up with silence.
    return loud_tenths(samples, len(samples) / movie.RATE - 0.03) == 5


def late_sound_server():
    """A daemon that came before the sound server records its sound once it is there."""
    with Device() as device:
        device.end(device.sound_server)
        device.end(device.daemon)
        device.start_daemon('headless')
        ui = device.start_system_ui()
        device.start_sound()
        Application(device, 'First', '--tone', '440')
        start(ui)
        check(ends_with_tone(stop(ui)), 'no tone from the late server')


def sound_server():
    """While it is gone there is silence; when it is back, and in the next recording, there is sound."""
    with Device() as device:
        ui = device.start_system_ui()
        Application(device, 'First', '--tone', '440')
        start(ui)
        device.end(device.sound_server)
        time.sleep(TURN)
        device.start_sound()
        mark = device.daemon.mark()
        second = Application(device, 'Second', '--tone', '1000')
        device.daemon.expect(f'resuming audio capture for pid: {second.child.pid}', mark)
        time.sleep(TURN)
        recorded = stop(ui)
        samples = movie.sound(recorded)
        check(loud_tenths(samples, TURN * 0.8) == 5, 'no tone before the server went')
        check(loud_tenths(samples, TURN * 1.9) == 0, 'sound from a server that had gone')
        check(ends_with_tone(recorded), 'no tone since the server is back')
        start(ui)
        check(ends_with_tone(stop(ui)), 'no tone in the next recording')


def display_server():
    """The recording ends with its error, what was recorded stays, and the next one works."""
    with Device() as device:
        ui = device.start_system_ui()
        start(ui)
        mark = ui.mark()
        device.end(device.display_server)
        line = ui.expect('ended', mark)[1]
        check(f'error={MEDIA_SERVICES_FAILED}' in line, f'another error: {line}')
        device.daemon.expect('movie finished:')
        kept, = device.movie_files()
        movie.check_decodes(kept)
        device.start_display(device.environment['DISPLAY'])
        start(ui)
        check(movie.frame_times(stop(ui))[-1] > TURN / 2, 'the next recording is too short')


if __name__ == '__main__':
    main({'late_sound_server': late_sound_server, 'sound_server': sound_server, 'display_server': display_server})
