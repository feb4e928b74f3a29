"""What the figures were taken on."""

import os
import platform
import sys


def _first(path, key):
    with open(path, encoding="utf-8") as lines:
        return next((line.split(":", 1)[1].strip() for line in lines if line.startswith(key)), "")


def _debian():
    try:
        return "Debian " + open("/etc/debian_version", encoding="ascii").read().strip()
    except OSError:
        return platform.system()


def describe():
    memory = int(_first("/proc/meminfo", "MemTotal").split()[0]) / 1024**2
    return (f"{_first('/proc/cpuinfo', 'model name')}, {os.cpu_count()} processors, "
            f"{memory:.0f} GiB of memory, {_debian()}, Linux {platform.release()}")


def warn_if_busy():
    """Returns the load of the last minute. Says on standard error that figures taken now are worth
    little where others use the processors."""
    load = os.getloadavg()[0]
    if load > 0.5 * os.cpu_count():
        print(f"The machine is busy (load {load:.1f}): wall times will be too long.",
              file=sys.stderr)
    return load
