"""A device in a directory of its own: its root, its daemon, and the applications on it.

Nothing of the machine is used but the programs, and only what was started here is stopped, by its process id.
"""
import json
import os
import shutil
import socket
import subprocess
import sys
import tempfile

from stage.processes import PATIENCE, Child, check, wait_until

SOURCE = os.path.dirname(os.path.dirname(os.path.dirname(os.path.abspath(__file__))))
SCREEN = (1920, 1080)
KEPT = ("PATH", "LD_LIBRARY_PATH", "ASAN_OPTIONS", "LSAN_OPTIONS", "UBSAN_OPTIONS", "TSAN_OPTIONS")
SOCKET = "com.tarnwick.quorveld"
SYSTEM_UI = "com.example.quorvel.system-ui"
TOOL = "com.tarnwick.quorvelctl"
GAME = "examples/game/Game.app/bin/quorvel-example-game"


class Daemon(Child):
    """One quorveld; its lines are its log."""

    def __init__(self, device):
        super().__init__([os.path.join(device.build, "bin/quorveld")], device.environment, "stderr")
        self.socket_path = os.path.join(device.directory, SOCKET)

    def wait_for_service(self):
        def connects():
            check(self.is_running(), f"the daemon ended with {self.process.returncode}:\n{self.tail()}")
            with socket.socket(socket.AF_UNIX, socket.SOCK_STREAM) as client:
                return client.connect_ex(self.socket_path) == 0
        wait_until("the daemon to serve", connects)

    def end_well(self):
        """As the service manager ends it; it must still have been there."""
        check(self.is_running(), f"the daemon ended by itself with {self.process.returncode}")
        code = self.stop(PATIENCE)
        check(code == 0, f"the daemon ended with {code}")
        self.check_sanitizers()

    def check_sanitizers(self):
        for report in ("Sanitizer:", "runtime error:"):
            check(report not in self.output(), f"a report of a sanitizer:\n{self.output()}")


class Device:
    """A device without display and sound server. A context manager: at its end the daemons that still run are stopped
    and must end well, and the directory goes away.
    """

    def __init__(self, build, **environment):
        self.build = os.path.abspath(build)
        self.children = []
        self.directory = tempfile.mkdtemp(prefix="quorveld-stage-")
        # Extensions of a root daemon are users of their own, and read their bundles below.
        os.chmod(self.directory, 0o755)
        self.root = os.path.join(self.directory, "root")
        self.media = os.path.join(self.root, "private/var/mobile/Library")
        self.movies = os.path.join(self.media, "Quorvel")
        self.framework = os.path.join(self.root, "System/Library/Frameworks/Quorvel.framework")
        self.bundles = os.path.join(self.directory, "bundles")
        os.makedirs(self.media)
        shutil.copytree(os.path.join(SOURCE, "framework/Quorvel.framework"), self.framework)
        self.write_device(audioCaptureDevice=True)
        bundles = [*(os.path.join(self.build, name) for name in ("examples/game", "examples/system-ui", "tools/quorvelctl")),
                   self.bundles]
        self.environment = {**{name: os.environ[name] for name in KEPT if name in os.environ},
                            "LC_ALL": "C.UTF-8", "LANGUAGE": "en", "HOME": self.directory, "TMPDIR": self.directory,
                            "XDG_RUNTIME_DIR": self.directory, "NO_AT_BRIDGE": "1",
                            # Nobody answers there until a sound server is started.
                            "PULSE_SERVER": f"unix:{self.directory}/pa.sock",
                            "QUORVEL_DEVICE_ROOT": self.root, "QUORVEL_BUNDLE_PATH": ":".join(bundles), **environment}

    def __enter__(self):
        try:
            self.begin()
        except BaseException:
            self.__exit__(*sys.exc_info())
            raise
        return self

    def begin(self):
        """What a run starts with."""

    def __exit__(self, kind, *_):
        try:
            for child in self.children:
                if isinstance(child, Daemon) and kind is None:
                    child.end_well()
                elif isinstance(child, Daemon) and issubclass(kind, AssertionError):
                    print(f"--- log of daemon {child.pid}\n{child.output()[-8000:]}", file=sys.stderr)
        finally:
            for child in reversed(self.children):
                child.stop()
            self.release()
            shutil.rmtree(self.directory, ignore_errors=True)

    def release(self):
        """What a run gives back when everything has ended."""

    def start(self, arguments, stream="stdout", stdin=subprocess.DEVNULL, **environment):
        return self.add(Child(arguments, {**self.environment, **environment}, stream, stdin))

    def add(self, child):
        self.children.append(child)
        return child

    def end(self, child):
        """Whatever it has come to: also of a daemon that has crashed."""
        child.stop()
        self.children.remove(child)

    def run(self, arguments, check=True, seconds=60):
        return subprocess.run(arguments, env=self.environment, stdin=subprocess.DEVNULL, capture_output=True, text=True,
                              check=check, timeout=seconds)

    def write(self, name, content):
        """A file of the device: text, bytes, or JSON."""
        path = os.path.join(self.root, name)
        os.makedirs(os.path.dirname(path), exist_ok=True)
        if not isinstance(content, (str, bytes)):
            content = json.dumps(content)
        with open(path, "wb") as file:
            file.write(content.encode() if isinstance(content, str) else content)

    def write_device(self, **description):
        self.write("etc/quorvel/device.json", {"idiom": "television", **description})

    def write_preferences(self, content):
        self.write("private/var/mobile/Library/Preferences/com.tarnwick.quorveld.json", content)

    def allow_recordings(self):
        """An internal build whose alert is switched off: for what is not about consent. Before the daemon."""
        self.write_device(internalBuild=True)
        self.write_preferences({"QVSuppressAlert": True})

    def allow_system_recordings(self, bundle=SYSTEM_UI):
        """To the example's system UI, or to another bundle."""
        self.write(f"etc/quorvel/entitlements/{bundle}.json", {"com.tarnwick.private.quorvel": True})

    def install(self, name, identifier, program):
        """An application of that bundle identifier; its executable."""
        executable = os.path.join(self.bundles, name + ".app", "bin", os.path.basename(program))
        os.makedirs(os.path.dirname(executable))
        shutil.copy2(program, executable)
        self.write(os.path.join(self.bundles, name + ".app", "Info.json"),
                   {"CFBundleIdentifier": identifier, "CFBundleDisplayName": name, "CFBundleName": name})
        return executable

    def start_daemon(self):
        self.daemon = self.add(Daemon(self))
        self.daemon.wait_for_service()
        return self.daemon

    def start_game(self, *options, size="640x360", script=None):
        """The example application, without window and sound where there is no display."""
        where = [] if "DISPLAY" in self.environment else ["--headless", "--no-sound"]
        return self.start([os.path.join(self.build, GAME), *where, "--size", size, *options,
                           *(["--script", script] if script else [])])

    def run_game(self, script, *options, code=0):
        """What the example application said, which must end so."""
        game = self.start_game(*options, script=script)
        found = game.wait()
        check(found == code, f"the game ended with {found}:\n{game.output()}")
        return game.output()

    def movie_files(self):
        if not os.path.isdir(self.movies):
            return []
        return [os.path.join(self.movies, name) for name in sorted(os.listdir(self.movies)) if name.endswith(".mp4")]


class Stage(Device):
    """A device with Xvfb, and a sound server, "PulseAudio" or "PipeWire", with a microphone stand-in."""

    def __init__(self, build, screen=SCREEN, sound="PulseAudio"):
        super().__init__(build)
        self.screen = screen
        self.sound = sound

    def begin(self):
        self.prepare()
        self.start_display()
        self.start_sound()
        self.start_daemon()

    def prepare(self):
        """What a run adds to the device before the daemon starts."""

    def start_display(self, *number):
        """Anew under the number that it had: after `end(display_server)`."""
        # Without a window manager the game's window lies in the corner, where x11grab finds it.
        server = self.start(["Xvfb", *number, "-displayfd", "1", "-screen", "0", f"{self.screen[0]}x{self.screen[1]}x24",
                             "-nolisten", "tcp", "-noreset"])
        self.display_server = server
        self.environment["DISPLAY"] = ":" + server.expect("")[1]

    def start_sound(self):
        if self.sound == "PipeWire":
            program = os.path.join(SOURCE, "scripts/stage/pipewire")
            self.sound_server = self.start([program, self.directory, f"{self.directory}/pa.sock"])
            self.sound_server.expect("ready")
        else:
            self.start_pulseaudio()

    def start_pulseaudio(self):
        arguments = ["pulseaudio", "-n", "--daemonize=no", "--exit-idle-time=-1", "--disallow-exit=yes",
                     "--use-pid-file=no"]
        # Without rewinds the sinks render 50 ms ahead, like hardware, not two seconds.
        for module in (f"module-native-protocol-unix socket={self.directory}/pa.sock auth-anonymous=1",
                       "module-null-sink norewinds=1 sink_name=appout",
                       "module-null-sink norewinds=1 sink_name=micsrc",
                       "module-remap-source master=micsrc.monitor source_name=mic"):
            arguments += ["-L", module]
        self.sound_server = self.start(arguments, "stderr", PULSE_RUNTIME_PATH=os.path.join(self.directory, "pulse"))
        wait_until("PulseAudio", lambda: self.run(["pactl", "info"], check=False).returncode == 0, step=0.05)
        self.run(["pactl", "set-default-sink", "appout"])
        self.run(["pactl", "set-default-source", "mic"])

    def start_daemon(self, sound="PulseAudio"):
        super().start_daemon()
        check("X11" in self.daemon.expect("screen, applications and alerts:")[1], "the daemon found no X server")
        self.daemon.expect("app audio, microphone and sounds: " + sound)

    def start_system_ui(self):
        """It takes its commands by `say`."""
        program = os.path.join(self.build, "examples/system-ui/Screen.app/bin/quorvel-example-system-ui")
        child = self.start([program], stdin=subprocess.PIPE)
        child.expect("state recording=")
        return child

    def press(self, *keys):
        """Presses keys one after the other; returns when the last one has been sent."""
        self.run(["xdotool", "key", "--delay", "60", *keys])

    def find_window(self, *search):
        return self.run(["xdotool", "search", "--sync", "--onlyvisible", *search]).stdout.split()[0]
