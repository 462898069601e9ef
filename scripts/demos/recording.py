"""The demo of a recording: starts a display, a window manager and a sound server where there are none,
the daemon and the example application; answers the consent alert by key press; records 4 s, pauses 2 s,
records 4 s; prints what became of it.

usage: recording.py BUILD_DIRECTORY OUTPUT_DIRECTORY
"""
# build: quorveld quorveld-movies quorvel-example-game
import json
import math
import os
import subprocess
import sys

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), ".."))
from stage.device import Stage  # noqa: E402
from stage.movie import beeps, flashes, report, run  # noqa: E402
from stage.processes import wait_until  # noqa: E402

# A flash needs a few pictures and its beep a few milliseconds to be found; and a resume may come amid a flash.
CUT_MARGIN = 0.05


def answers(*command):
    return subprocess.run(command, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL, timeout=20).returncode == 0


class Demo(Stage):
    """On the display and the sound server of whoever watches, where there are some."""

    def start_display(self):
        if os.environ.get("DISPLAY") and answers("xdotool", "getdisplaygeometry"):
            self.environment.update({name: os.environ[name] for name in ("DISPLAY", "XAUTHORITY") if name in os.environ})
            return
        super().start_display()
        # What openbox is sent while it comes up may wait long. The command runs when it is up.
        self.start(["openbox", "--sm-disable", "--startup", "echo up"]).expect("up")
        print(f"display: Xvfb {self.environment['DISPLAY']} with openbox")

    def start_sound(self):
        if answers("pactl", "info"):
            server = subprocess.run(["pactl", "info"], capture_output=True, text=True, check=True, timeout=20).stdout
            self.environment["PULSE_SERVER"] = server.split("Server String: ")[1].split("\n")[0]
            return
        super().start_sound()
        print(f"sound: {self.sound} with a null output")


def answer_alert(stage):
    window = stage.find_window("--class", "zenity")
    title = stage.run(["xdotool", "getwindowname", window]).stdout.strip()
    print(f"alert: {title}")
    wait_until("the alert's keyboard focus", lambda: stage.run(
        ["xdotool", "getwindowfocus", "getwindowname"], check=False).stdout.strip() == title)
    # The refusing button has the keyboard; the one that records is next to it.
    stage.press("Right", "Return")


def run_application(stage, output):
    """The movie, of which the application has kept a copy."""
    os.makedirs(output, exist_ok=True)
    kept = os.path.join(output, "Comet Run.mp4")
    game = stage.start_game("--start", "--keep", kept, size="1280x720",
                            script="record 4; pause 2; record 4; stop; quit")
    answer_alert(stage)
    line, count = "", 0
    while not line.startswith(("kept", "error")):
        _, line = game.expect("", count)
        print("application: " + line)
        count += 1
    if game.wait() != 0 or not line.startswith("kept"):
        sys.exit("demo: the application got no movie")
    return kept


def is_good(movie):
    information = json.loads(run(["ffprobe", "-v", "error", "-of", "json", "-show_streams", "-show_format", movie]))
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


def main(demo):
    build, output = sys.argv[1:]
    with demo(build) as stage:
        movie = run_application(stage, output)
    report(movie, is_good(movie))


if __name__ == "__main__":
    main(Demo)
