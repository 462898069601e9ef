"""quorvelctl against real daemons: what it shows and records, and what it says where something is wrong."""
import fcntl
import json
import os
import pty
import re
import shutil
import struct
import subprocess
import termios
import xml.etree.ElementTree

from harness import BUILD, Device, check, main, wait_until
from stage import device as stages, movie
from stage.processes import PATIENCE

TOOL = os.path.join(BUILD, 'bin/quorvelctl')
FAILED, USAGE, NO_DAEMON, REFUSED, DAEMON_LOST, NOT_WRITABLE = range(1, 7)


class ToolDevice(Device):
    def __init__(self):
        super().__init__()
        self.allow_system_recordings(stages.TOOL)
        self.entitlement = os.path.join(self.root, f'etc/quorvel/entitlements/{stages.TOOL}.json')

    def tool(self, *words, code=0, says='', stdout=subprocess.PIPE):
        """Its standard output; it must end so, and with one line where it fails."""
        done = subprocess.run([TOOL, *words], env=self.environment, stdin=subprocess.DEVNULL, text=True, timeout=PATIENCE,
                              stdout=stdout, stderr=subprocess.PIPE)
        check(done.returncode == code, f'{words} ended with {done.returncode}: {done.stdout} {done.stderr}')
        check(says in done.stderr and done.stderr.count('\n') == (code != 0), f'{words} said {done.stderr}')
        return done.stdout

    def start_tool(self, *words):
        return self.start([TOOL, *words])

    def file(self, name):
        return os.path.join(self.directory, name)

    def faults(self):
        found = json.loads(self.run([TOOL, 'doctor', '--json'], check=False).stdout)['findings']
        check(all(each['advice'] for each in found if each['state'] == 'FAULT'), f'a fault without advice: {found}')
        return {each['check'] for each in found if each['state'] == 'FAULT'}


def wait_for_pictures(device):
    def recording():
        found = json.loads(device.tool('status', '--json'))['recordings']
        return found and found[0].get('pictures', 0) > 10 and found[0]
    return wait_until('pictures', recording)


def records():
    """A recording is seen from elsewhere, ended from elsewhere, and saved where it was wanted."""
    with ToolDevice() as device:
        device.start_daemon()
        watching = device.start_tool('watch')
        watching.expect('nothing is recorded')
        recorder = device.start_tool('record', '-o', device.file('a.mp4'), '--size', '640x360')
        watching.expect('recording 0:0')
        seen = wait_for_pictures(device)
        check(seen['bundleIdentifier'] == stages.TOOL and seen['systemRecording'] and seen['videoEncoder'], seen)
        device.tool('record', code=FAILED, says='quorvelctl stop')
        mark = watching.mark()
        device.tool('stop')
        recorder.expect('saved ')
        check(recorder.wait() == 0, recorder.output())
        movie.check_decodes(device.file('a.mp4'))
        watching.expect('nothing is recorded', mark)
        check(watching.stop() == 0, 'a signal is no failure of watch')
        device.tool('record', '--seconds', '1', '--size', '640x360')
        check(len(os.listdir(os.path.join(device.root, 'private/var/mobile/Media/Movies'))) == 1, 'not in the library')
        check(not device.movie_files(), 'it is still in the store')
        rows = device.tool('metrics').splitlines()
        check(len(rows) == 2 and all('SystemRecording' in row and row.endswith('stopped') for row in rows), rows)
        # Killed in the middle, it leaves a movie that is saved all the same.
        recorder = device.start_tool('record', '-o', device.file('b.mp4'), '--size', '640x360')
        wait_for_pictures(device)
        recorder.kill()
        wait_until('the movie', lambda: os.path.exists(device.file('b.mp4')))
        movie.check_decodes(device.file('b.mp4'))


def outputs():
    """What cannot be written: one line, its code, and no movie is lost."""
    with ToolDevice() as device, open('/dev/full', 'w') as full:
        device.start_daemon()
        device.tool('record', '--seconds', '-1', code=USAGE, says='--seconds')
        device.tool('status', '--seconds', '1', code=USAGE, says='no option')
        device.tool('watch', code=NOT_WRITABLE, says='No space left', stdout=full)
        closed = subprocess.run(['sh', '-c', f'exec {TOOL} status >&-'], env=device.environment, stderr=subprocess.PIPE)
        check(closed.returncode == NOT_WRITABLE, closed)
        device.write(device.file('there.mp4'), 'mine')
        device.tool('record', '-o', device.file('there.mp4'), code=NOT_WRITABLE, says='exists')
        device.tool('record', '-o', device.file('none/a.mp4'), code=NOT_WRITABLE, says='No such file')
        check(not device.movie_files(), 'a recording was begun')
        device.tool('record', '--seconds', '1', '-o', device.file('unseen.mp4'), code=NOT_WRITABLE, stdout=full)
        movie.check_decodes(device.file('unseen.mp4'))
        device.mount_disk(device.file('small'), '4k')
        device.tool('record', '--seconds', '2', '-o', device.file('small/a.mp4'), code=NOT_WRITABLE, says='quorvelctl save')
        check(not os.listdir(device.file('small')), 'a part of a movie is left')
        check('may be saved by ' + stages.TOOL in device.tool('list'), 'the movie is lost')
        device.tool('save', '-o', device.file('late.mp4'))
        movie.check_decodes(device.file('late.mp4'))


def drawn(device, columns):
    """What watch draws on a terminal of that width, in two looks."""
    terminal, end = pty.openpty()
    fcntl.ioctl(end, termios.TIOCSWINSZ, struct.pack('HHHH', 24, columns, 0, 0))
    watching = subprocess.Popen([TOOL, 'watch'], env=device.environment, stdin=end, stdout=end, stderr=end)
    os.close(end)
    text = ''
    while text.count('\r') < 2:
        text += os.read(terminal, 4096).decode()
    watching.terminate()
    check(watching.wait(PATIENCE) == 0, 'watch failed')
    os.close(terminal)
    return [line for line in re.split('\r|\x1b\\[K', text) if line.strip()]


def daemons():
    """None, one that refuses, one that dies."""
    with ToolDevice() as device:
        for verb in ('status', 'watch', 'list', 'record', 'stop', 'save', 'extensions'):
            device.tool(verb, code=NO_DAEMON, says='systemctl start')
        daemon = device.start_daemon()
        os.remove(device.entitlement)
        device.tool('record', code=REFUSED, says='com.tarnwick.private.quorvel')
        device.allow_system_recordings(stages.TOOL)
        recorder = device.start_tool('record', '-o', device.file('lost.mp4'))
        wait_for_pictures(device)
        for line in drawn(device, 20):
            check(len(line) < 20 and line.startswith('recording'), repr(line))
        check(any('dropped' in line for line in drawn(device, 100)), 'a wide terminal is not used')
        watching = device.start_tool('watch')
        watching.expect('recording')
        daemon.kill()
        device.children.remove(daemon)
        check(watching.wait() == DAEMON_LOST and recorder.wait() == DAEMON_LOST, recorder.output())
        check(not os.path.exists(device.file('lost.mp4')), 'a movie that nobody saved')


def dead_daemon(device):
    device.start_daemon().kill()
    device.children.clear()


def daemon_without_the_tool(device):
    own = device.environment['QUORVEL_BUNDLE_PATH']
    device.environment['QUORVEL_BUNDLE_PATH'] = device.bundles
    device.start_daemon()
    device.environment['QUORVEL_BUNDLE_PATH'] = own


def daemon_without_modules(device):
    os.makedirs(device.file('lone/bin'))
    shutil.copy2(os.path.join(BUILD, 'bin/quorveld'), device.file('lone/bin'))
    device.build = device.file('lone')
    device.start_daemon()


# What is broken, how, whether a daemon is started then, and what doctor must name. (There is no display or sound here.)
BROKEN = (
    ('no daemon', lambda device: None, False, {'daemon'}),
    ('a daemon that died', dead_daemon, False, {'daemon'}),
    ('a daemon that does not know the tool', daemon_without_the_tool, False, {'bundle'}),
    ('no module of movies', daemon_without_modules, False, {'encoder'}),
    ('no entitlement', lambda device: os.remove(device.entitlement), True, {'entitlement'}),
    ('an entitlement that all may write', lambda device: os.chmod(device.entitlement, 0o666), True, {'entitlement'}),
    ('an entitlement of somebody else', lambda device: device.write(
        device.entitlement, {'com.tarnwick.private.quorvel': True, 'users': [12345]}), True, {'entitlement'}),
    ('a file where the store should be', lambda device: device.write(device.movies, ''), True, {'store', 'space'}),
    ('a full disk', lambda device: device.mount_disk(device.media, '50m'), True, {'space'}),
    ('no texts', lambda device: shutil.rmtree(device.framework), True, {'texts'}),
    ('a tool without its bundle', lambda device: device.environment.update(QUORVEL_BUNDLE_PATH=device.bundles), True,
     {'recorder', 'bundle'}),
)


def doctor():
    """Each of these set-ups is broken in one place, and doctor names it."""
    for what, breaking, starts, names in BROKEN:
        with ToolDevice() as device:
            breaking(device)
            if starts:
                device.start_daemon()
            expected = names if names == {'daemon'} else names | {'display', 'sound'}
            check(device.faults() == expected, f'{what}: {device.faults()}, not {expected}')


def healthy_device():
    """Nothing is wrong with one that has all; then its display dies, and its sound server."""
    with stages.Stage(BUILD) as stage:
        stage.allow_system_recordings(stages.TOOL)
        done = stage.run([TOOL, 'doctor'], check=False)
        check(done.returncode == 0, done.stdout)
        stage.end(stage.display_server)
        done = stage.run([TOOL, 'doctor'], check=False)
        check(done.returncode == FAILED and 'FAULT  display: X11' in done.stdout, done.stdout)
        stage.end(stage.sound_server)
        wait_until('the fault', lambda: 'FAULT  sound' in stage.run([TOOL, 'doctor'], check=False).stdout)


def recover():
    """What a crash cut off is seen, and mended, without a daemon; with one, what it could not mend is told."""
    def look(*options):
        done = device.run([TOOL, 'recover', '--json', *options], check=False)
        return done.returncode, {each['name']: each for each in json.loads(done.stdout)['movies']}

    with ToolDevice() as device:
        daemon = device.start_daemon()
        device.start_tool('record', '--size', '640x360')
        wait_until('two seconds', lambda: wait_for_pictures(device)['seconds'] > 2)
        daemon.kill()
        device.children.remove(daemon)
        name, = map(os.path.basename, device.movie_files())
        check(look('--look') == (FAILED, {name: {'name': name, 'state': 'unfinished'}}), look('--look'))
        code, movies = look()
        (kept, mended), = movies.items()
        check(code == 0 and mended['state'] == 'mended' and mended['seconds'] > 1, movies)
        movie.check_decodes(os.path.join(device.movies, kept))
        check('recovered' in device.tool('recover'), 'it is not told a second time')
        damaged = 'Chess_recovered_01-01-2026 00-00-00.mp4'
        device.write(os.path.join(device.movies, damaged), 'no movie')
        device.start_daemon()
        code, movies = look()
        check(code == FAILED and movies.keys() == {kept, damaged} and 'error' in movies[damaged], movies)


def plot():
    """The picture's bars are as high as what was measured; what cannot be written leaves the former picture."""
    events = [{'time': 1767268800 + 60 * at, 'serviceName': 'InAppRecording', 'droppedPictures': 10 * at, 'payload': {
        'ActiveDuration': 10, 'VideoFrameCount': 300 * at, 'VideoCaptureRate': 60, 'RecordedFileSize': 4_000_000,
        'EndReason': 0}} for at in (1, 2)]
    with ToolDevice() as device:
        device.write('private/var/mobile/Library/Logs/Quorvel/metrics.jsonl', '\n'.join(map(json.dumps, events)) + '\n{"torn')
        device.tool('metrics', '--plot', device.file('plot.svg'))
        picture = xml.etree.ElementTree.parse(device.file('plot.svg')).getroot()
        bars = [each for each in picture.iter('{http://www.w3.org/2000/svg}rect') if each.get('fill') != '#fff']
        heights = [float(each.get('height')) for each in bars]
        check(len(heights) == 6 and [heights[1] / heights[0], heights[3] / heights[2], heights[5] / heights[4]] == [2, 2, 1],
              f'{heights}')
        device.tool('metrics', '--plot', device.file('none/plot.svg'), code=NOT_WRITABLE, says='No such file')
        device.mount_disk(device.file('small'), '4k')
        device.write(device.file('small/plot.svg'), 'former')
        device.tool('metrics', '--plot', device.file('small/plot.svg'), code=NOT_WRITABLE, says='No space')
        check(os.listdir(device.file('small')) == ['plot.svg'], 'a part of a picture is left')


if __name__ == '__main__':
    main({case.__name__: case for case in (records, outputs, daemons, doctor, healthy_device, recover, plot)})
