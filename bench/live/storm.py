"""Unpacks many files, renames the top directory twice and deletes half of them, while the system
indexes; in the end the index must hold exactly what the disk does, path for path."""

import os
import random
import threading
import time

import comparison
import report
from private_system import DAEMONS, PrivateSystem
from tree import Tree

WIDTHS = (8, 10, 6, 8, 10, 10, 6, 8)
_SAMPLE = 200


class Killer:
    """Kills each daemon once while the storm lasts and once while the system catches up."""

    def __init__(self, system, seed, steps):
        self._system = system
        self._random = random.Random(seed)
        moments = self._random.sample(range(steps), len(DAEMONS))
        self._at = dict(zip(moments, self._random.sample(DAEMONS, len(DAEMONS))))
        self._thread = threading.Thread(target=self._go_on)
        self.kills = 0

    def at(self, step):
        if step in self._at:
            self._kill(self._at[step])

    def start_later_ones(self):
        self._thread.start()

    def join(self):
        self._thread.join()

    def _go_on(self):
        for daemon in self._random.sample(DAEMONS, len(DAEMONS)):
            time.sleep(self._random.uniform(0, 2))
            self._kill(daemon)

    def _kill(self, daemon):
        self.kills += self._system.kill(daemon)


def storm(tree, files, at_step):
    """The changes, calling `at_step` before each; `files` of them make files."""
    share = os.path.dirname(tree.top)
    for step in range(files):
        at_step(step)
        if step % 25 == 0:
            tree.make_directory()
        tree.make_file()
    for step in range(files, files + 2):
        at_step(step)
        tree.move(tree.top, f"{share}/renamed{step}")
    for step in range(files + 2, files + 2 + files // 2):
        at_step(step)
        tree.delete_file()


def run_once(options, source, seed, with_kills):
    """One storm; prints its line and returns what differs in the end."""
    begun = time.monotonic()
    with PrivateSystem(options.programs, source, options.dir) as system:
        share = system.index("docs")
        system.wait_idle(settled=0.2)
        tree = Tree(share + "/top", seed)
        killer = Killer(system, seed, options.files * 3 // 2)
        changed = time.monotonic()
        storm(tree, options.files, killer.at if with_kills else lambda step: None)
        stormed = time.monotonic() - changed
        if with_kills:
            killer.start_later_ones()
            killer.join()
        system.wait_idle(options.patience)
        found = comparison.differences(system, share)
        found += comparison.search_differences(system, share, *tree.sample(_SAMPLE))
        found += system.shortages()
    report.row(seed, source, killer.kills, options.files, f"{stormed:.1f}",
               f"{time.monotonic() - begun:.1f}", len(tree.files), len(found), widths=WIDTHS)
    return comparison.shorten(found, f"seed {seed}, {source}, {killer.kills} kills")


def check(options):
    report.row("seed", "source", "kills", "files", "storm s", "all s", "left", "differ",
               widths=WIDTHS)
    failures = []
    for seed in range(options.seed, options.seed + options.seeds):
        for source in report.sources(options):
            for with_kills in {"both": (False, True), "no": (False,), "yes": (True,)}[options.kill]:
                failures += run_once(options, source, seed, with_kills)
    return failures


if __name__ == "__main__":
    arguments = report.parser(__doc__, ["scripts/live storm", "scripts/live storm --files 50000",
                                        "scripts/live storm --seed 17 --seeds 1 --kill yes"])
    arguments.add_argument("--files", type=int, default=2000, help="that are unpacked")
    arguments.add_argument("--seeds", type=int, default=20, help="how many, from --seed on")
    arguments.add_argument("--kill", choices=("both", "yes", "no"), default="both",
                           help="kill -9 each daemon twice in the middle")
    arguments.add_argument("--patience", type=int, default=900,
                           help="seconds until the system must have caught up")
    report.run(check, arguments.parse_args())
