"""What all checks share on the command line, and how they print figures."""

import argparse
import os
import signal
import sys
import time
from pathlib import Path

from private_system import CheckFailed

SOURCES = ("fanotify", "inotify")


def parser(description, examples):
    """The options of every check."""
    lines = "\n".join("  " + example for example in examples)
    options = argparse.ArgumentParser(description=description, epilog=f"examples:\n{lines}",
                                      formatter_class=argparse.RawDescriptionHelpFormatter)
    options.add_argument("--programs", default=Path(__file__).parents[2] / "build/run/bin",
                         help="directory of the programs to check (default: %(default)s)")
    options.add_argument("--source", choices=("both", *SOURCES), default="both",
                         help="where the monitor's changes come from; fanotify needs root")
    options.add_argument("--dir", help="where to make the temporary directory")
    options.add_argument("--seed", type=int, default=1, help="of the random choices")
    return options


def sources(options):
    """The modes to check. Those that only root can have are left out, aloud, for others."""
    if options.source != "both":
        return (options.source,)
    if os.geteuid() == 0:
        return SOURCES
    print("Without the rights of root: inotify only", file=sys.stderr)
    return SOURCES[1:]


def row(*cells, widths):
    """Prints one line of a table at once: a check that is ended early has shown what it had."""
    texts = [str(cell).rjust(width) if index else str(cell).ljust(width)
             for index, (cell, width) in enumerate(zip(cells, widths))]
    print("  ".join(texts).rstrip(), flush=True)


def percentile(values, share):
    """The smallest value that `share` of all values do not exceed."""
    ordered = sorted(values)
    return ordered[max(0, -(-len(ordered) * share // 100) - 1)]


def run(check, options):
    """Runs the check; the exit code says whether all holds."""
    begun = time.monotonic()
    signal.signal(signal.SIGTERM, signal.default_int_handler)
    try:
        failures = check(options)
    except CheckFailed as failure:
        failures = [str(failure)]
    except KeyboardInterrupt:
        failures = ["it was told to end early"]
    for failure in failures:
        print("FAILED:", failure)
    print(f"{'failed' if failures else 'all well'}, after {time.monotonic() - begun:.0f} s")
    sys.exit(1 if failures else 0)
