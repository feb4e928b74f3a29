"""What all programs that are compared have in common."""

import dataclasses
import functools
import subprocess
import time

from measuring.place import bytes_on_disk, private_environment
from measuring.program import Cost, Failure, Program

# Idle for so long means done: some programs rest for a moment between two stages.
SETTLED_SECONDS = 4.0
POLL_SECONDS = 0.1


@dataclasses.dataclass
class Outcome:
    """index is in bytes, found is the number of files that the word is found in."""

    cost: Cost
    index: int
    found: int


class Peer:
    """One program. name, title, variant and packages are of the class; an object is one index of its own
    below a place, which nothing else uses."""

    name = title = variant = ""
    packages = ()

    def __init__(self, place, corpus, deadline):
        self.place = place
        self.corpus = corpus
        self.deadline = deadline
        self.environment = private_environment(place)
        self.log = place.file("log")

    def set_up(self):
        """Writes the settings. Nothing is measured yet."""

    def bring_up_to_date(self, word):
        """Runs the program until its index agrees with the files. Returns an Outcome."""
        raise NotImplementedError

    def index_directory(self):
        raise NotImplementedError

    @classmethod
    def label(cls):
        """What the program is called in a table."""
        return f"{cls.title} {cls.version()}" + (", " + cls.variant if cls.variant else "")

    @classmethod
    def version(cls):
        """Of the Debian package, without its revision."""
        text = subprocess.run(["dpkg-query", "-W", "-f=${Version}", cls.packages[0]], check=False,
                              capture_output=True, text=True).stdout
        return text.split(":")[-1].split("-")[0]

    def start(self, command):
        return Program(_without_network(command), self.environment, self.log)

    def ask(self, *command):
        """Output of a command that is not measured; empty where it fails."""
        return subprocess.run(command, env=self.environment, check=False, capture_output=True,
                              text=True, stdin=subprocess.DEVNULL).stdout

    def outcome(self, cost, found):
        return Outcome(cost, bytes_on_disk(self.index_directory()), found)

    def wait_until(self, program, is_done):
        """Ends the program when for SETTLED_SECONDS without a break is_done() was true and no process
        worked, or at the deadline. Returns the cost; its wall time is up to the moment when it became
        done."""
        done_at = None
        while program.seconds() < self.deadline:
            if not program.running():
                raise Failure(f"{self.title} has ended by itself; see {self.log}")
            if program.is_working() or not is_done():
                done_at = None
            elif done_at is None:
                done_at = program.seconds()
            elif program.seconds() - done_at >= SETTLED_SECONDS:
                cost = program.stop()
                return dataclasses.replace(cost, wall=done_at)
            time.sleep(POLL_SECONDS)
        return program.stop(in_time=False)


@functools.lru_cache
def _can_leave_network():
    return subprocess.run(["unshare", "--net", "true"], check=False,
                          stderr=subprocess.DEVNULL).returncode == 0


def _without_network(command):
    """Only root may; for others the programs are trusted to stay at home, as they do."""
    return (["unshare", "--net", "--"] if _can_leave_network() else []) + command


class DesktopPeer(Peer):
    """A program that talks over a D-Bus session of its own, which is measured with it, for the bus
    starts some of its processes."""

    _START = ('dbus-daemon --session --fork --nosyslog '
              '--address="$DBUS_SESSION_BUS_ADDRESS"; exec "$@"')

    def start(self, command):
        return super().start(["sh", "-c", self._START, "session", *command])

    def call(self, destination, path, method):
        """The text of a reply over the session's bus; empty where nobody of that name answers.
        Starts nobody."""
        bus = self._send("org.freedesktop.DBus", "/", "org.freedesktop.DBus.NameHasOwner",
                         "string:" + destination)
        return self._send(destination, path, method) if "true" in bus else ""

    def _send(self, destination, path, method, *arguments):
        return self.ask("dbus-send", "--session", "--print-reply=literal", "--dest=" + destination,
                        path, method, *arguments).strip()
