"""One device of a fleet: what happens on it, and what its metrics must show of that."""
import contextlib
import dataclasses
import glob
import json
import os
import shutil
import signal
import subprocess
import time
import uuid

from stage.device import Device
from stage.fleet import Authority, Shipper
from stage.processes import check, extension_processes, wait_until

CLIPS = "com.example.quorvel.game.clips.upload"
METRICS = "private/var/mobile/Library/Logs/Quorvel/metrics.jsonl"
DECLINED, FULL, NOT_SAVED, BROADCAST_LOST = -5801, -5805, -5812, -5808
FILE_SIZE, FILLER = 1 << 20, 7000  # bytes: of a metrics file, and of an event that fills one


@dataclasses.dataclass
class Surroundings:
    """What the devices of a fleet share."""
    build: str
    port: int       # of the collector
    sink: str       # the URL below which broadcasts are put
    authority: Authority


class Member(Device):
    """One device of the fleet, with its shipper, on which `act`, one of the functions below, happens between two recordings.
    `expected` are service and end reason of each event that it should have.
    """

    def __init__(self, surroundings, name, chip, size, act):
        super().__init__(surroundings.build, QUORVEL_HEADLESS_ALERT="decline" if act is Member.refuse else "accept",
                         QUORVEL_LOG="notice")
        self.name, self.size, self.act, self.sink = name, size, act, surroundings.sink
        self.write_device(chipID=chip)
        self.expected, self.has_small_disk = [], False
        self.shipper = Shipper(self, name, surroundings.port, surroundings.authority)

    def begin(self):
        if os.geteuid() == 0 and self.act is Member.fill_disk:
            os.makedirs(self.movies)
            subprocess.run(["mount", "-t", "tmpfs", "-o", "size=160m", "quorveld-fleet", self.movies], check=True)
            self.has_small_disk = True
        self.start_daemon()
        self.shipper.start()

    def release(self):
        self.shipper.stop()
        if self.has_small_disk:
            subprocess.run(["umount", self.movies], check=True)

    # What is in its files

    def lines(self):
        """Of all its files, the oldest first; raw."""
        paths = sorted(glob.glob(os.path.join(self.root, METRICS) + "*"), reverse=True)
        found = []
        for path in paths:
            with contextlib.suppress(FileNotFoundError), open(path, "rb") as file:  # renamed meanwhile
                found += [line for line in file.read().splitlines() if line]
        return found

    def events(self):
        found = []
        for line in self.lines():
            with contextlib.suppress(ValueError):
                found.append(json.loads(line))
        return found

    def recorded(self):
        return [(event["serviceName"], event["payload"]["EndReason"]) for event in self.events()
                if event["serviceName"] != "Filler"]

    def expect(self, service, reason=0):
        """The next event: it is in the file when the end is complete, or soon after."""
        self.expected.append((service, reason))
        wait_until(f"event {len(self.expected)} of {self.name}", lambda: len(self.recorded()) >= len(self.expected), step=0.1)

    # What happens on it

    def start_game(self, *options, script=None, **_):
        return super().start_game(*options, size=self.size, script=script)

    def record(self, script="record 2; stop; discard; quit"):
        if self.act is Member.refuse:
            return self.refuse()
        self.run_game(script)
        self.expect("InAppRecording")

    def refuse(self):
        """What was not begun has no event."""
        said = self.run_game("record 2; stop; quit", code=1)
        check(f"error code={DECLINED} " in said, said)

    def capture(self):
        self.run_game("capture 2; quit")
        self.expect("InAppCapture")

    def start_broadcast(self, script):
        info = {"url": f"{self.sink}{self.name}/", "name": "show", "clipDuration": 1}
        options = [part for key, value in info.items() for part in ("--broadcast-info", f"{key}={value}")]
        return self.start_game("--broadcast", CLIPS, "--clip-duration", "1", *options, script=script)

    def broadcast(self):
        game = self.start_broadcast("record 4; stop; quit")
        check(game.wait() == 0, game.output())
        self.expect("InAppBroadcast")

    def lose_application(self):
        game = self.start_game(script="record 60; stop; quit")
        game.expect("started")
        time.sleep(1.5)  # of recording
        game.kill()
        self.expect("InAppRecording")

    def extensions(self):
        """Of this device; the others use the same build."""
        found = []
        for pid in extension_processes(self):
            with contextlib.suppress(OSError), open(f"/proc/{pid}/environ") as file:
                if self.directory in file.read():
                    found.append(pid)
        check(found, f"{self.name} runs no extension")
        return found

    def lose_extension(self):
        game = self.start_broadcast("record 60; stop; quit")
        game.expect("service")
        victims = self.extensions()
        for number in (signal.SIGSTOP, signal.SIGKILL):  # a clip comes meanwhile, which it does not take
            for victim in victims:
                os.kill(victim, number)
            time.sleep(2)
        game.expect(f"error={BROADCAST_LOST}")
        self.end(game)
        self.expect("InAppBroadcast", BROADCAST_LOST)

    def lose_store(self):
        game = self.start_game(script="record 60; stop; quit")
        game.expect("started")
        wait_until("the movie", self.movie_files)
        shutil.rmtree(self.movies)
        game.expect(f"error={NOT_SAVED}")
        self.end(game)
        self.expect("InAppRecording", NOT_SAVED)

    def fill_disk(self):
        if not self.has_small_disk:
            return self.lose_store()
        game = self.start_game(script="record 60; stop; quit")
        game.expect("started")
        wait_until("the movie", lambda: any(os.path.getsize(path) > 100_000 for path in self.movie_files()))
        ballast = os.path.join(self.movies, "ballast")
        with open(ballast, "wb") as file:
            space = os.fstatvfs(file.fileno())
            os.posix_fallocate(file.fileno(), 0, space.f_bavail * space.f_frsize - 30_000_000)
        game.expect(f"error={FULL}")
        self.end(game)
        os.remove(ballast)
        self.expect("InAppRecording", FULL)

    def fill_metrics(self):
        """Up to the size at which the daemon begins the next file: by events that differ from its own by their identifier and
        their length."""
        path = os.path.join(self.root, METRICS)
        model = next(event for event in self.events() if event["serviceName"] != "Filler")
        size, longest = os.path.getsize(path), FILE_SIZE - 400  # the next event does not fit
        with open(path, "ab", buffering=0) as file:
            while True:
                event = {**model, "id": uuid.uuid4().hex, "serviceName": "Filler", "filler": ""}
                room = longest - size - len(json.dumps(event)) - 1
                if room < 0:
                    return
                event["filler"] = "x" * min(FILLER, room)
                size += file.write(json.dumps(event).encode() + b"\n")

    def rotate(self):
        """The shipper follows a file that is renamed."""
        self.fill_metrics()
        self.record()
        check(os.path.exists(os.path.join(self.root, METRICS + ".1")), "the file was not rotated")
        self.record()

    def rotate_unseen(self):
        """The shipper is killed, and two files come and are renamed before it is back."""
        self.shipper.kill()
        for _ in range(2):
            self.fill_metrics()
            self.record()
        check(os.path.exists(os.path.join(self.root, METRICS + ".2")), "the file was not rotated twice")
        self.shipper.start()

    def restart_shipper(self):
        self.shipper.stop()
        self.record()
        self.shipper.start()

    def tear_line(self):
        """As a loss of power leaves the end of a file; with bytes that are no text."""
        with open(os.path.join(self.root, METRICS), "ab", buffering=0) as file:
            file.write(b'{"batchEvent":true,"ca\xff\xfe\'\\\x00\x00\n')

    def live(self):
        self.record()
        self.act(self)
        self.record("record 1; pause 1; record 1; stop; discard; quit")


class Stranger(Device):
    """Who sends events in a device's name, under a certificate that it has signed itself."""

    def __init__(self, surroundings):
        super().__init__(surroundings.build)
        self.shipper = Shipper(self, "tv-00", surroundings.port, Authority(os.path.join(self.directory, "authority")))
        shutil.copy(os.path.join(surroundings.authority.directory, "ca.pem"), os.path.join(self.root, "etc/quorvel/fleet"))
        self.write(METRICS, '{"id":"' + uuid.uuid4().hex + '"}\n')

    def begin(self):
        self.shipper.start()

    def release(self):
        self.shipper.stop()

    @staticmethod
    def refusal(collector):
        """What the collector said of it; that nothing of it was stored is seen with the events of the others."""
        return next((line for line in collector.complaints().splitlines() if "authentication error" in line), "")
