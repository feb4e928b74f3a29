"""Baloo, the indexer of KDE Plasma."""

import os
import re

from peers.peer import DesktopPeer

SETTINGS = """[Basic Settings]
Indexing-Enabled=true
[General]
folders={folder}/
only basic indexing=false
"""


class Baloo(DesktopPeer):
    """As it is installed, but for the folder. It rests between its steps, on purpose."""

    name = "baloo"
    title = "Baloo"
    packages = ("baloo-kf5", "libkf5filemetadata-bin", "dbus-daemon", "dbus-bin", "shared-mime-info")

    def set_up(self):
        path = os.path.join(self.environment["XDG_CONFIG_HOME"], "baloofilerc")
        with open(path, "w", encoding="utf-8") as file:
            file.write(SETTINGS.format(folder=self.corpus.path))

    def bring_up_to_date(self, word):
        with self.start(["baloo_file"]) as indexer:
            cost = self.wait_until(indexer, self._is_idle)
        return self.outcome(cost, self._found(word))

    def index_directory(self):
        return os.path.join(self.environment["XDG_DATA_HOME"], "baloo")

    def _is_idle(self):
        """It begins in a state of rest that has another name."""
        status = self.ask("balooctl", "status")
        known = re.search(r"^Total files indexed: (\d+)$", status, re.MULTILINE)
        return bool(re.search(r"^Indexer state: Idle$", status, re.MULTILINE)
                    and re.search(r"^Files waiting for content indexing: 0$", status, re.MULTILINE)
                    and known and int(known.group(1)) >= len(self.corpus.files))

    def _found(self, word):
        hits = self.ask("baloosearch", "--limit", "1000000", word)
        return sum(line.startswith(self.corpus.path) for line in hits.splitlines())
