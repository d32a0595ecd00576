"""System calls of the daemon traced and made to fail, its commands left in peace."""

import contextlib
import signal
import subprocess
from pathlib import Path

from world import WaitTimeout, wait_for

PROGRAM = "strace"
_END = 30
_QUIET = 1


class Strace:
    """strace on one process for as long as the `with` block lasts.

        with Strace(daemon, "openat", "error=EMFILE:when=1+2") as strace:
            …
        strace.injected

    names  the calls to trace, of which this processor may lack some; all when empty
    fault  what they end with instead of being made; nothing fails when empty
    paths  only calls on one of these or on a descriptor of it; all when empty
    """

    def __init__(self, daemon, names=(), fault="", paths=()):
        self._daemon = daemon
        self._output = Path(daemon.log_path).with_suffix(".strace")
        self._words = [PROGRAM, "-qq", "-p", str(daemon.outer_pid), "-o", str(self._output)]
        chosen = ",".join(f"?{name}" for name in names)
        if chosen:
            self._words += ["-e", f"trace={chosen}"]
        if fault:
            self._words += ["-e", f"inject={chosen}:{fault}"]
        for path in paths:
            self._words += ["-P", path]
        self._process = None

    def __enter__(self):
        self._output.unlink(missing_ok=True)
        self._process = subprocess.Popen(self._words, stdin=subprocess.DEVNULL,
                                         stdout=subprocess.DEVNULL, stderr=subprocess.PIPE)
        wait_for(self._attached, _END, self._why_not)
        return self

    def __exit__(self, *_):
        # To leave in the middle of a call that fails would turn it into one that the
        # kernel does not know.
        with contextlib.suppress(WaitTimeout):
            wait_for(self._at_rest, _QUIET, "", 0.01)
        self._process.send_signal(signal.SIGTERM)
        self._process.communicate(timeout=_END)

    @property
    def trace(self):
        """The calls so far, one a line."""
        return self._output.read_text(errors="replace") if self._output.exists() else ""

    @property
    def injected(self):
        """How many calls failed on purpose."""
        return self.trace.count("(INJECTED)")

    def _attached(self):
        if self._process.poll() is not None:
            raise AssertionError(self._why_not())
        return _tracer(self._daemon.outer_pid) == self._process.pid

    def _at_rest(self):
        return self._daemon.waits_for_events() or not self._daemon.running

    def _why_not(self):
        if self._process.poll() is None:
            return "strace to attach"
        return f"strace to attach: {self._process.stderr.read().decode().strip()}"


def _tracer(pid):
    lines = Path(f"/proc/{pid}/status").read_text().splitlines()
    return int(next(line for line in lines if line.startswith("TracerPid:")).split()[1])
