"""What it costs to compare very many unchanged files, and to rename a directory of very many: no
file may be opened, and no document be sent."""

import os
import time

import comparison
import processes
import report
from inotify import OpenCounter
from private_system import PrivateSystem, wait_until

WIDTHS = (20, 8, 8, 8, 8, 10)
_PER_DIRECTORY = 1000


def make_files(top, count):
    """The directories of the files."""
    directories = []
    for number in range(count):
        if number % _PER_DIRECTORY == 0:
            directories.append(f"{top}/directory {len(directories)}")
            os.makedirs(directories[-1])
        with open(f"{directories[-1]}/file {number}.txt", "w", encoding="utf-8") as file:
            file.write(f"the word of this file is w{number}\n")
    return directories


class Meter:
    """Prints what something has cost since the last line."""

    def __init__(self, system):
        self._system = system
        self.restart()

    def restart(self):
        self._begun = time.monotonic()
        self._cpu = self._all_cpu()
        self._done = self._documents()

    def row(self, what, opened):
        seconds = time.monotonic() - self._begun
        cpu = self._all_cpu()
        documents = self._documents() - self._done
        used = [f"{cpu[name] - self._cpu.get(name, 0):.1f}"
                for name in ("fileindexd", "tarnelasticd")]
        report.row(what, f"{seconds:.1f}", *used, opened, documents, widths=WIDTHS)
        self.restart()
        return documents

    def _all_cpu(self):
        return {name: processes.cpu_seconds(pid) for name, pid in self._system.pids().items()}

    def _documents(self):
        progress = wait_until(self._system.progress, 30, "the index daemon's answer")
        return sum(share["done"] for share in progress["shares"])


def rescan(system, share, meter, opens):
    system.quarry("folder", "reindex", "/docs")
    system.wait_idle(settled=0)
    opened = opens.count()
    documents = meter.row("compared again", opened)
    if opened or documents:
        return [f"a rescan opened {opened} files and sent {documents} documents"]
    return []


def rename(system, share, meter, opens, files):
    new = f"{share}/renamed"
    os.rename(f"{share}/top", new)
    places = files + 1 + -(-files // _PER_DIRECTORY)
    wait_until(lambda: system.total(f"in:{new}", "docs") == places, 600, "the renamed directory")
    meter.row("renamed, searchable", opens.count())
    system.wait_idle()
    opened = opens.count()
    meter.row("renamed, compared", opened)
    return [f"a rename opened {opened} files"] if opened else []


def check_source(options, source):
    with PrivateSystem(options.programs, source, options.dir) as system:
        directories = make_files(f"{system.files}/docs/top", options.files)
        share = system.index("docs")
        meter = Meter(system)
        system.wait_idle(settled=1)
        meter.row("read at first", "")
        opens = OpenCounter(directories)
        try:
            failures = rescan(system, share, meter, opens)
            failures += rename(system, share, meter, opens, options.files)
        finally:
            opens.close()
        found = comparison.differences(system, share)
    return failures + comparison.shorten(found, source)


def check(options):
    failures = []
    for source in report.sources(options):
        print(f"{options.files} files, {source}; processor seconds of the daemons")
        report.row("", "seconds", "index", "engine", "opened", "documents", widths=WIDTHS)
        failures += check_source(options, source)
    return failures


if __name__ == "__main__":
    arguments = report.parser(__doc__, ["scripts/live rescan",
                                        "scripts/live rescan --files 5000 --source inotify"])
    arguments.add_argument("--files", type=int, default=100000, help="in the share")
    report.run(check, arguments.parse_args())
