"""The servers, the daemon and the game of one run, in a directory of their own."""

import json
import os
import shutil
import subprocess
import tempfile
import time

from processes import Child

SCREEN = (1920, 1080)


class Stage:
    """Xvfb, PulseAudio with a microphone stand-in, and the daemon. Leaving it ends them by their process ids."""

    def __init__(self, source, build):
        self.source, self.build = source, build
        self.children = []

    def __enter__(self):
        self.directory = tempfile.mkdtemp(prefix="quorveld-bench-")
        self.root = os.path.join(self.directory, "root")
        self.movies = os.path.join(self.root, "private/var/mobile/Library/Quorvel")
        try:
            self._prepare_device()
            self._start_display()
            self._start_sound()
            self.start_daemon()
        except BaseException:
            self.__exit__()
            raise
        return self

    def __exit__(self, *_):
        for child in reversed(self.children):
            child.stop()
        shutil.rmtree(self.directory, ignore_errors=True)

    def start(self, arguments, stream="stdout", **more):
        child = Child(arguments, {**self.environment, **more}, stream)
        self.children.append(child)
        return child

    def end(self, child):
        child.stop()
        self.children.remove(child)

    def _prepare_device(self):
        frameworks = os.path.join(self.root, "System/Library/Frameworks")
        os.makedirs(os.path.dirname(self.movies))
        os.makedirs(os.path.join(self.root, "etc/quorvel"))
        shutil.copytree(os.path.join(self.source, "framework/Quorvel.framework"),
                        os.path.join(frameworks, "Quorvel.framework"))
        with open(os.path.join(self.root, "etc/quorvel/device.json"), "w") as file:
            json.dump({"idiom": "television", "audioCaptureDevice": True}, file)
        keep = {name: os.environ[name] for name in ("PATH", "LD_LIBRARY_PATH") if name in os.environ}
        self.environment = {**keep, "LC_ALL": "C.UTF-8", "LANGUAGE": "en", "HOME": self.directory,
                            "XDG_RUNTIME_DIR": self.directory, "NO_AT_BRIDGE": "1",
                            "QUORVEL_DEVICE_ROOT": self.root,
                            "QUORVEL_BUNDLE_PATH": os.path.join(self.build, "examples/game")}

    def _start_display(self):
        # Without a window manager the game's window lies in the corner, where x11grab finds it.
        server = self.start(["Xvfb", "-displayfd", "1", "-screen", "0", f"{SCREEN[0]}x{SCREEN[1]}x24", "-nolisten",
                             "tcp", "-noreset"])
        self.display_server = server.pid
        self.environment["DISPLAY"] = ":" + server.expect("")[1]

    def _start_sound(self):
        socket = os.path.join(self.directory, "pa.sock")
        arguments = ["pulseaudio", "-n", "--daemonize=no", "--exit-idle-time=-1", "--disallow-exit=yes",
                     "--use-pid-file=no"]
        # Without rewinds the sinks render 50 ms ahead, like hardware, not two seconds.
        for module in (f"module-native-protocol-unix socket={socket} auth-anonymous=1",
                       "module-null-sink norewinds=1 sink_name=appout",
                       "module-null-sink norewinds=1 sink_name=micsrc",
                       "module-remap-source master=micsrc.monitor source_name=mic"):
            arguments += ["-L", module]
        self.start(arguments, "stderr", PULSE_RUNTIME_PATH=os.path.join(self.directory, "pulse"))
        self.environment["PULSE_SERVER"] = "unix:" + socket
        deadline = time.monotonic() + 10
        while self.run(["pactl", "info"], check=False).returncode != 0:
            if time.monotonic() > deadline:
                raise RuntimeError("PulseAudio did not start")
            time.sleep(0.05)
        self.run(["pactl", "set-default-sink", "appout"])
        self.run(["pactl", "set-default-source", "mic"])

    def start_daemon(self):
        self.daemon = self.start([os.path.join(self.build, "bin/quorveld")], "stderr")
        if "X11" not in self.daemon.expect("screen, applications and alerts:")[1]:
            raise RuntimeError("the daemon found no X server")
        if "PulseAudio" not in self.daemon.expect("app audio, microphone and sounds:")[1]:
            raise RuntimeError("the daemon found no PulseAudio")
        deadline = time.monotonic() + 10
        while not os.path.exists(os.path.join(self.directory, "com.tarnwick.quorveld")):
            if time.monotonic() > deadline:
                raise RuntimeError("the daemon did not open its service")
            time.sleep(0.02)

    def run(self, arguments, check=True, seconds=60):
        return subprocess.run(arguments, env=self.environment, stdin=subprocess.DEVNULL, capture_output=True, text=True,
                              check=check, timeout=seconds)

    def press(self, *keys):
        """Presses keys one after the other; returns when the last one has been sent."""
        self.run(["xdotool", "key", "--delay", "60", *keys])


class Game:
    """The example application, driven by its keys. Its window gets the focus by itself."""

    def __init__(self, stage, width, height, fps, *options):
        self.stage = stage
        self.size = (width, height)
        program = os.path.join(stage.build, "examples/game/Game.app/bin/quorvel-example-game")
        self.child = stage.start([program, "--size", f"{width}x{height}", "--fps", str(fps), "--microphone", *options])
        stage.run(["xdotool", "search", "--sync", "--onlyvisible", "--name", "Comet Run"], seconds=20)
        time.sleep(0.7)  # it comes to the front, and its sound gets going

    def ask(self, key, request, answer, seconds=30.0):
        """Presses `key`. (when the daemon logged `request`, when the game got the answer, the answer's line)"""
        asked, said = self.stage.daemon.mark(), self.child.mark()
        self.stage.press(key)
        requested, _ = self.stage.daemon.expect(request, asked)
        answered, line = self.child.expect(answer, said, seconds)
        return requested, answered, line

    def start(self):
        return self.ask("r", "QVRecordingManager:startRecordingWindowLayerContextID", "started")

    def stop(self):
        return self.ask("s", "QVRecordingManager: stopRecordingWithHandler", "stopped")

    def quit(self):
        self.stage.end(self.child)
