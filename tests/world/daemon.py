"""The daemon as a process of a world: start, log, signals, end."""

import contextlib
import os
import signal
import time
from pathlib import Path

from .waiting import WaitTimeout, wait_for

STARTED = "have disk = "
GONE_TAIL = 4000


class DaemonGone(AssertionError):
    """The daemon ended while a test was waiting for it."""


class Daemon:
    """One run of the daemon.

    `process` is the nsenter that holds the daemon as its only child; the exit
    status is the daemon's, negative for a signal.
    """

    def __init__(self, process, log_path):
        self.process = process
        self.log_path = Path(log_path)
        self.outer_pid = 0
        wait_for(self._find_process, 30, "the daemon's process")

    @property
    def running(self):
        return self.process.poll() is None

    @property
    def pid(self):
        """The pid that the daemon itself sees."""
        status = Path(f"/proc/{self.outer_pid}/status").read_text()
        line = next(row for row in status.splitlines() if row.startswith("NSpid:"))
        return int(line.split()[-1])

    @property
    def returncode(self):
        """Exit status, None while it runs."""
        return self.process.poll()

    def release(self):
        """Let a daemon that was started held begin."""
        self.process.stdin.write(b"\n")
        self.process.stdin.close()

    def log(self):
        """All that it and its commands printed so far."""
        return self.log_path.read_text(errors="replace")

    def mark(self):
        """A place in the log to read on from: `log_since(mark)`."""
        return self.log_path.stat().st_size

    def log_since(self, mark):
        with self.log_path.open("rb") as stream:
            stream.seek(mark)
            return stream.read().decode(errors="replace")

    def wait_log(self, text, timeout=30, since=0):
        """Wait for a complete line that holds `text` at or after `since`; returns it.

        Raises DaemonGone when the daemon ends without having printed it.
        """
        def look():
            alive = self.running
            for line in self.log_since(since).splitlines(keepends=True):
                if text in line and (line.endswith("\n") or not alive):
                    return line.rstrip("\n")
            if not alive:
                raise DaemonGone(f"ended with {self.returncode} before {text!r}; {self._tail()}")
            return None
        return wait_for(look, timeout, lambda: f"{text!r} in the log; {self._tail()}")

    def wait_started(self, timeout=60):
        """Wait until its signal handlers are in place and the first scan is done."""
        return self.wait_log(STARTED, timeout)

    def wait_idle_cycles(self, count=1, timeout=None):
        """Wait for `count` further cycles that found no event (3 s each)."""
        mark = self.mark()
        self._wait_alive(lambda: self._count("no event ...", mark) >= count,
                         timeout or 10 + 25 * count, f"{count} idle cycles")

    def wait_rescan(self, timeout=60):
        """Wait for the end of a rescan that begins after this call."""
        mark = self.mark()
        self._wait_alive(lambda: self.rescanned_since(mark), timeout, "a rescan")

    def rescanned_since(self, mark):
        """True when a rescan that began after `mark` is over.

        A rescan that finds nothing new prints nothing, but the consistency check
        that follows it prints this line twice.  Of three such lines the last one
        belongs to a rescan begun after the mark, wherever the mark fell.  The check
        of the devices behind it prints a line for each mount.
        """
        pieces = self.log_since(mark).split("mount dev num = ", 3)
        if len(pieces) < 4 or "\n" not in pieces[3]:
            return False
        mounts = int(pieces[3].split("\n", 1)[0])
        return pieces[3].count("check mount dev err, dev[") >= mounts

    def wait_exit(self, timeout=30):
        """Wait until it has ended; returns the exit status."""
        wait_for(lambda: not self.running, timeout, lambda: f"the daemon's end; {self._tail()}")
        return self.returncode

    def signal(self, number):
        """Send a signal to the daemon itself; nothing when it has ended."""
        if self.running and self.outer_pid:
            with contextlib.suppress(ProcessLookupError):
                os.kill(self.outer_pid, number)

    @contextlib.contextmanager
    def held_still(self):
        """Stop the process in its wait for events for as long as the `with` block lasts.

        A signal is sent and not yet taken when kill returns: what is done in the block
        must not be seen by a daemon that still runs.
        """
        wait_for(self.waits_for_events, 60, lambda: f"its wait for events; {self._tail()}", 0.01)
        self.signal(signal.SIGSTOP)
        wait_for(lambda: _state(self.outer_pid) == "T", 30, "the daemon to stop", 0.01)
        try:
            yield
        finally:
            self.signal(signal.SIGCONT)

    def waits_for_events(self):
        """True while it does nothing but wait for a message."""
        try:
            place = Path(f"/proc/{self.outer_pid}/wchan").read_text()
        except OSError:
            return False
        return "select" in place or "poll" in place

    def stop(self, timeout=60):
        """Two SIGINTs and the end; returns the exit status.

        While the daemon waits for a command the system library ignores SIGINT,
        so one can be lost without a trace: each is sent until its line shows.
        """
        deadline = time.monotonic() + timeout
        while self.running and time.monotonic() < deadline:
            seen = self._count("get sig = SIGINT")
            self.signal(signal.SIGINT)
            self._wait_quietly(lambda: self._count("get sig = SIGINT") > seen, 1)
            if self._count("get sig = SIGINT") >= 2:
                self._wait_quietly(lambda: False, max(0.1, deadline - time.monotonic()))
        return self.wait_exit(0.1)

    def kill(self):
        """End it without a chance to tidy up."""
        self.signal(signal.SIGKILL)
        return self.wait_exit(30)

    def rss_kib(self):
        return self._rollup("Rss:")

    def pss_kib(self):
        return self._rollup("Pss:")

    def fds(self):
        """What its open descriptors point to."""
        folder = f"/proc/{self.outer_pid}/fd"
        found = {}
        for name in os.listdir(folder):
            # One that it closes meanwhile is not open.
            with contextlib.suppress(FileNotFoundError):
                found[int(name)] = os.readlink(f"{folder}/{name}")
        return found

    def _find_process(self):
        """True once its pid is known, or it ended before it could be seen."""
        self.outer_pid = child_of(self.process.pid)
        return self.outer_pid or not self.running

    def _rollup(self, key):
        for line in Path(f"/proc/{self.outer_pid}/smaps_rollup").read_text().splitlines():
            if line.startswith(key):
                return int(line.split()[1])
        raise KeyError(key)

    def _count(self, text, since=0):
        return self.log_since(since).count(text)

    def _wait_alive(self, condition, timeout, what):
        """wait_for that raises DaemonGone as soon as the daemon has ended."""
        def look():
            if condition():
                return True
            if not self.running:
                raise DaemonGone(f"ended with {self.returncode} before {what}; {self._tail()}")
            return False
        wait_for(look, timeout, what)

    def _wait_quietly(self, condition, timeout):
        try:
            wait_for(lambda: condition() or not self.running, timeout, "")
        except WaitTimeout:
            pass

    def _tail(self):
        return f"the log ends:\n{self.log()[-GONE_TAIL:]}"


def _state(pid):
    """The letter that the kernel gives a process's state."""
    return Path(f"/proc/{pid}/stat").read_text().rsplit(")", 1)[1].split()[0]


def child_of(pid):
    """The only child of a process, 0 while there is none."""
    try:
        children = Path(f"/proc/{pid}/task/{pid}/children").read_text().split()
    except FileNotFoundError:
        return 0
    return int(children[0]) if children else 0
