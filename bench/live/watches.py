"""What the monitor alone needs to watch very many directories: memory, time, processor time."""

import contextlib
import json
import os
import shutil
import signal
import subprocess
import tempfile
import time
from pathlib import Path

import processes
import report
from private_system import CheckFailed, wait_until

WIDTHS = (24, 8, 8, 8, 8, 8, 9)
_PER_DIRECTORY = 50
_OVERFLOW = 0x200
_LIMIT = Path("/proc/sys/fs/inotify/max_user_watches")
_WATCHES_OF_OTHERS = 50000
_MASK = 65478


def make_directories(top, count):
    """Exactly `count` directories at and below `top`, three levels or more deep."""
    directories = [top]
    os.mkdir(top)
    for parent in directories:
        for number in range(_PER_DIRECTORY):
            if len(directories) == count:
                return
            directories.append(f"{parent}/directory {number}")
            os.mkdir(directories[-1])


@contextlib.contextmanager
def enough_watches(count):
    """Lets root's programs have so many inotify watches for a while; others must have them."""
    limit = int(_LIMIT.read_text())
    wanted = count + _WATCHES_OF_OTHERS
    if limit >= wanted:
        yield
        return
    if os.geteuid() != 0:
        raise CheckFailed(f"{_LIMIT} is {limit}; "
                          f"as root: sysctl fs.inotify.max_user_watches={wanted}")
    print(f"{_LIMIT} is {wanted} instead of {limit} until the end of this check")
    _LIMIT.write_text(str(wanted))
    try:
        yield
    finally:
        _LIMIT.write_text(str(limit))


class Monitor:
    """The monitor of a root of its own, with one place registered."""

    def __init__(self, options, source, root, place):
        self.queue = root / "var/lib/quarry/queue/place"
        registrations = root / "var/lib/quarry/monitor"
        for directory in (registrations, self.queue.parent, root / "var/run"):
            directory.mkdir(parents=True, exist_ok=True)
        registration = {"application": "fileindex", "type": 1, "queue": str(self.queue),
                        "config": [{"path": place, "mask": _MASK, "ignore": ["@eaDir"]}]}
        (registrations / "fileindex-place.json").write_text(json.dumps(registration))
        self._process = subprocess.Popen(
            [str(Path(options.programs) / "tarnotifyd"), "--source", source],
            env=dict(os.environ, QUARRY_ROOT=str(root)), stderr=subprocess.DEVNULL)
        self.pid = self._process.pid

    def wait_for(self, sign, what):
        wait_until(lambda: sign(self._lines()), 600, what)

    def _lines(self):
        if self._process.poll() is not None:
            raise CheckFailed("the monitor has ended")
        try:
            lines = self.queue.read_bytes().split(b"\n")[:-1]
        except FileNotFoundError:
            return []
        return [json.loads(line.decode("utf-8", "surrogateescape")) for line in lines]

    def take(self):
        """Empties the queue, as its reader would."""
        self.queue.rename(self.queue.with_suffix(".tmp"))

    def end(self):
        self._process.send_signal(signal.SIGTERM)
        self._process.wait(60)


def figures(what, begun, pid):
    rss, pss, peak = processes.memory_mb(pid)
    report.row(what, f"{time.monotonic() - begun:.1f}", f"{processes.cpu_seconds(pid):.1f}",
               f"{rss:.0f}", f"{pss:.0f}", f"{peak:.0f}", processes.inotify_watches(pid),
               widths=WIDTHS)
    return peak


def measure(options, source, top, place):
    root = top / source
    root.mkdir()
    begun = time.monotonic()
    monitor = Monitor(options, source, root, place)
    try:
        monitor.wait_for(lambda lines: any(line["event"] == _OVERFLOW for line in lines),
                         "everything watched")
        if source == "inotify":
            wait_until(lambda: processes.inotify_watches(monitor.pid) > options.directories, 60,
                       "a watch for each directory", pause=0.2)
        figures("everything is watched", begun, monitor.pid)
        monitor.take()
        begun = time.monotonic()
        os.rename(f"{place}/directory 0", f"{place}/renamed {source}")
        os.mkdir(f"{place}/renamed {source}/directory 1/new")
        monitor.wait_for(lambda lines: any(line["path"].endswith("/new") for line in lines),
                         "the line of a new directory in a renamed one")
        os.rename(f"{place}/renamed {source}", f"{place}/directory 0")
        os.rmdir(f"{place}/directory 0/directory 1/new")
        peak = figures("a large one was renamed", begun, monitor.pid)
    finally:
        monitor.end()
    if peak > options.bound:
        return [f"{source}: {peak:.0f} MB, more than {options.bound}"]
    return []


def check(options):
    top = Path(tempfile.mkdtemp(prefix="quarry-live-", dir=options.dir))
    failures = []
    try:
        make_directories(f"{top}/place", options.directories)
        for source in report.sources(options):
            print(f"{options.directories} directories, {source}")
            report.row("", "seconds", "cpu s", "RSS MB", "PSS MB", "peak MB", "watches",
                       widths=WIDTHS)
            with enough_watches(options.directories if source == "inotify" else 0):
                failures += measure(options, source, top, f"{top}/place")
    finally:
        shutil.rmtree(top)
    return failures


if __name__ == "__main__":
    arguments = report.parser(__doc__, ["scripts/live watches",
                                        "scripts/live watches --directories 1000000"])
    arguments.add_argument("--directories", type=int, default=200000, help="to be watched")
    arguments.add_argument("--bound", type=int, default=200,
                           help="fail when the monitor needs more MB")
    report.run(check, arguments.parse_args())
