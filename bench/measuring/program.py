"""A program that is run and measured together with every process that it starts."""

import dataclasses
import json
import os
import select
import signal
import subprocess
import sys
import threading
import time

KEEPER = os.path.join(os.path.dirname(os.path.abspath(__file__)), "keeper.py")
SAMPLE_SECONDS = 0.03
SECONDS_TO_END = 60
PAGE = os.sysconf("SC_PAGE_SIZE")


class Failure(Exception):
    """Something that the person who runs the benchmark has to know, as one sentence."""


@dataclasses.dataclass
class Cost:
    """wall and processor in seconds, memory and written in bytes. in_time is False where wall is
    merely a lower bound, because the work was not done at the deadline."""

    wall: float
    processor: float
    memory: int
    written: int
    in_time: bool = True


def process_tree(root):
    """The descendants of a process, without itself. Some may have ended already."""
    found = []
    parents = [root]
    while parents:
        for pid in children_of(parents.pop()):
            found.append(pid)
            parents.append(pid)
    return found


def children_of(pid):
    """Every thread has its own list of the children that it has started."""
    result = []
    try:
        for thread in os.listdir(f"/proc/{pid}/task"):
            with open(f"/proc/{pid}/task/{thread}/children", encoding="ascii") as pids:
                result += [int(child) for child in pids.read().split()]
    except OSError:
        pass  # it has ended
    return result


def is_working(pid):
    """Whether a thread of the process runs, or could if a processor were free."""
    try:
        for thread in os.listdir(f"/proc/{pid}/task"):
            with open(f"/proc/{pid}/task/{thread}/stat", encoding="utf-8") as fields:
                if fields.read().rpartition(")")[2].split()[0] in "RD":
                    return True
    except OSError:
        pass  # it has ended
    return False


def memory_of(pid):
    """Proportional set size in bytes: memory that processes share is counted once among them. Where
    that may not be read, the resident size."""
    try:
        with open(f"/proc/{pid}/smaps_rollup", encoding="ascii") as fields:
            for line in fields:
                if line.startswith("Pss:"):
                    return int(line.split()[1]) * 1024
    except PermissionError:
        try:
            with open(f"/proc/{pid}/statm", encoding="ascii") as fields:
                return int(fields.read().split()[1]) * PAGE
        except OSError:
            pass
    except OSError:
        pass  # it has ended
    return 0


class MemorySampler(threading.Thread):
    """Keeps the greatest sum of what all descendants of a process held at one moment."""

    def __init__(self, root):
        super().__init__(daemon=True)
        self.peak = 0
        self._root = root
        self._ending = threading.Event()

    def run(self):
        while not self._ending.wait(SAMPLE_SECONDS):
            self.peak = max(self.peak, sum(map(memory_of, process_tree(self._root))))

    def end(self):
        self._ending.set()
        self.join()


class Program:
    """A command under measurement. A context manager: leaving it ends every process of it."""

    def __init__(self, command, environment, log):
        """Output of the command goes to the file named log."""
        self._name = command[0]
        reading, writing = os.pipe()
        with open(log, "ab") as output:
            self._start = time.monotonic()
            self._keeper = subprocess.Popen(
                [sys.executable, KEEPER, str(writing), *command], env=environment, stdout=output,
                stderr=output, stdin=subprocess.DEVNULL, pass_fds=[writing])
        os.close(writing)
        self._report = os.fdopen(reading, encoding="ascii")
        self._pid = self._next()["pid"]
        self._sampler = MemorySampler(self._keeper.pid)
        self._sampler.start()

    def __enter__(self):
        return self

    def __exit__(self, *_):
        if self._keeper.poll() is None:
            self._signal(signal.SIGTERM)
        try:
            self._keeper.wait(SECONDS_TO_END)
        except subprocess.TimeoutExpired:
            self._signal(signal.SIGKILL)
            self._keeper.wait()
        self._sampler.end()
        self._report.close()

    def seconds(self):
        """Since the start."""
        return time.monotonic() - self._start

    def running(self):
        """Whether the command itself is."""
        return os.path.exists(f"/proc/{self._pid}/exe") and self._keeper.poll() is None

    def is_working(self):
        """Whether any process of it has something to do at this moment."""
        return any(map(is_working, process_tree(self._keeper.pid)))

    def wait(self, deadline, log):
        """Waits until the command ends by itself; what it has cost. It is ended at the deadline, in
        seconds since the start. Fails unless it succeeds."""
        if not select.select([self._report], [], [], max(0, deadline - self.seconds()))[0]:
            return self.stop(in_time=False)
        ended = self._next()
        if ended["status"] != 0:
            raise Failure(f"{self._name} has ended with status {ended['status']}:\n{tail(log)}")
        return self._cost(ended["time"] - self._start, True)

    def stop(self, in_time=True):
        """Ends the command, whose work is done or was not done in time; what it has cost. The wall
        time is up to this call."""
        wall = self.seconds()
        self._signal(signal.SIGTERM)
        self._next()
        return self._cost(wall, in_time)

    def _cost(self, wall, in_time):
        total = self._next()
        self._sampler.end()
        return Cost(wall, total["processor"], self._sampler.peak, total["written"], in_time)

    def _signal(self, number):
        try:
            os.kill(self._pid, number)
        except ProcessLookupError:
            pass

    def _next(self):
        line = self._report.readline()
        if not line:
            raise Failure("the process that measures has ended")
        return json.loads(line)


def tail(log, lines=10):
    with open(log, encoding="utf-8", errors="replace") as text:
        return "".join(text.readlines()[-lines:]).rstrip()
