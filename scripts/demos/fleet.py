"""A fleet: twenty devices of four models record, capture and broadcast, some with what goes wrong in the field. A shipper on
each takes its metrics to one collector, and that into one database. Shippers, collector and database are killed and come
back meanwhile. At the end the database must have every event of every device's files, once. The last line is the picture.

As root it has a full disk, too. All of it lies in directories of its own and is gone at the end.

usage: fleet.py BUILD_DIRECTORY OUTPUT_DIRECTORY
"""
# build: quorveld quorveld-movies quorvel-example-game quorvel-extension-launcher clip-upload
# packages: fleet
import concurrent.futures
import contextlib
import http.server
import os
import sys
import tempfile
import threading
import time
import uuid

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), ".."))
from stage.fleet import Authority, Collector, Database, draw  # noqa: E402
from stage.member import Member, Stranger, Surroundings  # noqa: E402
from stage.movie import free_port  # noqa: E402
from stage.processes import wait_until  # noqa: E402

MODELS = {32784: ("Alder", "640x360"), 32800: ("Birch", "854x480"), 32816: ("Cedar", "1280x720"), 32832: ("Douglas", "1920x1080")}
# What happens on each device between two recordings. The models take turns.
ACTS = (Member.lose_application, Member.broadcast, Member.fill_disk, Member.capture, Member.rotate,
        Member.refuse, Member.lose_extension, Member.lose_application, Member.rotate_unseen, Member.broadcast,
        Member.lose_store, Member.fill_disk, Member.restart_shipper, Member.tear_line, Member.refuse,
        Member.broadcast, Member.capture, Member.record, Member.lose_extension, Member.record)
TORN = ACTS.count(Member.tear_line)
AT_ONCE = 4  # devices that are alive


class Sink(http.server.BaseHTTPRequestHandler):
    """Takes what broadcasts put there."""
    protocol_version = "HTTP/1.1"

    def do_PUT(self):
        self.rfile.read(int(self.headers["Content-Length"]))
        self.send_response(201)
        self.send_header("Content-Length", "0")
        self.end_headers()

    def log_message(self, *_):
        pass


class Tale:
    """What is killed and comes back while the fleet lives, by how far that has come."""

    def __init__(self, fleet, database, collector):
        self.fleet, self.database, self.collector = fleet, database, collector
        self.began = time.monotonic()

    def say(self, text):
        print(f"{time.monotonic() - self.began:6.1f} s  {text}", flush=True)

    def written(self):
        return sum(len(member.lines()) for member in self.fleet)

    def recorded(self):
        return sum(len(member.expected) for member in self.fleet)

    def stored(self):
        row, = self.database.sql("select (select count(*) from quorvel.events) + (select count(*) from quorvel.refused) as n")
        return int(row["n"])

    def wait_for_recordings(self, count, lives):
        """Or until nothing more comes."""
        wait_until(f"{count} recordings", lambda: self.recorded() >= count or all(life.done() for life in lives), step=0.1)

    def absence(self, name, service, begin, end, lives):
        self.wait_for_recordings(begin, lives)
        self.say(f"{name}: process {service.kill()} is killed; {self.written()} events are written")
        before = self.written()
        self.wait_for_recordings(end, lives)
        service.start()
        self.say(f"{name}: back; {self.written() - before} events were written meanwhile")

    def run(self):
        with concurrent.futures.ThreadPoolExecutor(AT_ONCE) as pool:
            lives = [pool.submit(member.live) for member in self.fleet]
            wait_until("the first events in the database", lambda: self.stored() >= 3, step=0.5)
            self.absence("collector", self.collector, 6, 18, lives)
            self.absence("database", self.database, 24, 36, lives)
            for life in lives:
                life.result()
        self.say(f"the fleet is done: {self.recorded()} recordings, {self.written()} lines in its files")
        try:
            wait_until("all events in the database", lambda: self.stored() >= self.written(), seconds=60, step=0.5)
            self.say("the database has as many")
        except AssertionError as error:
            self.say(f"{error}; it has {self.stored()}")


def compare(fleet, database):
    """Every event of the files against the rows of the database. What was found, as lines; whether all is well."""
    good, said = True, []

    def judge(is_good, text):
        nonlocal good
        good = good and is_good
        said.append(("" if is_good else "NOT ") + text)

    for member in fleet:
        found = member.recorded()
        if found != member.expected:
            judge(False, f"as it was made to happen: {member.name} has {found} for {member.expected}")
    judge(good, "as it was made to happen: services and end reasons in the devices' files")
    files = sorted((member.name, uuid.UUID(event["id"]).hex) for member in fleet for event in member.events())
    rows = database.sql("select device, replace(id::text, '-', '') as id, arrivals, service from quorvel.events")
    stored = sorted((row["device"], row["id"]) for row in rows)
    judge(len(set(files)) == len(files), f"unique: the identifiers of {len(files)} events in the files")
    judge(files == stored, f"once each: {len(files)} events in the files, {len(stored)} rows, "
          f"{len(set(files) - set(stored))} missing, {len(stored) - len(set(stored) & set(files))} too many")
    said.extend(f"missing: {identifier} of {name}" for name, identifier in sorted(set(files) - set(stored))[:10])
    again = sum(int(row["arrivals"]) - 1 for row in rows)
    said.append(f"{again} came more than once and were known; "
                f"{sum(row['service'] == 'Filler' for row in rows)} of the events only filled files, for rotations")
    refused = database.sql("select device, reason from quorvel.refused")
    judge(len(refused) == TORN, f"kept apart: {len(refused)} damaged lines of {TORN}")
    return good, said


def show(rows):
    widths = {key: max(len(key), *(len(row[key]) for row in rows)) for key in rows[0]}
    for row in ({key: key for key in widths}, *rows):
        print("  ".join(row[key].rjust(width) for key, width in widths.items()))


def main():
    build, output = map(os.path.abspath, sys.argv[1:])
    output = os.path.join(output, "fleet")
    os.makedirs(output, exist_ok=True)
    with contextlib.ExitStack() as stack:
        scratch = stack.enter_context(tempfile.TemporaryDirectory(prefix="quorveld-fleet-"))
        os.chmod(scratch, 0o711)
        server = stack.enter_context(http.server.ThreadingHTTPServer(("127.0.0.1", 0), Sink))
        threading.Thread(target=server.serve_forever, daemon=True).start()
        stack.callback(server.shutdown)
        database = Database(scratch)
        stack.callback(database.stop)
        database.start()
        database.create({chip: name for chip, (name, _) in MODELS.items()})
        port = free_port()
        authority = Authority(os.path.join(scratch, "authority"))
        collector = Collector(scratch, port, database, authority)
        stack.callback(collector.stop)
        collector.start()
        surroundings = Surroundings(build, port, f"http://127.0.0.1:{server.server_port}/", authority)
        models = list(MODELS.items())
        fleet = []
        for number, act in enumerate(ACTS):
            chip, (_, size) = models[number % len(models)]
            fleet.append(stack.enter_context(Member(surroundings, f"tv-{number:02}", chip, size, act)))
        stranger = stack.enter_context(Stranger(surroundings))
        tale = Tale(fleet, database, collector)
        tale.say(f"{len(fleet)} devices of {len(MODELS)} models run, each with its daemon and its shipper")
        tale.run()
        good, said = compare(fleet, database)
        refusal = stranger.refusal(collector)
        good = good and bool(refusal)
        said.append(f"{'' if refusal else 'NOT '}refused: the sender with a certificate that somebody else signed: {refusal}")
        database.sql("delete from quorvel.events where service = 'Filler'")
        by_model, end_reasons = database.query("by-model.sql"), database.query("end-reasons.sql")
        show(by_model)
        show(end_reasons)
        picture = draw(by_model, end_reasons, output)
    print("\n".join(said))
    print("picture: " + picture)
    sys.exit(0 if good else 1)


main()
