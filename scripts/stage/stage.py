"""The servers, the daemon and the applications of one benchmark or demo, in a directory of their own."""

import json
import os
import shutil
import subprocess
import tempfile
import time

from processes import Child

SCREEN = (1920, 1080)
KEPT = ("PATH", "LD_LIBRARY_PATH", "ASAN_OPTIONS", "LSAN_OPTIONS", "UBSAN_OPTIONS", "TSAN_OPTIONS")
SYSTEM_UI = "com.example.quorvel.system-ui"


class Stage:
    """Xvfb, PulseAudio with a microphone stand-in, and the daemon. Leaving it ends them by their process ids."""

    def __init__(self, source, build, screen=SCREEN):
        self.source, self.build, self.screen = os.path.abspath(source), os.path.abspath(build), screen
        self.children = []

    def __enter__(self):
        self.directory = tempfile.mkdtemp(prefix="quorveld-stage-")
        self.root = os.path.join(self.directory, "root")
        self.movies = os.path.join(self.root, "private/var/mobile/Library/Quorvel")
        try:
            self._prepare_device()
            self.prepare()
            self.start_display()
            self.start_sound()
            self.start_daemon()
        except BaseException:
            self.__exit__()
            raise
        return self

    def prepare(self):
        """What a run adds to the device before the daemon starts."""

    def __exit__(self, *_):
        for child in reversed(self.children):
            child.stop()
        shutil.rmtree(self.directory, ignore_errors=True)

    def start(self, arguments, stream="stdout", stdin=subprocess.DEVNULL, **more):
        child = Child(arguments, {**self.environment, **more}, stream, stdin)
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
        keep = {name: os.environ[name] for name in KEPT if name in os.environ}
        self.environment = {**keep, "LC_ALL": "C.UTF-8", "LANGUAGE": "en", "HOME": self.directory,
                            "XDG_RUNTIME_DIR": self.directory, "NO_AT_BRIDGE": "1",
                            "QUORVEL_DEVICE_ROOT": self.root,
                            "QUORVEL_BUNDLE_PATH": ":".join([os.path.join(self.build, "examples/game"),
                                                             os.path.join(self.build, "examples/system-ui"),
                                                             os.path.join(self.directory, "bundles")])}

    def write(self, name, content):
        """A file of the device."""
        path = os.path.join(self.root, name)
        os.makedirs(os.path.dirname(path), exist_ok=True)
        with open(path, "w") as file:
            json.dump(content, file)

    def allow_recordings(self):
        """An internal build whose alert is switched off: for what is not about consent. Before the daemon."""
        self.write("etc/quorvel/device.json", {"idiom": "television", "internalBuild": True})
        self.write("private/var/mobile/Library/Preferences/com.tarnwick.quorveld.json", {"QVSuppressAlert": True})

    def install(self, name, identifier, program):
        """An application of that bundle identifier; its executable."""
        bundle = os.path.join(self.directory, "bundles", name + ".app")
        executable = os.path.join(bundle, "bin", os.path.basename(program))
        os.makedirs(os.path.dirname(executable))
        shutil.copy2(program, executable)
        with open(os.path.join(bundle, "Info.json"), "w") as file:
            json.dump({"CFBundleIdentifier": identifier, "CFBundleDisplayName": name, "CFBundleName": name}, file)
        return executable

    def allow_system_recordings(self):
        """To the example's system UI."""
        self.write(f"etc/quorvel/entitlements/{SYSTEM_UI}.json", {"com.tarnwick.private.quorvel": True})

    def start_system_ui(self):
        """It takes its commands by `say`."""
        program = os.path.join(self.build, "examples/system-ui/Screen.app/bin/quorvel-example-system-ui")
        child = self.start([program], stdin=subprocess.PIPE)
        child.expect("state recording=")
        return child

    def start_display(self, *number):
        """Anew under the number that it had: after `end(display_server)`."""
        # Without a window manager the game's window lies in the corner, where x11grab finds it.
        server = self.start(["Xvfb", *number, "-displayfd", "1", "-screen", "0", f"{self.screen[0]}x{self.screen[1]}x24",
                             "-nolisten", "tcp", "-noreset"])
        self.display_server = server
        self.environment["DISPLAY"] = ":" + server.expect("")[1]

    def start_sound(self):
        socket = os.path.join(self.directory, "pa.sock")
        arguments = ["pulseaudio", "-n", "--daemonize=no", "--exit-idle-time=-1", "--disallow-exit=yes",
                     "--use-pid-file=no"]
        # Without rewinds the sinks render 50 ms ahead, like hardware, not two seconds.
        for module in (f"module-native-protocol-unix socket={socket} auth-anonymous=1",
                       "module-null-sink norewinds=1 sink_name=appout",
                       "module-null-sink norewinds=1 sink_name=micsrc",
                       "module-remap-source master=micsrc.monitor source_name=mic"):
            arguments += ["-L", module]
        self.sound_server = self.start(arguments, "stderr", PULSE_RUNTIME_PATH=os.path.join(self.directory, "pulse"))
        self.environment["PULSE_SERVER"] = "unix:" + socket
        deadline = time.monotonic() + 10
        while self.run(["pactl", "info"], check=False).returncode != 0:
            if time.monotonic() > deadline:
                raise RuntimeError("PulseAudio did not start")
            time.sleep(0.05)
        self.run(["pactl", "set-default-sink", "appout"])
        self.run(["pactl", "set-default-source", "mic"])

    def start_daemon(self, sound="PulseAudio"):
        self.daemon = self.start([os.path.join(self.build, "bin/quorveld")], "stderr")
        if "X11" not in self.daemon.expect("screen, applications and alerts:")[1]:
            raise RuntimeError("the daemon found no X server")
        self.daemon.expect("app audio, microphone and sounds: " + sound)
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


class Application:
    """The example application under a name, and so a bundle, of its own. It covers the screen."""

    def __init__(self, stage, name, *options):
        self.stage, self.name = stage, name
        game = os.path.join(stage.build, "examples/game/Game.app/bin/quorvel-example-game")
        program = stage.install(name, "com.example." + name.lower(), game)
        width, height = stage.screen
        self.child = stage.start([program, "--title", name, "--size", f"{width}x{height}", *options])
        search = ["xdotool", "search", "--sync", "--onlyvisible", "--name", f"^{name}$"]
        self.window = stage.run(search, seconds=20).stdout.split()[0]

    def bring_to_front(self):
        self.stage.run(["xdotool", "windowraise", self.window, "windowfocus", "--sync", self.window])

    def crash(self):
        self.child.process.kill()
        self.child.process.wait()


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
