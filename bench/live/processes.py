"""What processes use, as the kernel counts it."""

import os
from pathlib import Path

_TICK = os.sysconf("SC_CLK_TCK")


def _numbers(path, unit=1):
    """The numbers of a file of "name: number" lines."""
    numbers = {}
    for line in Path(path).read_text().splitlines():
        name, _, value = line.partition(":")
        if value.split() and value.split()[0].isdigit():
            numbers[name] = int(value.split()[0]) * unit
    return numbers


def memory_mb(pid):
    """Resident, proportional, and highest resident memory."""
    status = _numbers(f"/proc/{pid}/status", 1024)
    pss = _numbers(f"/proc/{pid}/smaps_rollup", 1024).get("Pss", 0)
    return tuple(value / 1e6 for value in (status["VmRSS"], pss, status["VmHWM"]))


def descriptors(pid):
    return len(os.listdir(f"/proc/{pid}/fd"))


def inotify_watches(pid):
    lines = 0
    for entry in os.listdir(f"/proc/{pid}/fdinfo"):
        text = Path(f"/proc/{pid}/fdinfo/{entry}").read_text()
        lines += sum(line.startswith("inotify") for line in text.splitlines())
    return lines


def cpu_seconds(pid):
    """Processor time of the process and of its children that have ended."""
    fields = Path(f"/proc/{pid}/stat").read_text().rpartition(")")[2].split()
    return sum(int(field) for field in fields[11:15]) / _TICK


def family(pid):
    """The process and all that descend from it."""
    members = [pid]
    for member in members:
        for thread in Path(f"/proc/{member}/task").glob("*/children"):
            members += map(int, thread.read_text().split())
    return members
