"""The files that are indexed: a copy of a directory, unpacked, of which some are altered."""

import gzip
import os
import shutil

from measuring.built import need_packages
from measuring.place import files_below
from measuring.program import Failure

PACKAGE = "linux-doc-6.1"
PACKAGE_DIRECTORY = "/usr/share/doc/" + PACKAGE
ALTERED_WORD = "zyxaltered"
ALTERED_ENDINGS = (".txt", ".rst", ".html", ".yaml", ".md")


def source_directory(directory):
    """The directory given, or that of the package, which is installed for it."""
    if directory is None:
        need_packages(PACKAGE)
        directory = PACKAGE_DIRECTORY
        if not os.path.isdir(directory + "/Documentation"):
            raise Failure(f"{PACKAGE} is installed without its documents: dpkg leaves them out "
                          f"here, see path-exclude in /etc/dpkg/dpkg.cfg.d. Use --corpus.")
    if not os.path.isdir(directory):
        raise Failure(f"{directory} is no directory.")
    return directory


class Corpus:
    """The copy at path."""

    def __init__(self, source, path):
        for original in files_below(source):
            _unpack(original, os.path.join(path, os.path.relpath(original, source)))
        self.path = path
        self.files = files_below(path)
        if len(self.files) < 100:
            raise Failure(f"{source} has only {len(self.files)} files; 100 are needed at least.")
        self.size = sum(os.path.getsize(file) for file in self.files)
        self._kept = {}

    def warm_up(self):
        """Brings all files into the page cache, and everything that waits to be written out of it,
        so that each program finds the same."""
        for file in self.files:
            with open(file, "rb") as content:
                while content.read(1 << 20):
                    pass
        os.sync()

    def alter(self):
        """Puts a new word into every hundredth file. Returns how many those are."""
        texts = [file for file in self.files if file.endswith(ALTERED_ENDINGS)]
        count = len(self.files) // 100
        if len(texts) < count:
            raise Failure("Too few of the files are plain text or HTML to alter 1 % of them.")
        for file in (texts[i * len(texts) // count] for i in range(count)):
            self._alter_file(file)
        return count

    def restore(self):
        """Undoes alter, times of change included."""
        for file, (content, status) in self._kept.items():
            with open(file, "wb") as original:
                original.write(content)
            os.utime(file, ns=(status.st_atime_ns, status.st_mtime_ns))
        self._kept = {}

    def _alter_file(self, file):
        with open(file, "rb") as original:
            content = original.read()
        self._kept[file] = (content, os.stat(file))
        with open(file, "wb") as altered:
            altered.write(_with_word(file, content))


def _unpack(original, target):
    os.makedirs(os.path.dirname(target), exist_ok=True)
    if not original.endswith(".gz"):
        shutil.copy2(original, target)
        return
    target = target[:-len(".gz")]
    with gzip.open(original) as packed, open(target, "wb") as unpacked:
        shutil.copyfileobj(packed, unpacked)
    shutil.copystat(original, target)


def _with_word(file, content):
    word = ALTERED_WORD.encode()
    if file.endswith(".html"):
        head, end, tail = content.rpartition(b"</body>")
        return head + b"<p>" + word + b"</p>\n" + end + tail
    mark = b"# " if file.endswith(".yaml") else b""
    return content + b"\n" + mark + word + b"\n"
