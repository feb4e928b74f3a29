"""LocalSearch, the indexer of GNOME, which Debian 12 calls by its old name."""

import os

from peers.peer import DesktopPeer

MINER = "/usr/libexec/tracker-miner-fs-3"

SETTINGS = """[org/freedesktop/tracker/miner/files]
index-recursive-directories=['{folder}']
index-single-directories=@as []
initial-sleep=0
"""
FOUND = "SELECT COUNT(DISTINCT ?file) {{ ?file fts:match '{word}' }}"


class LocalSearch(DesktopPeer):
    """As it is installed, but for the folder, and for the wait of 15 s before it begins. It reads
    plain text named *.txt or *.md, and HTML; other text it knows by its attributes only."""

    name = "localsearch"
    title = "LocalSearch"
    packages = ("tracker-miner-fs", "tracker-extract", "tracker", "dbus-daemon", "dbus-bin",
                "shared-mime-info")

    def settings(self):
        return SETTINGS.format(folder=self.corpus.path)

    def set_up(self):
        folder = os.path.join(self.environment["XDG_CONFIG_HOME"], "glib-2.0/settings")
        os.makedirs(folder)
        with open(os.path.join(folder, "keyfile"), "w", encoding="utf-8") as file:
            file.write(self.settings())

    def bring_up_to_date(self, word):
        with self.start([MINER]) as miner:
            cost = self.wait_until(miner, self._is_idle)
        return self.outcome(cost, self._found(word))

    def index_directory(self):
        return os.path.join(self.environment["XDG_CACHE_HOME"], "tracker3/files")

    def _is_idle(self):
        """The one for files knows what is there, the other one reads it and is started on demand."""
        return (self._status("Files") == "Idle" and self._status("Extract") in ("Idle", ""))

    def _status(self, miner):
        return self.call("org.freedesktop.Tracker3.Miner." + miner,
                         "/org/freedesktop/Tracker3/Miner/" + miner,
                         "org.freedesktop.Tracker3.Miner.GetStatus")

    def _found(self, word):
        rows = self.ask("tracker3", "sparql", "-d", self.index_directory(), "-q",
                        FOUND.format(word=word)).split()
        return int(rows[-1]) if rows and rows[-1].isdigit() else 0


ALL_TEXT = "text-allowlist=['*']\n"
TYPES = """<?xml version="1.0"?>
<mime-info xmlns="http://www.freedesktop.org/standards/shared-mime-info">
<mime-type type="text/plain"><glob pattern="*.rst" weight="100"/>
<glob pattern="*.yaml" weight="100"/></mime-type>
</mime-info>
"""


class LocalSearchAllText(LocalSearch):
    """With settings that make it read all text of the corpus, as the others do."""

    name = "localsearch-all"
    variant = "all text"

    def settings(self):
        return super().settings() + "\n[org/freedesktop/tracker/extract]\n" + ALL_TEXT

    def set_up(self):
        super().set_up()
        types = os.path.join(self.environment["XDG_DATA_HOME"], "mime")
        os.makedirs(types + "/packages")
        with open(types + "/packages/text.xml", "w", encoding="ascii") as file:
            file.write(TYPES)
        self.ask("update-mime-database", types)
