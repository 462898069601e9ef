"""Applications that record, pause, save and broadcast, each started again when it has ended; and what became of it."""
import os
import signal
import subprocess
import threading
import time
from http.server import BaseHTTPRequestHandler, ThreadingHTTPServer

from stage.device import GAME
from stage.movie import check_decodes, path_in

HANGING = 90  # seconds; no plan takes fifteen
LIBRARY = "private/var/mobile/Media/Movies"
CLIPS = "com.example.quorvel.game.clips.upload"
PLANS = ("record 2; stop; quit",
         "record 1; pause 0.5; record 1; stop; quit",
         "record 1; stop; save; quit",
         "record 1; pause 0.3; stop; save; quit",
         "record 1; stop; discard; quit",
         "record 0.2; stop; record 1; stop; quit",
         "capture 1; quit")


class ClipServer:
    """Takes what is put. Threading: its own threads; nothing of it is shared."""

    class Handler(BaseHTTPRequestHandler):
        def do_PUT(self):
            left = int(self.headers.get("Content-Length") or 0)
            while left > 0 and (part := self.rfile.read(min(left, 1 << 16))):
                left -= len(part)
            self.send_response(201)
            self.send_header("Content-Length", "0")
            self.end_headers()

        def log_message(self, *_):
            pass

    def __init__(self):
        self.server = ThreadingHTTPServer(("127.0.0.1", 0), self.Handler)
        self.server.daemon_threads = True
        self.url = f"http://127.0.0.1:{self.server.server_port}/clips/"
        threading.Thread(target=self.server.serve_forever, daemon=True).start()


class Movies:
    """What was made, and what of it is not as it should be."""

    def __init__(self, stage):
        self.stage = stage
        self.made = self.told_saved = self.found_saved = 0
        self.broken, self.lost = [], []

    def judge(self, path, teller):
        self.made += 1
        if not os.path.isfile(path):
            self.lost.append(f"{path}, of {teller}")
        else:
            self.judge_file(path)

    def judge_file(self, path):
        try:
            check_decodes(path)
        except (AssertionError, KeyError, ValueError, subprocess.SubprocessError) as error:
            self.broken.append(f"{path}: {error}")

    def judge_library(self):
        """Each of it once."""
        library = os.path.join(self.stage.root, LIBRARY)
        for directory, _, names in os.walk(library):
            for name in names:
                path = os.path.join(directory, name)
                if name.endswith(".mp4"):
                    self.found_saved += 1
                    self.judge_file(path)
                    os.remove(path)


class Player:
    """One application, under a bundle of its own."""

    def __init__(self, stage, movies, name, program, broadcasts_to=None):
        self.stage, self.movies, self.name, self.program = stage, movies, name, program
        self.server = broadcasts_to
        self.child = None
        self.rounds = self.recorded = 0
        self.was_hurt = False
        self.hung = []

    def begin(self, chance):
        self.rounds += 1
        self.was_hurt = False
        self.began = time.monotonic()
        options = ["--title", self.name, "--size", "640x360"]
        self.plan = chance.choice(PLANS)
        if self.server and chance.random() < 0.5:
            self.plan = "record 3; stop; wait 1; quit"
            options += ["--broadcast", CLIPS, "--clip-duration", "1", "--broadcast-info", f"url={self.server.url}",
                        "--broadcast-info", "name=soak"]
        self.child = self.stage.start([self.program, *options, "--script", self.plan])

    def step(self):
        """Looks after it: judges what it made when it has ended. Whether it can be started again."""
        if self.child is None:
            return True
        if self.child.is_running():
            if time.monotonic() - self.began > HANGING:
                self.hung.append(f"{self.name} with '{self.plan}':\n{self.child.tail()}")
                self.end()
            return False
        self.judge()
        self.forget()
        return True

    def judge(self):
        """What it was told stays true: it is not started again before."""
        self.child.wait()
        lines = [line for _, line in self.child.lines]
        self.recorded += sum(line.startswith("started") for line in lines)
        urls = [path_in(line) for line in lines if line.startswith("stopped url=")]
        saved = sum(line == "saved" for line in lines)
        self.movies.told_saved += saved
        self.movies.made += saved
        # A second recording replaces what the first one left.
        if urls and urls[-1] and not saved and "discard" not in self.plan and not self.was_hurt:
            self.movies.judge(urls[-1], f"{self.name} with '{self.plan}'")

    def forget(self):
        self.stage.end(self.child)
        self.child = None

    def hurt(self, number):
        self.was_hurt = True
        if self.child and self.child.is_running():
            self.child.process.send_signal(number)

    def end(self):
        if self.child:
            self.hurt(signal.SIGKILL)
            self.forget()


class Turns:
    """Who begins when: whoever begins comes to the front, and takes the recorder from the one before, sometimes soon."""

    GAPS = (0.5, 5)  # seconds

    def __init__(self, players, chance):
        self.players, self.chance = players, chance
        self.next = 0.0

    def step(self):
        ready = [player for player in self.players if player.step()]
        if ready and time.monotonic() >= self.next:
            self.chance.choice(ready).begin(self.chance)
            self.next = time.monotonic() + self.chance.uniform(*self.GAPS)


def cast(stage, movies, server):
    """Three applications; one of them also broadcasts."""
    game = os.path.join(stage.build, GAME)
    players = [Player(stage, movies, name, stage.install(name, "com.example." + name.lower(), game))
               for name in ("Alder", "Birch")]
    return [*players, Player(stage, movies, "Comet Run", game, server)]
