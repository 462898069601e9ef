"""The example application on a stage, under a name of its own, and by its keys."""
import os
import time

from stage.device import GAME


class Application:
    """The example application under a name, and so a bundle, of its own. It covers the screen."""

    def __init__(self, stage, name, *options):
        self.stage, self.name = stage, name
        program = stage.install(name, "com.example." + name.lower(), os.path.join(stage.build, GAME))
        width, height = stage.screen
        self.child = stage.start([program, "--title", name, "--size", f"{width}x{height}", *options])
        self.window = stage.find_window("--name", f"^{name}$")

    def bring_to_front(self):
        self.stage.run(["xdotool", "windowraise", self.window, "windowfocus", "--sync", self.window])

    def crash(self):
        self.child.kill()


class Game:
    """The example application, driven by its keys. Its window gets the focus by itself."""

    def __init__(self, stage, width, height, fps, *options):
        self.stage = stage
        self.size = (width, height)
        self.child = stage.start_game("--fps", str(fps), "--microphone", *options, size=f"{width}x{height}")
        stage.find_window("--name", "Comet Run")
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
