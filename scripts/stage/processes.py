"""Child processes whose lines are stamped as they arrive, waits, and what /proc tells of a process."""

import os
import signal
import subprocess
import threading
import time

PATIENCE = 120  # seconds until a wait counts as hanging; nothing is asserted about speed
TICKS_PER_SECOND = os.sysconf("SC_CLK_TCK")


def check(condition, message):
    """An assertion that python -O keeps."""
    if not condition:
        raise AssertionError(message)


def wait_until(what, condition, seconds=PATIENCE, step=0.01):
    """Tries until `condition` gives something true, and returns that."""
    deadline = time.monotonic() + seconds
    while True:
        value = condition()
        if value:
            return value
        check(time.monotonic() < deadline, f"waited in vain for {what}")
        time.sleep(step)


class Child:
    """A process of the stage. `lines` are (CLOCK_MONOTONIC seconds, text).

    Threading: one thread of its own reads the lines; everything else belongs to the caller's thread.
    """

    def __init__(self, arguments, environment, stream="stdout", stdin=subprocess.DEVNULL):
        self.name = os.path.basename(arguments[0])
        pipes = {"stdout": subprocess.DEVNULL, "stderr": subprocess.DEVNULL, stream: subprocess.PIPE}
        self.process = subprocess.Popen(arguments, env=environment, stdin=stdin, text=True, errors="replace",
                                        **pipes)
        self.pid = self.process.pid
        self.lines = []
        self.has_said_all = False
        self.changed = threading.Condition()
        self.reader = threading.Thread(target=self._read, args=(getattr(self.process, stream),), daemon=True)
        self.reader.start()

    def _read(self, pipe):
        for line in pipe:
            now = time.monotonic()
            with self.changed:
                self.lines.append((now, line.rstrip("\n")))
                self.changed.notify_all()
        with self.changed:
            self.has_said_all = True
            self.changed.notify_all()

    def say(self, line):
        """To a child that was started with a pipe as its standard input."""
        self.process.stdin.write(line + "\n")
        self.process.stdin.flush()

    def mark(self):
        """A place in the lines, for `expect` to begin at."""
        with self.changed:
            return len(self.lines)

    def expect(self, text, since=0, seconds=PATIENCE):
        """The first line since `since` that has `text`: (when, line)."""
        deadline = time.monotonic() + seconds
        with self.changed:
            while True:
                for stamped in self.lines[since:]:
                    if text in stamped[1]:
                        return stamped
                left = deadline - time.monotonic()
                check(not self.has_said_all and left > 0, f"{self.name} did not say '{text}', but:\n{self.tail()}")
                self.changed.wait(left)

    def output(self):
        with self.changed:
            return "".join(line + "\n" for _, line in self.lines)

    def tail(self):
        return "\n".join("  " + line for _, line in self.lines[-20:])

    def is_running(self):
        return self.process.poll() is None

    def wait(self, seconds=5 * PATIENCE):
        """Its exit code, when it has ended by itself and all that it said is here."""
        code = self.process.wait(seconds)
        self.reader.join(2)  # a child of its own may keep the pipe
        return code

    def kill(self):
        self.process.kill()
        return self.wait()

    def stop(self, seconds=8):
        if self.is_running():
            self.process.send_signal(signal.SIGTERM)
            try:
                self.process.wait(seconds)
            except subprocess.TimeoutExpired:
                self.process.kill()
        return self.wait()


def processor_seconds(pid):
    """User and system time of the process; of its children nothing."""
    with open(f"/proc/{pid}/stat") as file:
        fields = file.read().rpartition(")")[2].split()
    return (int(fields[11]) + int(fields[12])) / TICKS_PER_SECOND


def _tasks(pid):
    for task in os.listdir(f"/proc/{pid}/task"):
        base = f"/proc/{pid}/task/{task}"
        try:
            with open(f"{base}/comm") as comm, open(f"{base}/schedstat") as schedule, open(f"{base}/status") as status:
                yield int(task), comm.read().strip(), int(schedule.read().split()[0]) / 1e9, status.read()
        except FileNotFoundError:
            continue  # it ended meanwhile


def thread_seconds(pid):
    """{thread id: (name, processor seconds)}"""
    return {task: (name, seconds) for task, name, seconds, _ in _tasks(pid)}


def children(pid):
    """Process ids of the children that live or were not waited for."""
    found = []
    for task in os.listdir(f"/proc/{pid}/task"):
        try:
            with open(f"/proc/{pid}/task/{task}/children") as file:
                found += map(int, file.read().split())
        except FileNotFoundError:
            continue  # the thread ended meanwhile
    return found


def wake_ups(pid):
    """{thread id: how often it went to sleep, so was woken, since it began}"""
    return {task: int(line.split()[1]) for task, _, _, status in _tasks(pid) for line in status.splitlines()
            if line.startswith("voluntary_ctxt_switches")}


def woken_since(before, pid):
    """Of all threads together. The last ones of a thread that ended since are not known."""
    return sum(count - before.get(task, 0) for task, count in wake_ups(pid).items())


def resident_kilobytes(pid):
    """(resident, of it anonymous)"""
    found = {}
    with open(f"/proc/{pid}/status") as file:
        for line in file:
            key, _, value = line.partition(":")
            if key in ("VmRSS", "RssAnon"):
                found[key] = int(value.split()[0])
    return found["VmRSS"], found["RssAnon"]


def shared_memory_files(pid):
    """{inode: permissions} of the memory files that the process maps."""
    found = {}
    with open(f"/proc/{pid}/maps") as file:
        for line in file:
            if "/memfd:" in line:
                fields = line.split(None, 5)
                found[int(fields[4])] = fields[1]
    return found


def extension_processes(stage):
    """Those that run an extension of this device's build."""
    found = []
    for entry in filter(str.isdigit, os.listdir("/proc")):
        try:
            with open(f"/proc/{entry}/environ") as file:
                if "QUORVEL_EXTENSION_REQUESTS=" in file.read() and os.readlink(f"/proc/{entry}/exe").startswith(stage.build):
                    found.append(int(entry))
        except OSError:
            continue
    return found
