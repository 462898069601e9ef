"""The demo of a recording: starts a display, a window manager and a sound server where there are none,
the daemon and the example application; answers the consent alert by key press; records 4 s, pauses 2 s,
records 4 s; prints what became of it.

usage: recording.py BUILD_DIRECTORY OUTPUT_DIRECTORY
"""
# build: quorveld quorveld-movies quorvel-example-game
import atexit
import json
import math
import os
import shutil
import subprocess
import sys
import tempfile
import time
import urllib.parse

ROOT = os.path.dirname(os.path.dirname(os.path.dirname(os.path.abspath(__file__))))
sys.path.insert(0, os.path.join(ROOT, "scripts/stage"))
from testsignal import beeps, flashes  # noqa: E402

# A flash needs a few pictures and its beep a few milliseconds to be found; and a resume may come amid a flash.
CUT_MARGIN = 0.05
started = []


def start(arguments, **options):
    process = subprocess.Popen(arguments, stdin=subprocess.DEVNULL, **options)
    started.append(process)
    return process


def stop_everything():
    for process in reversed(started):
        if process.poll() is None:
            process.terminate()
    for process in reversed(started):
        try:
            process.wait(timeout=5)
        except subprocess.TimeoutExpired:
            process.kill()
            process.wait()


def quiet(arguments, **options):
    return subprocess.run(arguments, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL, timeout=20, **options).returncode == 0


def wait_until(what, check, seconds=20):
    deadline = time.monotonic() + seconds
    while time.monotonic() < deadline:
        if check():
            return
        time.sleep(0.05)
    sys.exit(f"demo: {what} did not come up")


def ensure_display(directory):
    if os.environ.get("DISPLAY") and quiet(["xdotool", "getdisplaygeometry"]):
        return
    read_end, write_end = os.pipe()
    log = open(os.path.join(directory, "xvfb.log"), "w")
    start(["Xvfb", "-displayfd", str(write_end), "-screen", "0", "1920x1080x24", "-nolisten", "tcp", "-noreset"],
          pass_fds=[write_end], stdout=log, stderr=log)
    os.close(write_end)
    with os.fdopen(read_end) as pipe:
        number = pipe.readline().strip()
    if not number:
        sys.exit("demo: Xvfb did not start")
    os.environ["DISPLAY"] = ":" + number
    # What openbox is sent while it comes up may wait long. The command runs when it is up.
    manager = start(["openbox", "--sm-disable", "--startup", "echo up"], stdout=subprocess.PIPE, stderr=log)
    if not any(line == b"up\n" for line in manager.stdout):
        sys.exit("demo: the window manager did not come up")
    print(f"display: Xvfb {os.environ['DISPLAY']} with openbox")


def ensure_sound(directory):
    if quiet(["pactl", "info"]):
        return
    socket = os.path.join(directory, "pulse.sock")
    log = open(os.path.join(directory, "pulseaudio.log"), "w")
    environment = dict(os.environ, HOME=directory, PULSE_RUNTIME_PATH=os.path.join(directory, "pulse"))
    start(["pulseaudio", "-n", "--daemonize=no", "--exit-idle-time=-1", "--disallow-exit=yes", "--use-pid-file=no",
           "-L", f"module-native-protocol-unix socket={socket} auth-anonymous=1",
           "-L", "module-null-sink norewinds=1 sink_name=out"], env=environment, stdout=log, stderr=log)
    os.environ["PULSE_SERVER"] = "unix:" + socket
    wait_until("the sound server", lambda: quiet(["pactl", "info"]))
    print("sound: PulseAudio with a null output")


def start_daemon(build, directory):
    root = os.path.join(directory, "root")
    os.makedirs(os.path.join(root, "private/var/mobile/Library"))
    frameworks = os.path.join(root, "System/Library/Frameworks")
    os.makedirs(frameworks)
    source = os.path.join(ROOT, "framework")
    shutil.copytree(os.path.join(source, "Quorvel.framework"), os.path.join(frameworks, "Quorvel.framework"))
    os.environ.update(QUORVEL_DEVICE_ROOT=root, XDG_RUNTIME_DIR=directory,
                      QUORVEL_BUNDLE_PATH=os.path.join(build, "examples/game"), LANGUAGE="en", LC_ALL="C.UTF-8")
    log = open(os.path.join(directory, "daemon.log"), "w")
    start([os.path.join(build, "bin/quorveld")], stdout=log, stderr=log)
    wait_until("the daemon", lambda: os.path.exists(os.path.join(directory, "com.tarnwick.quorveld")))


def answer_alert():
    search = subprocess.run(["xdotool", "search", "--sync", "--onlyvisible", "--class", "zenity"],
                            capture_output=True, text=True, timeout=30)
    window = search.stdout.split()[-1]
    title = subprocess.run(["xdotool", "getwindowname", window], capture_output=True, text=True, timeout=10).stdout.strip()
    print(f"alert: {title}")
    wait_until("the alert's keyboard focus", lambda: subprocess.run(
        ["xdotool", "getwindowfocus", "getwindowname"], capture_output=True, text=True).stdout.strip() == title)
    # The refusing button has the keyboard; the one that records is next to it.
    subprocess.run(["xdotool", "key", "--delay", "100", "Right", "Return"], check=True, timeout=10)


def run_application(build):
    game = os.path.join(build, "examples/game/Game.app/bin/quorvel-example-game")
    process = start([game, "--size", "1280x720", "--start", "--script", "record 4; pause 2; record 4; stop; quit"],
                    stdout=subprocess.PIPE, text=True)
    answer_alert()
    url = None
    for line in process.stdout:
        print("application: " + line.strip())
        if line.startswith("stopped"):
            url = line.split("url=")[1].split()[0]
    if process.wait(timeout=30) != 0 or not url:
        sys.exit("demo: the application got no movie")
    return urllib.parse.unquote(urllib.parse.urlparse(url).path)


def probe(movie):
    return json.loads(subprocess.run(
        ["ffprobe", "-v", "error", "-of", "json", "-show_streams", "-show_format", movie],
        capture_output=True, text=True, check=True, timeout=60).stdout)


def report(movie):
    information = probe(movie)
    for stream in information["streams"]:
        size = f" {stream['width']}x{stream['height']}" if stream["codec_type"] == "video" else ""
        print(f"stream {stream['index']}: {stream['codec_name']} {stream.get('profile', '')}{size}, "
              f"{float(stream['duration']):.3f} s")
    duration = float(information["format"]["duration"])
    frame = 1 / 60
    within = "within" if abs(duration - 8) <= 2 * frame else "NOT within"
    print(f"size: {information['format']['size']} bytes; duration: {duration:.3f} s, {within} two frames of 8 s")
    beep_times = beeps(movie)
    worst = {"before": None, "after": None}
    for flash in flashes(movie):
        if abs(flash - 4) < CUT_MARGIN or flash > duration - CUT_MARGIN:
            print(f"flash at {flash:.3f} s, at a cut: not measured")
            continue
        distance = min((beep - flash for beep in beep_times), key=abs, default=math.inf)
        side = "before" if flash < 4 else "after"
        print(f"flash at {flash:.3f} s, beep {distance * 1000:+.1f} ms ({side} the pause)")
        worst[side] = max(worst[side] or 0, abs(distance) * 1000)
    good = within == "within"
    for side, distance in worst.items():
        ok = distance is not None and distance < 40
        good = good and ok
        text = "no flash" if distance is None else f"{distance:.1f} ms"
        print(f"flash to beep {side} the pause: at most {text} ({'under' if ok else 'NOT under'} 40 ms)")
    return good


def main():
    build, output = sys.argv[1:]
    directory = tempfile.mkdtemp(prefix="quorvel-demo-")
    atexit.register(shutil.rmtree, directory, True)
    atexit.register(stop_everything)
    ensure_display(directory)
    ensure_sound(directory)
    start_daemon(build, directory)
    recorded = run_application(build)
    os.makedirs(output, exist_ok=True)
    movie = os.path.join(output, os.path.basename(recorded))
    shutil.copyfile(recorded, movie)
    good = report(movie)
    print("movie: " + movie)
    sys.stdout.flush()
    sys.exit(0 if good else 1)


main()
