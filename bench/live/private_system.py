"""A whole private system for one check: the real programs below a root of their own."""

import ctypes
import json
import os
import shutil
import signal
import socket
import struct
import subprocess
import tempfile
import time
from pathlib import Path

DAEMONS = ("tarnelasticd", "tarncontentextractd", "fileindexd", "tarnotifyd")
_PR_SET_PDEATHSIG = 1


class CheckFailed(Exception):
    """What was to be shown is not so."""


def wait_until(condition, seconds, what, pause=0.01):
    """Waits for what `condition` returns to be true, and returns it."""
    deadline = time.monotonic() + seconds
    while True:
        value = condition()
        if value:
            return value
        if time.monotonic() > deadline:
            raise CheckFailed(f"{what}: not after {seconds} s")
        time.sleep(pause)


class Peer:
    """One connection to a daemon, made anew when it breaks. Text need not be UTF-8."""

    def __init__(self, address):
        self._address = address
        self._socket = None

    def ask(self, message, seconds=60):
        """The answer's data. Raises OSError when nobody answers, CheckFailed when refused."""
        was_open = self._socket is not None
        try:
            answer = self._exchange(message, seconds)
        except OSError:
            self.close()
            # A daemon closes a connection that was silent for long, and every one when it ends.
            if was_open:
                return self.ask(message, seconds)
            raise
        if not answer.get("success"):
            raise CheckFailed(f"{message} is answered {answer.get('error')}")
        return answer.get("data")

    def close(self):
        if self._socket:
            self._socket.close()
        self._socket = None

    def _exchange(self, message, seconds):
        if not self._socket:
            self._socket = socket.socket(socket.AF_UNIX)
            self._socket.settimeout(seconds)
            self._socket.connect(self._address)
        text = json.dumps(message, ensure_ascii=False).encode("utf-8", "surrogateescape") + b"\0"
        self._socket.sendall(struct.pack("=I", len(text)) + text)
        (length,) = struct.unpack("=I", self._receive(4))
        return json.loads(self._receive(length).decode("utf-8", "surrogateescape"), strict=False)

    def _receive(self, length):
        parts = []
        while length > 0:
            part = self._socket.recv(min(length, 1 << 20))
            if not part:
                raise ConnectionResetError("closed early")
            parts.append(part)
            length -= len(part)
        return b"".join(parts)


class PrivateSystem:
    """Started by `with`; afterwards nothing of it is left. Files to index belong below `files`."""

    def __init__(self, programs, source="fanotify", directory=None):
        self._programs = Path(programs).resolve()
        self._top = Path(tempfile.mkdtemp(prefix="quarry-live-", dir=directory))
        self.root = self._top / "root"
        self.files = self._top / "files"
        self.files.mkdir()
        self.root.mkdir()
        self._environment = dict(os.environ, QUARRY_ROOT=str(self.root))
        self._log = self._top / "run.log"
        self._bin = self._top / "bin"
        self._install(source)
        self._supervisor = None
        run = self.root / "var/run"
        self._engine = Peer(str(run / "tarnelasticd.sock"))
        self._index_daemon = Peer(str(run / "fileindexd.sock"))
        self._services = Peer(str(run / "quarry.sock"))

    def _install(self, source):
        # The supervisor starts the daemons that lie beside it.
        self._bin.mkdir()
        shutil.copy2(self._programs / "quarry", self._bin)
        for daemon in DAEMONS[:3]:
            (self._bin / daemon).symlink_to(self._programs / daemon)
        monitor = self._bin / DAEMONS[3]
        program = self._programs / DAEMONS[3]
        monitor.write_text(f'#!/bin/sh\nexec "{program}" --source {source} "$@"\n')
        monitor.chmod(0o755)

    def __enter__(self):
        try:
            self.start()
        except BaseException:
            self.__exit__()
            raise
        return self

    def __exit__(self, *_):
        # Somebody who is in a hurry must not leave a system behind.
        impatience = signal.signal(signal.SIGINT, signal.SIG_IGN)
        try:
            self.stop()
        finally:
            shutil.rmtree(self._top)
            signal.signal(signal.SIGINT, impatience)

    def start(self):
        log = open(self._log, "ab")
        with log:
            self._supervisor = subprocess.Popen(
                [str(self._bin / "quarry"), "run"], env=self._environment, stdout=log, stderr=log,
                stdin=subprocess.DEVNULL, preexec_fn=_end_with_parent)
        wait_until(self._engine_answers, 30, "the engine's first answer")

    def stop(self):
        for peer in (self._engine, self._index_daemon, self._services):
            peer.close()
        if not self._supervisor:
            return
        self._supervisor.terminate()
        try:
            self._supervisor.wait(60)
        except subprocess.TimeoutExpired:
            self._supervisor.kill()
            self._supervisor.wait()
        self._supervisor = None

    def _engine_answers(self):
        try:
            return self._engine.ask({"command": "engine_status"}) is not None
        except OSError:
            return False

    def quarry(self, *arguments, may_fail=False):
        """Runs the command line to its end; returns whether that went well."""
        done = subprocess.run([str(self._bin / "quarry"), *map(str, arguments)], timeout=300,
                              env=self._environment, capture_output=True, stdin=subprocess.DEVNULL)
        if done.returncode != 0 and not may_fail:
            raise CheckFailed(f"quarry {arguments}: {done.stdout + done.stderr!r}")
        return done.returncode == 0

    def log(self):
        return self._log.read_text(errors="replace")

    def shortages(self):
        """What the monitor could not watch, as when others use up the user's inotify watches: it
        finds changes there later than a check waits."""
        return [line for line in self.log().splitlines() if "can be watched: " in line]

    def index(self, name):
        """Makes a directory of files a share and indexes the whole of it."""
        share = self.files / name
        share.mkdir(exist_ok=True)
        self.quarry("share", "add", share)
        self.quarry("folder", "add", "/" + name)
        return str(share)

    def engine(self, command, **data):
        """The engine's answer, however often the engine dies meanwhile."""
        message = {"command": command, "data": data}
        deadline = time.monotonic() + 120
        while True:
            try:
                return self._engine.ask(message)
            except OSError:
                if time.monotonic() > deadline:
                    raise
                time.sleep(0.05)

    def total(self, query, share):
        """How many documents of the share a search finds: what is committed, nothing else."""
        return self.engine("search", query=query, ids=["fileindex_" + share], limit=0)["total"]

    def progress(self):
        """The status of the index daemon, None while it does not answer."""
        try:
            return self._index_daemon.ask({"type": "status", "data": {}})
        except OSError:
            return None

    def pause_for(self, seconds):
        try:
            until = int(time.time()) + seconds
            self._index_daemon.ask({"type": "pause", "data": {"resume_time": until}})
        except OSError:
            pass

    def supervisor(self):
        """The process of `quarry run`."""
        return self._supervisor.pid

    def pids(self):
        """The process of each daemon that runs."""
        services = self._services.ask({"command": "status"})["services"]
        return {service["name"]: service["pid"] for service in services if service["pid"]}

    def kill(self, daemon):
        """Kills it without a warning. Returns false when it did not run."""
        pid = self.pids().get(daemon)
        if pid:
            os.kill(pid, signal.SIGKILL)
        return pid is not None

    def queues(self):
        """The queues and snapshots in which something waits."""
        queues = self.root / "var/lib/quarry/queue"
        return [file for file in queues.iterdir() if size_of(file)] if queues.exists() else []

    def is_idle(self):
        progress = self.progress()
        return (progress is not None and not self.queues() and len(self.pids()) == len(DAEMONS) and
                all(share["state"] in ("idle", "stopped") for share in progress["shares"]))

    def wait_idle(self, seconds=600, settled=2.0):
        """Waits until nothing has been to be done for `settled` seconds; longer than a monitor
        holds back what it saw, or needs to be started again."""
        since = None

        def settled_down():
            nonlocal since
            now = time.monotonic()
            if not self.is_idle():
                since = None
                return False
            since = since or now
            return now - since >= settled

        try:
            wait_until(settled_down, seconds, "an idle system", pause=0.05)
        except CheckFailed as failure:
            waiting = {file.name: file.read_bytes()[:500] for file in self.queues()}
            raise CheckFailed(f"{failure}; {self.progress()}; in queues: {waiting}")


def size_of(path):
    try:
        return path.stat().st_size
    except FileNotFoundError:
        return 0


def _end_with_parent():
    ctypes.CDLL(None).prctl(_PR_SET_PDEATHSIG, signal.SIGTERM)
