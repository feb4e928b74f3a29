"""Runs a command and says what it and all that it leaves behind have cost.

python3 keeper.py REPORT_FD COMMAND [ARGUMENT...]

Writes one JSON object per line to REPORT_FD: {"pid"} once the command runs, {"status", "time"} (as
time.monotonic() has it) when it has ended, and {"processor", "written"} when all its descendants
have, which are ended now unless they end by themselves. The keeper adopts orphans, so that the
kernel adds whatever any of them has used to the keeper's own account: nothing depends on sampling.
"""

import ctypes
import json
import os
import resource
import signal
import sys
import time

PR_SET_CHILD_SUBREAPER = 36
SECONDS_TO_END = 20


def adopt_orphans():
    if ctypes.CDLL(None, use_errno=True).prctl(PR_SET_CHILD_SUBREAPER, 1, 0, 0, 0) != 0:
        raise OSError(ctypes.get_errno(), "prctl(PR_SET_CHILD_SUBREAPER)")


def written_bytes():
    """Of this process and of all children that were waited for."""
    with open("/proc/self/io", encoding="ascii") as fields:
        return next(int(line.split()[1]) for line in fields if line.startswith("write_bytes"))


def children():
    with open(f"/proc/self/task/{os.getpid()}/children", encoding="ascii") as pids:
        return [int(pid) for pid in pids.read().split()]


def wait_for(pid):
    """Waits for the command itself, and for adopted processes that end meanwhile."""
    while True:
        ended, status = os.wait()
        if ended == pid:
            return os.waitstatus_to_exitcode(status)


def end_the_rest():
    """Children of those that are ended are adopted in turn, so it goes on until none is left."""
    force_at = time.monotonic() + SECONDS_TO_END
    asked = set()
    while True:
        try:
            if os.waitpid(-1, os.WNOHANG)[0] != 0:
                continue
        except ChildProcessError:
            return
        forced = time.monotonic() > force_at
        for pid in children():
            if forced or pid not in asked:
                asked.add(pid)
                os.kill(pid, signal.SIGKILL if forced else signal.SIGTERM)
        time.sleep(0.01)


def main():
    report = os.fdopen(int(sys.argv[1]), "w", encoding="ascii")

    def say(**fields):
        print(json.dumps(fields), file=report, flush=True)

    # The terminal's ^C reaches the keeper too, which has to outlive what it keeps.
    signal.signal(signal.SIGINT, signal.SIG_IGN)
    adopt_orphans()
    pid = os.fork()
    if pid == 0:
        report.close()
        signal.signal(signal.SIGINT, signal.SIG_DFL)
        os.execvp(sys.argv[2], sys.argv[2:])
    say(pid=pid)
    say(status=wait_for(pid), time=time.monotonic())
    end_the_rest()
    used = resource.getrusage(resource.RUSAGE_CHILDREN)
    say(processor=used.ru_utime + used.ru_stime, written=written_bytes())


if __name__ == "__main__":
    main()
