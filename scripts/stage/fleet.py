"""What takes the metrics of many devices into one place: a shipper on each, a collector, a database. Each runs with the
configuration of packaging/fleet, in which only paths, ports and names are others, and a device's mark comes every 5 s.
"""
import csv
import glob
import io
import os
import pwd
import shutil
import signal
import subprocess

from stage.device import SOURCE
from stage.processes import Child, check, children, wait_until

CONFIGURATION = os.path.join(SOURCE, "packaging/fleet")
NEW_KEY = ("-newkey", "ec", "-pkeyopt", "ec_paramgen_curve:P-256", "-nodes")
ENVIRONMENT = {"PATH": os.environ["PATH"] + ":/usr/sbin:/sbin", "LC_ALL": "C.UTF-8"}


def configure(name, target, places):
    """A file of packaging/fleet for here."""
    with open(os.path.join(CONFIGURATION, name)) as file:
        text = file.read()
    for there, here in places.items():
        check(there in text, f"{name} has no {there}")
        text = text.replace(there, here)
    with open(target, "w") as file:
        file.write(text)
    return target


class Authority:
    """Signs the certificates of a fleet, by the commands of docs/metrics.md."""

    def __init__(self, directory):
        self.directory = directory
        os.makedirs(directory)
        self._openssl("req", "-x509", *NEW_KEY, "-keyout", "ca.key", "-out", "ca.pem", "-subj", "/CN=fleet")

    def issue(self, name, stem, directory):
        """The key and the certificate of that name, beside the authority's own: ca.pem, STEM.pem, STEM.key."""
        with open(os.path.join(self.directory, "names"), "w") as file:
            file.write(f"subjectAltName=DNS:{name}\nbasicConstraints=critical,CA:FALSE\n")
        self._openssl("req", *NEW_KEY, "-keyout", stem + ".key", "-out", stem + ".csr", "-subj", "/CN=" + name)
        self._openssl("x509", "-req", "-in", stem + ".csr", "-CA", "ca.pem", "-CAkey", "ca.key", "-CAcreateserial", "-extfile",
                      "names", "-out", stem + ".pem")
        os.makedirs(directory, exist_ok=True)
        for file in ("ca.pem", stem + ".pem", stem + ".key"):
            shutil.copy(os.path.join(self.directory, file), directory)

    def _openssl(self, *command):
        subprocess.run(["openssl", *command], check=True, capture_output=True, cwd=self.directory)


class LogService:
    """An rsyslogd with a work directory of its own, which outlives its process. Nothing of the machine's."""

    def __init__(self, directory, configuration, places):
        self.directory, self.child, self.former = directory, None, []
        self.work = os.path.join(directory, "rsyslog")
        self.runtime = os.path.join(directory, "run")
        os.makedirs(self.work)
        self.configuration = configure(configuration, self.work + ".conf", {"/var/spool/rsyslog": self.work, **places})

    def start(self):
        # What its service manager makes anew with each start.
        shutil.rmtree(self.runtime, ignore_errors=True)
        os.makedirs(self.runtime)
        self.former += [self.child] if self.child else []
        self.child = Child(["rsyslogd", "-n", "-i", "NONE", "-f", self.configuration], ENVIRONMENT, "stderr")

    def kill(self):
        self.child.kill()
        return self.child.pid

    def stop(self):
        if self.child:
            self.child.stop(30)

    def complaints(self):
        return "".join(child.output() for child in (*self.former, self.child))


class Shipper(LogService):
    """Of whatever has a directory and a device root below it."""

    def __init__(self, device, name, port, authority):
        authority.issue(name + ".devices.example.com", "device", device.root + "/etc/quorvel/fleet")
        super().__init__(device.directory, "device.conf", {
            "#   global(localHostname=\"living-room-7\")": f"global(localHostname=\"{name}\")",
            "interval=\"1200\"": "interval=\"5\"", "/run/quorvel-shipper": device.directory + "/run",
            "/private/var/": device.root + "/private/var/", "/etc/quorvel/": device.root + "/etc/quorvel/",
            "target=\"collector.example.com\"": "target=\"127.0.0.1\"", "port=\"2514\"": f"port=\"{port}\""})


class Collector(LogService):
    def __init__(self, directory, port, database, authority):
        authority.issue("collector.example.com", "collector", directory + "/certificates")
        super().__init__(directory, "collector.conf", {
            "host=/var/run/postgresql": "host=" + database.sockets, "/etc/quorvel/fleet": directory + "/certificates",
            "port=\"2514\"": f"port=\"{port}\" address=\"127.0.0.1\""})


class Database:
    """A PostgreSQL of our own, without network. It refuses root, and runs as the user of Debian's package then."""

    def __init__(self, directory):
        self.data, self.sockets = (os.path.join(directory, name) for name in ("data", "sockets"))
        self.programs = sorted(glob.glob("/usr/lib/postgresql/*/bin"))[-1]
        self.as_user, self.child = [], None
        login = self.owner = pwd.getpwuid(os.geteuid()).pw_name
        for path in (self.data, self.sockets):
            os.makedirs(path, 0o700)
        if os.geteuid() == 0:
            user = pwd.getpwnam("postgres")
            self.owner = user.pw_name
            self.as_user = ["setpriv", "--reuid=postgres", "--regid=postgres", "--init-groups"]
            for path in (self.data, self.sockets):
                os.chown(path, user.pw_uid, user.pw_gid)
        self.run(["initdb", "-D", self.data, "-U", self.owner, "-A", "peer", "-E", "UTF8", "--locale=C.UTF-8", "--no-sync"])
        with open(os.path.join(self.data, "pg_hba.conf"), "r+") as file:
            rules = file.read()
            file.seek(0)
            file.write("local quorvel quorvel_collector peer map=quorvel\n" + rules)
        with open(os.path.join(self.data, "pg_ident.conf"), "a") as file:
            file.write(f"quorvel {login} quorvel_collector\n")

    def run(self, command, text=None):
        done = subprocess.run([*self.as_user, os.path.join(self.programs, command[0]), *command[1:]], env=ENVIRONMENT,
                              input=text, capture_output=True, text=True, timeout=60, cwd="/")
        check(done.returncode == 0, f"{command[0]} ended with {done.returncode}: {done.stderr}")
        return done.stdout

    def start(self):
        self.child = Child([*self.as_user, os.path.join(self.programs, "postgres"), "-D", self.data, "-k", self.sockets,
                            "-c", "listen_addresses="], {**ENVIRONMENT, "PWD": "/"}, "stderr")
        self.child.expect("ready to accept connections")

    def kill(self):
        """All of it at once, as a loss of power would."""
        victims = [self.child.pid, *children(self.child.pid)]
        for victim in victims:
            os.kill(victim, signal.SIGKILL)
        self.child.wait()
        wait_until("the server's processes to end", lambda: not any(os.path.exists(f"/proc/{pid}") for pid in victims))
        return victims[0]

    def stop(self):
        if self.child and self.child.is_running():
            self.child.process.send_signal(signal.SIGINT)
            self.child.wait(30)

    def sql(self, text, database="quorvel"):
        """The rows, as dictionaries of texts."""
        command = ["psql", "-X", "-q", "--csv", "-v", "ON_ERROR_STOP=1", "-h", self.sockets, "-U", self.owner, "-d", database]
        return list(csv.DictReader(io.StringIO(self.run(command, text))))

    def query(self, name):
        with open(os.path.join(CONFIGURATION, name)) as file:
            return self.sql(file.read())

    def create(self, models):
        self.sql("create database quorvel", "postgres")
        self.query("schema.sql")
        for chip, name in models.items():
            self.sql(f"insert into quorvel.models values ({chip}, '{name}')")


def draw(by_model, end_reasons, directory):
    """The queries' answers as tables, and fleet.png."""
    for name, rows in (("by-model", by_model), ("end-reasons", end_reasons)):
        with open(os.path.join(directory, name + ".csv"), "w", newline="") as file:
            writer = csv.DictWriter(file, rows[0].keys())
            writer.writeheader()
            writer.writerows(rows)
    models = [row["model"] for row in by_model]
    reasons = sorted({int(row["end_reason"]) for row in end_reasons}, reverse=True)
    counts = {(row["model"], int(row["end_reason"])): 0 for row in end_reasons}
    for row in end_reasons:
        counts[row["model"], int(row["end_reason"])] += int(row["recordings"])
    lines = ["$fleet << END", " ".join(["model", "missing", "dropped", *(f'"{reason or "stopped"}"' for reason in reasons)])]
    for row in by_model:
        share = [100 * int(row[key]) / max(int(row["pictures"]) + int(row["missing"]), 1) for key in ("missing", "dropped")]
        lines.append(" ".join([f'"{row["model"]}"', *(f"{value:.3f}" for value in share),
                               *(str(counts.get((row["model"], reason), 0)) for reason in reasons)]))
    lines += ["END", "set terminal pngcairo size 1100,420 font 'sans,10'", "set output 'fleet.png'",
              "set style fill solid 0.85 border -1", "set boxwidth 0.8", "set style data histogram", "set grid ytics",
              "set key autotitle columnhead outside right top", "set multiplot layout 1,2",
              "set title 'Recordings by model and end reason'", "set style histogram rowstacked", "set yrange [0:*<100]",
              f"plot for [i=4:{3 + len(reasons)}] $fleet using i:xtic(1)",
              "set title 'Pictures by model: missing and dropped, % of those asked for'",
              "set style histogram clustered", "set yrange [0:*]",
              "plot for [i=2:3] $fleet using i:xtic(1)", "unset multiplot"]
    check(len(models) > 0, "no model has a recording")
    subprocess.run([shutil.which("gnuplot")], input="\n".join(lines) + "\n", text=True, check=True, cwd=directory, timeout=60)
    return os.path.join(directory, "fleet.png")
