"""Our own programs, measured as the others are."""

import os
import re
import subprocess

from peers.peer import Peer


class Quarry(Peer):
    """`quarry index`, which ends when everything is done and searched, and its system has stopped."""

    name = "quarry"
    title = "Quarry"
    programs = ""

    @classmethod
    def version(cls):
        words = subprocess.run([cls._command(), "--version"], check=False, capture_output=True,
                               text=True).stdout.split()
        return words[-1] if words else ""

    def bring_up_to_date(self, word):
        begin = os.path.getsize(self.log) if os.path.exists(self.log) else 0
        with self.start([self._command(), "index", self.corpus.path, "--", word]) as command:
            cost = command.wait(self.deadline, self.log)
        return self.outcome(cost, self._found(begin))

    def index_directory(self):
        return os.path.join(self.environment["QUARRY_ROOT"], "var/lib/quarry")

    @classmethod
    def _command(cls):
        return os.path.join(cls.programs, "quarry")

    def _found(self, begin):
        """The number that the command has printed below its hits, or the hits where those are all."""
        with open(self.log, encoding="utf-8", errors="replace") as log:
            log.seek(begin)
            text = log.read()
        number = re.search(r"of (\d+) shown", text)
        return int(number.group(1)) if number else len(re.findall(r"^\d+\. ", text, re.MULTILINE))
