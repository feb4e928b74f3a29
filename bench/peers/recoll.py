"""Recoll, on top of the Xapian library."""

import os
import re

from peers.peer import Peer


class Recoll(Peer):
    """As it is installed, but for the folder and the place of the index."""

    name = "recoll"
    title = "Recoll"
    packages = ("recollcmd", "shared-mime-info")
    settings = ""

    def set_up(self):
        self._directory = self.place.make("recoll")
        with open(self._directory + "/recoll.conf", "w", encoding="utf-8") as file:
            file.write(f"topdirs = {self.corpus.path}\nloglevel = 2\n{self.settings}")

    def bring_up_to_date(self, word):
        with self.start(["recollindex", "-c", self._directory]) as indexer:
            cost = indexer.wait(self.deadline, self.log)
        return self.outcome(cost, self._found(word))

    def index_directory(self):
        return os.path.join(self._directory, "xapiandb")

    def _found(self, word):
        answer = self.ask("recollq", "-c", self._directory, word)
        number = re.search(r"^(\d+) results", answer, re.MULTILINE)
        return int(number.group(1)) if number else 0


class RecollBuffered(Recoll):
    """Collects 300 MB of text before it writes, which it recommends where there is memory."""

    name = "recoll-300"
    variant = "300 MB buffer"
    settings = "idxflushmb = 300\n"
