"""Compares what the index holds of a share with what lies on the disk."""

import os
import stat
from typing import NamedTuple

_PAGE = 5000


class Entry(NamedTuple):
    """One place, as the index and the disk must agree on it."""

    is_dir: bool
    size: int
    mtime_ns: int
    mode: str
    text: str


def list_disk(top):
    """All directories and regular files at and below `top`, with their contents."""
    entries = {}
    stack = [top]
    while stack:
        path = stack.pop()
        status = os.lstat(path)
        is_dir = stat.S_ISDIR(status.st_mode)
        if is_dir:
            stack.extend(os.path.join(path, name) for name in os.listdir(path))
        elif not stat.S_ISREG(status.st_mode):
            continue
        entries[path] = Entry(is_dir, status.st_size, status.st_mtime_ns,
                              f"{stat.S_IMODE(status.st_mode):04o}", "" if is_dir else _text(path))
    return entries


def _text(path):
    with open(path, encoding="utf-8") as file:
        return file.read().strip()


def list_index(system, share):
    """The same of the index; a path that is there twice is an error of its own."""
    entries = {}
    doubled = []
    for document in _documents(system, share):
        path = document["TARNMDPath"]
        if path in entries:
            doubled.append(path)
        _, _, size, mtime_ns, _ = document["QuarryAttributeStamp"].split(":")
        entries[path] = Entry(document["TARNMDIsDir"], int(size), int(mtime_ns),
                              document["TARNMDPrivilege"],
                              document.get("TARNMDTextContent", "").strip())
    return entries, doubled


def _documents(system, share):
    fields = ["TARNMDPath", "TARNMDIsDir", "TARNMDPrivilege", "QuarryAttributeStamp",
              "TARNMDTextContent"]
    query = {"qsl": {"prefix": {"TARNMDPath": "/"}}, "load_field": fields, "limit": _PAGE}
    while True:
        page = system.engine("document_get_by_query", id="fileindex_" + os.path.basename(share),
                             query=query)
        yield from page
        if len(page) < _PAGE:
            return
        query["after"] = page[-1]["TARNMDPath"]


def differences(system, share):
    """What differs between disk and index, in lines for people; empty when they are equal."""
    disk = list_disk(share)
    index, doubled = list_index(system, share)
    found = [f"twice in the index: {path!r}" for path in doubled]
    found += [f"not in the index: {path!r}" for path in disk.keys() - index.keys()]
    found += [f"not on the disk: {path!r}" for path in index.keys() - disk.keys()]
    for path in disk.keys() & index.keys():
        if disk[path] != index[path]:
            found.append(f"{path!r}: on the disk {disk[path]}, in the index {index[path]}")
    return found


def search_differences(system, share, paths, gone):
    """Searches for the one word that each of the files holds, and for words that no file holds any
    more."""
    share_name = os.path.basename(share)
    index = ["fileindex_" + share_name]
    found = []
    for path in paths:
        word = _text(path)
        hits = system.engine("search", query=word, ids=index)["hits"]
        if [hit["path"] for hit in hits] != [path]:
            found.append(f"{word} is in {path!r}, but found in {hits}")
    for word in gone:
        if system.total(word, share_name):
            found.append(f"{word} is in no file, but found")
    return found


def shorten(found, where, at_most=10):
    """The first few of them, each with where it was found, and how many there are."""
    lines = [f"{where}: {line}" for line in sorted(found)[:at_most]]
    if len(found) > at_most:
        lines.append(f"{where}: {len(found)} differences in all")
    return lines
