"""Synthetic files of 1 to 2 KB: words as unevenly frequent as in natural language."""

import itertools
import os
import random
import shutil

from measuring.program import Failure

MARK = "zyxmarked"
MARK_EVERY = 1000
FILES_PER_DIRECTORY = 100
VOCABULARY = 100_000
BYTES_ON_DISK = 4096
# The index and its log beside the files.
SPACE_FACTOR = 3

_SYLLABLES = [a + b for a in "bcdfghklmnprstvz" for b in ("a", "e", "i", "o", "u", "an", "er", "is")]


def _word(number):
    """The most frequent words are the shortest."""
    parts = []
    number += len(_SYLLABLES)
    while number:
        number, rest = divmod(number, len(_SYLLABLES))
        parts.append(_SYLLABLES[rest])
    return "".join(parts)


class SyntheticFiles:
    """The files of a directory, which only grow in number. The same ones each time: text and places
    depend on a file's number alone."""

    def __init__(self, path):
        self.path = path
        self.count = 0
        self._words = [_word(rank) for rank in range(VOCABULARY)]
        self._weights = list(itertools.accumulate(1 / (rank + 3) for rank in range(VOCABULARY)))

    def grow(self, count):
        """Adds files until there are so many."""
        self._require_space(count)
        for number in range(self.count, count):
            if number % FILES_PER_DIRECTORY == 0:
                os.makedirs(self._directory(number))
            with open(f"{self._directory(number)}/file{number}.txt", "wb") as file:
                file.write(self._text(number))
        self.count = count
        os.sync()

    def marked(self):
        """How many files have the mark."""
        return -(-self.count // MARK_EVERY)

    def _directory(self, number):
        folder = number // FILES_PER_DIRECTORY
        return f"{self.path}/{folder // 100:03}/{folder % 100:02}"

    def _text(self, number):
        chance = random.Random(number)
        words = chance.choices(self._words, cum_weights=self._weights, k=chance.randint(180, 360))
        words[::12] = [word + ".\n" for word in words[::12]]
        if number % MARK_EVERY == 0:
            words.append(MARK)
        return " ".join(words).encode()

    def _require_space(self, count):
        needed = (count - self.count) * BYTES_ON_DISK * SPACE_FACTOR
        free = shutil.disk_usage(self.path).free
        if free < needed:
            raise Failure(f"{count:,} files and their index need {needed / 1e9:.1f} GB, and "
                          f"{self.path} has {free / 1e9:.1f} GB left. Use --work or fewer --files.")
