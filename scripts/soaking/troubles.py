"""What happens to the world around a daemon: whom it serves and what it stands on is killed, stopped, started again."""
import os
import signal
import time

from stage.device import Stage
from stage.processes import extension_processes

STOPPED = (0.1, 1.5)  # seconds


class Household(Stage):
    """A device with everything that can be taken away."""

    def prepare(self):
        self.allow_recordings()  # consent is another matter

    def start_display(self, *number):
        super().start_display(*number)
        self.start_manager()

    def start_manager(self):
        self.manager = self.start(["openbox", "--sm-disable", "--startup", "echo up"])
        self.manager.expect("up")


def kill(child):
    child.process.kill()


class Troubles:
    """Each is one thing that happens, from a chance with a seed; the world is whole again afterwards."""

    def __init__(self, stage, players, chance):
        self.stage, self.players, self.chance = stage, players, chance
        self.all = (self.client_dies, self.client_stands, self.extension_dies, self.extension_stands, self.display_restarts,
                    self.sound_restarts, self.manager_restarts, self.display_stands, self.sound_stands, self.nothing)

    def happen(self):
        trouble = self.chance.choice(self.all)
        trouble()
        return trouble.__name__

    def pause(self):
        time.sleep(self.chance.uniform(*STOPPED))

    def stand(self, pids):
        for pid in pids:
            os.kill(pid, signal.SIGSTOP)
        self.pause()
        for pid in pids:
            os.kill(pid, signal.SIGCONT)

    def nothing(self):
        self.pause()

    def client_dies(self):
        self.chance.choice(self.players).hurt(signal.SIGKILL)

    def client_stands(self):
        victim = self.chance.choice(self.players)
        victim.hurt(signal.SIGSTOP)
        self.pause()
        victim.hurt(signal.SIGCONT)

    def extension_dies(self):
        for pid in extension_processes(self.stage):
            self.signal_to(pid, signal.SIGKILL)

    def extension_stands(self):
        extensions = extension_processes(self.stage)
        for pid in extensions:
            self.signal_to(pid, signal.SIGSTOP)
        self.pause()
        for pid in extensions:
            self.signal_to(pid, signal.SIGCONT)

    @staticmethod
    def signal_to(pid, number):
        try:
            os.kill(pid, number)
        except ProcessLookupError:
            pass  # it ended by itself

    def hurt_all(self):
        for player in self.players:
            player.was_hurt = True

    def display_restarts(self):
        self.hurt_all()
        for child in (self.stage.display_server, self.stage.manager):
            kill(child)
            self.stage.end(child)
        self.pause()
        self.stage.start_display(self.stage.environment["DISPLAY"])

    def sound_restarts(self):
        kill(self.stage.sound_server)
        self.stage.end(self.stage.sound_server)
        self.pause()
        self.stage.start_sound()

    def manager_restarts(self):
        kill(self.stage.manager)
        self.stage.end(self.stage.manager)
        self.pause()
        self.stage.start_manager()

    def display_stands(self):
        self.stand([self.stage.display_server.pid])

    def sound_stands(self):
        self.stand([self.stage.sound_server.pid])
