"""Child processes whose lines are stamped as they arrive, and what /proc tells of a process."""

import os
import signal
import subprocess
import threading
import time

TICKS_PER_SECOND = os.sysconf("SC_CLK_TCK")


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
        self.ended = False
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
            self.ended = True
            self.changed.notify_all()

    def say(self, line):
        """To a child that was started with a pipe as its standard input."""
        self.process.stdin.write(line + "\n")
        self.process.stdin.flush()

    def mark(self):
        """A place in the lines, for `expect` to begin at."""
        with self.changed:
            return len(self.lines)

    def expect(self, text, since=0, seconds=20.0):
        """The first line since `since` that has `text`: (when, line)."""
        deadline = time.monotonic() + seconds
        with self.changed:
            while True:
                for stamped in self.lines[since:]:
                    if text in stamped[1]:
                        return stamped
                left = deadline - time.monotonic()
                if self.ended or left <= 0:
                    tail = "\n  ".join(line for _, line in self.lines[-20:])
                    raise RuntimeError(f"{self.name} did not say '{text}'; its last lines:\n  {tail}")
                self.changed.wait(left)

    def stop(self):
        if self.process.poll() is None:
            self.process.send_signal(signal.SIGTERM)
            try:
                self.process.wait(8)
            except subprocess.TimeoutExpired:
                self.process.kill()
        self.process.wait()
        self.reader.join(2)


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
