"""Changes the disk at random for a long time, while daemons are killed, indexing is paused, folders
come and go, and a share gets other names. In the end the index must hold exactly what the disk
does, and nothing may have leaked."""

import os
import random
import time

import comparison
import processes
import report
from private_system import DAEMONS, CheckFailed, PrivateSystem, wait_until
from tree import Tree

WIDTHS = (22, 12, 12, 12)
_SAMPLE = 200
_FILES = 3000
# What a daemon may have more in the end than in the middle, since which nobody was killed.
_MORE_DESCRIPTORS = 4
_MORE_MEMORY_MB = 40


class Disturber:
    """Does to the system what may happen to it in its life, one thing at a time."""

    def __init__(self, system, tree, other, seed):
        self._system = system
        self._tree = tree
        self._other = other
        self._random = random.Random(seed)
        self.counts = {}

    def one(self, with_kills):
        kinds = [self.pause_timed, self.pause, self.folder, self.pause_share, self.rename_share,
                 self.reindex]
        if with_kills:
            kinds += [self.kill] * 6
        kind = self._random.choice(kinds)
        self.counts[kind.__name__] = self.counts.get(kind.__name__, 0) + 1
        kind()

    def _quarry(self, *arguments):
        # A daemon that was killed a moment ago may make a command fail, which then can be repeated.
        wait_until(lambda: self._system.quarry(*arguments, may_fail=True), 120,
                   f"quarry {arguments}", pause=0.5)

    def _go_on_for_a_while(self):
        for _ in range(self._random.randrange(50)):
            self._tree.change()

    def kill(self):
        self._system.kill(self._random.choice(DAEMONS))

    def pause_timed(self):
        self._system.pause_for(self._random.randrange(1, 4))

    def pause(self):
        self._quarry("pause")
        self._go_on_for_a_while()
        self._quarry("resume")

    def pause_share(self):
        name = os.path.basename(self._share())
        self._quarry("share", "pause", name)
        self._go_on_for_a_while()
        self._quarry("share", "resume", name)

    def folder(self):
        self._quarry("folder", "delete", "/" + self._other)
        self._go_on_for_a_while()
        self._quarry("folder", "add", "/" + self._other)

    def reindex(self):
        self._quarry("folder", "reindex", "/" + self._other)

    def rename_share(self):
        old = self._share()
        new = os.path.join(os.path.dirname(old), f"share{self._random.randrange(10 ** 6)}")
        self._quarry("share", "rename", os.path.basename(old), os.path.basename(new))
        self._tree.follow(old, new)

    def _share(self):
        return self._tree.top


def usage(system):
    """Descriptors of any process, and megabytes, of each daemon, and the files that are kept."""
    used = {"quarry run descriptors": processes.descriptors(system.supervisor())}
    for daemon, pid in system.pids().items():
        # Workers come and go as they are needed.
        members = processes.family(pid)
        used[f"{daemon} descriptors"] = max(map(processes.descriptors, members))
        used[f"{daemon} MB"] = round(sum(processes.memory_mb(member)[1] for member in members))
    files = [os.path.join(place, name)
             for place, _, names in os.walk(system.root) for name in names]
    # What SQLite keeps beside a database comes and goes.
    files = [file for file in files if not file.endswith(("-wal", "-shm"))]
    used["files"] = len(files)
    return used, {os.path.relpath(file, system.root) for file in files}


def leaks(middle, end):
    """What has grown since the last kill."""
    allowed = {"descriptors": _MORE_DESCRIPTORS, "MB": _MORE_MEMORY_MB}
    return [f"{what}: {middle[what]} in the middle, {value} in the end"
            for what, value in end.items()
            if what != "files" and value > middle[what] + allowed[what.split()[-1]]]


def soak(system, tree, others, disturber, options):
    """Returns what was used in the middle, when the last daemon had been killed."""
    moments = random.Random(options.seed)
    begun = time.monotonic()
    seconds = options.minutes * 60
    middle = None
    due = begun
    while (now := time.monotonic()) < begun + seconds:
        with_kills = now < begun + seconds * 0.6
        if not with_kills and not middle:
            system.wait_idle()
            middle, _ = usage(system)
        for changed in (tree, *others):
            if len(changed.files) > _FILES:
                changed.delete_file()
            changed.change()
        if now > due:
            disturber.one(with_kills)
            due = now + moments.uniform(0, 2 * options.pause)
        time.sleep(moments.uniform(0, 2 / options.rate))
    return middle


def shares_differ(system, trees):
    failures = []
    for tree in trees:
        share = tree.top
        found = comparison.differences(system, share)
        found += comparison.search_differences(system, share, *tree.sample(_SAMPLE))
        failures += comparison.shorten(found, os.path.basename(share))
    return failures


def check_source(options, source):
    with PrivateSystem(options.programs, source, options.dir) as system:
        trees = [Tree(system.index(name), options.seed + number)
                 for number, name in enumerate(("moving", "other"))]
        system.quarry("pause")  # what is written only then should not count as left behind
        system.quarry("resume")
        system.wait_idle()
        before, files_before = usage(system)
        disturber = Disturber(system, trees[0], "other", options.seed)
        try:
            middle = soak(system, trees[0], trees[1:], disturber, options)
            system.wait_idle(options.patience)
        except CheckFailed as failure:
            print(system.log()[-5000:])
            return [str(failure)]
        end, files_end = usage(system)
        report.row(source, "before", "last kill", "end", widths=WIDTHS)
        for what, value in end.items():
            report.row(what, before.get(what, ""), middle.get(what, ""), value, widths=WIDTHS)
        print("disturbed by", disturber.counts, "left with",
              [len(tree.files) for tree in trees], "files")
        print("files that are new:", sorted(files_end - files_before))
        failures = leaks(middle, end) + shares_differ(system, trees) + system.shortages()
        if end["files"] > before["files"]:
            failures.append(f"{end['files'] - before['files']} files more than before")
        return failures


def check(options):
    failures = []
    for source in report.sources(options):
        failures += check_source(options, source)
    return failures


if __name__ == "__main__":
    arguments = report.parser(__doc__, ["scripts/live soak",
                                        "scripts/live soak --minutes 2 --source inotify"])
    arguments.add_argument("--minutes", type=float, default=20, help="for each source")
    arguments.add_argument("--rate", type=float, default=30, help="changes a second in each share")
    arguments.add_argument("--pause", type=float, default=5,
                           help="seconds between two disturbances, on average")
    arguments.add_argument("--patience", type=int, default=600,
                           help="seconds until the system must have caught up")
    report.run(check, arguments.parse_args())
