"""A private place on the disk for everything that a benchmark writes."""

import os
import shutil
import tempfile


class Place:
    """A new directory below parent, removed with all that is in it when the context is left."""

    def __init__(self, parent):
        os.makedirs(parent, exist_ok=True)
        self.path = tempfile.mkdtemp(prefix="qb-", dir=parent)

    def __enter__(self):
        return self

    def __exit__(self, *_):
        shutil.rmtree(self.path, ignore_errors=True)

    def make(self, *names):
        """A directory of that name, made if it is missing. Returns its path."""
        path = os.path.join(self.path, *names)
        os.makedirs(path, mode=0o700, exist_ok=True)
        return path

    def file(self, name):
        return os.path.join(self.path, name)

    def clear(self, name):
        shutil.rmtree(os.path.join(self.path, name), ignore_errors=True)


def files_below(directory):
    """The paths of all files, in an order that depends on their names only."""
    found = []
    for folder, folders, names in os.walk(directory):
        folders.sort()
        paths = (os.path.join(folder, name) for name in sorted(names))
        found += [path for path in paths if os.path.isfile(path)]
    return found


def bytes_on_disk(directory):
    """What the files below occupy, holes in them not counted."""
    return sum(os.lstat(path).st_blocks * 512 for path in files_below(directory))


def private_environment(place):
    """Environment of a program that keeps its settings and data in the place only, and finds neither
    the desktop nor the session bus of the person who runs the benchmark."""
    home = place.make("home")
    return {
        "PATH": os.environ["PATH"],
        "LANG": "C.UTF-8",
        "HOME": home,
        "TMPDIR": place.make("tmp"),
        "XDG_CONFIG_HOME": place.make("home", "config"),
        "XDG_DATA_HOME": place.make("home", "data"),
        "XDG_CACHE_HOME": place.make("home", "cache"),
        "XDG_STATE_HOME": place.make("home", "state"),
        "XDG_RUNTIME_DIR": place.make("runtime"),
        "DBUS_SESSION_BUS_ADDRESS": "unix:path=" + place.file("runtime/bus"),
        "DBUS_SYSTEM_BUS_ADDRESS": "unix:path=" + place.file("runtime/no-system-bus"),
        "GSETTINGS_BACKEND": "keyfile",
        "QT_QPA_PLATFORM": "offscreen",
        "QUARRY_ROOT": place.make("q"),
    }
