"""Random files and directories, and random changes of them."""

import os
import random
import shutil

# What file systems take and programs stumble over: not UTF-8, quotes, blanks, line ends, long.
_ODD = [b"caf\xe9", b"\xff\xfe", b"a \"quoted\" name", b"back\\slash", b" blank ", b"line\nend",
        b"-rf", b"*?[x]", "žluťoučký".encode(), "\u202eabc".encode(), b"l" * 200, b"%41+b~"]
_FILLER = "the quick brown fox jumps over the lazy dog".split()


class Tree:
    """A directory with random contents. Each version of each file has a word that no other has."""

    def __init__(self, top, seed):
        self.top = top
        self.random = random.Random(seed)
        self.directories = [top]
        self.files = []
        self.gone = []  # words that no file holds any more
        self._words = {}
        self._count = 0
        os.makedirs(top, exist_ok=True)

    def _name(self, suffix=""):
        self._count += 1
        odd = self.random.choice(_ODD) if self.random.random() < 0.05 else b""
        return os.fsdecode(odd) + f"n{self._count}{suffix}"

    def make_directory(self):
        parent = self.random.choice(self.directories[-50:])
        if parent.count("/") > 40:
            parent = self.top
        self.directories.append(os.path.join(parent, self._name()))
        os.mkdir(self.directories[-1])

    def make_file(self):
        path = os.path.join(self.random.choice(self.directories[-20:]), self._name(".txt"))
        self.files.append(path)
        self._write(path)

    def rewrite_file(self):
        if self.files:
            self._write(self.random.choice(self.files))

    def _write(self, path):
        self._count += 1
        word = f"w{self._count}x{self.random.randrange(1 << 40)}"
        self._forget(path)
        self._words[path] = word
        filler = " ".join(self.random.choices(_FILLER, k=self.random.randrange(20)))
        with open(path, "w", encoding="utf-8") as file:
            file.write(f"{word}\n{filler}\n")

    def _forget(self, path):
        if path in self._words:
            self.gone.append(self._words.pop(path))

    def delete_file(self):
        if self.files:
            position = self.random.randrange(len(self.files))
            self.files[position], self.files[-1] = self.files[-1], self.files[position]
            path = self.files.pop()
            os.unlink(path)
            self._forget(path)

    def chmod_file(self):
        if self.files:
            os.chmod(self.random.choice(self.files), self.random.randrange(0o600, 0o700))

    def rename_file(self):
        if self.files:
            position = self.random.randrange(len(self.files))
            old = self.files[position]
            new = os.path.join(self.random.choice(self.directories), self._name(".txt"))
            os.rename(old, new)
            self.files[position] = new
            self._words[new] = self._words.pop(old)

    def rename_directory(self):
        old = self.random.choice(self.directories)
        parent = self.random.choice(self.directories)
        if old == self.top or (parent + "/").startswith(old + "/") or parent.count("/") > 30:
            return
        self.move(old, os.path.join(parent, self._name()))

    def delete_directory(self):
        victim = self.random.choice(self.directories)
        below = victim + "/"
        if victim == self.top or sum(file.startswith(below) for file in self.files) > 50:
            return
        shutil.rmtree(victim)
        for path in [file for file in self.files if file.startswith(below)]:
            self._forget(path)
        self.files = [file for file in self.files if not file.startswith(below)]
        self.directories = [other for other in self.directories
                            if not (other + "/").startswith(below)]

    def move(self, old, new):
        """Renames a directory, and what is known to be in it; the top one too."""
        os.rename(old, new)
        self.follow(old, new)

    def follow(self, old, new):
        """A directory has been renamed by somebody else."""

        def moved(path):
            return new + path[len(old):] if (path + "/").startswith(old + "/") else path

        self.top = moved(self.top)
        self.directories = [moved(path) for path in self.directories]
        self.files = [moved(path) for path in self.files]
        self._words = {moved(path): word for path, word in self._words.items()}

    def change(self):
        """One random change."""
        self.random.choices(
            (self.make_file, self.rewrite_file, self.delete_file, self.chmod_file,
             self.rename_file, self.make_directory, self.rename_directory, self.delete_directory),
            (30, 25, 18, 8, 10, 5, 3, 1))[0]()

    def sample(self, count):
        """Some files, and some words that must not be found any more."""
        return (self.random.sample(self.files, min(count, len(self.files))),
                self.random.sample(self.gone, min(count, len(self.gone))))
