"""A start of the daemon with one call of it failing, and what may come of it."""

import contextlib
from collections import Counter

from faults.calls import names_in
from shared.strace import Strace

from world import Partition, WaitTimeout
from world.state import DISK_DB, PID_FILE

# The daemon's first own call: everything before it is the shell's and the loader's.
_FIRST_OWN = f'"{PID_FILE.replace("nas/", "nas//")}"'
# Counted in cycles and not in seconds: on a busy machine both the daemon and the judge are slow.
_CYCLES_BY_ITSELF = 8
_ANNOUNCED = 5
_HELPED = 30
_END = 60
# Without its pipes the daemon cannot work, and says so.
_NO_PIPES = ("mknod err:", "fopen err:")


class Starts:
    """Starts the daemon again and again in one world with a disk of one partition.

    Every start finds what an earlier one left: a mount, a stale pid file.
    """

    def __init__(self, world, environ):
        self.world = world
        self.environ = environ
        self.disk = world.partitioned_disk(Partition("ext4", 1200, "COLD"))
        world.plug(self.disk, "sda")
        world.start_companion()
        self.outcomes = Counter()
        self._first_own = Counter()

    def baseline(self):
        """Names of the daemon's own calls of an undisturbed start, in order."""
        daemon = self.held()
        with Strace(daemon) as strace:
            daemon.release()
            self.world.wait(self.is_right, 20, "a start without a fault")
        self._end(daemon)
        foreign, first_own, own = strace.trace.partition(_FIRST_OWN)
        assert first_own
        # The first own call's name stands before its argument.
        before = names_in(foreign)
        self._first_own = Counter(before[:-1])
        return before[-1:] + names_in(own)

    def occurrences(self, call, own):
        """[(name, how many)] of the names of a call that an undisturbed start makes."""
        return [(name, own.count(name)) for name in call.names if name in own]

    def fail(self, call, name, error, number):
        """Let the daemon's `number`th own call of that name fail, once; returns the trace.

        Then all must be right, by itself or with the next announcement, or the
        daemon has ended as it does without its pipes and the next start is right.
        """
        nth = self._first_own[name] + number
        daemon = self.held()
        with Strace(daemon, [name], f"error={error}:when={nth}") as strace:
            daemon.release()
            ended = self.settle(daemon, call.hides)
        assert ended or not call.vital
        if ended:
            daemon = self.start_after(daemon)
        fault = self.world.db_fault()
        assert not fault, fault
        self._end(daemon)
        return strace.injected

    def held(self):
        """A daemon that waits to be let go, in a world as an earlier run left it."""
        self.world.sh("umount /tmp/mountd/* 2>/dev/null; rm -rf /tmp/tarn_nas", check=False)
        self.world.path(DISK_DB).unlink(missing_ok=True)
        self.world.write(PID_FILE, "999999")
        return self.world.start_daemon(held=True, environ=self.environ)

    def settle(self, daemon, hides):
        """True when the daemon ended; otherwise all is right, by itself if nothing hides data."""
        def judged():
            had_its_time = daemon.log().count("no event ...") >= _CYCLES_BY_ITSELF
            return self.is_right() or not daemon.running or had_its_time
        self.world.wait(judged, _END, "a start that ends in one way or another")
        if not daemon.running or self.is_right():
            self.outcomes["right by itself"] += daemon.running
            return not daemon.running
        assert hides, f"not right by itself; {self.world.diagnosis()}"
        self.outcomes[self.bring_back(daemon)] += 1
        return False

    def bring_back(self, daemon):
        """Make all right as far as it needs help; returns what it took, as a text."""
        # A device whose data could not be read is left out, or recorded with gaps,
        # until it is announced again.
        self.world.announce(self.disk)
        with contextlib.suppress(WaitTimeout):
            self._wait_right(daemon, _ANNOUNCED)
            return "right once announced again"
        # What is recorded with gaps is recorded afresh only after a removal; what
        # could not be unmounted at the start is never taken over.
        self.world.send("#remove_dev:sda", "#heart_beat")
        daemon.wait_log("EVENT_DISK_HEART_BEAT", _END)
        self.world.run("umount", "-q", "/dev/sda1", check=False)
        self.world.announce(self.disk)
        self._wait_right(daemon, _HELPED)
        return "right once plugged again"

    def start_after(self, daemon):
        """After an end in order the next start, without a fault, is right; returns its daemon."""
        assert daemon.returncode == 0
        assert any(text in daemon.log() for text in _NO_PIPES)
        assert not self.world.exists(PID_FILE)
        self.outcomes["ended in order, the next start right"] += 1
        daemon = self.world.start_daemon(environ=self.environ)
        self._wait_right(daemon, _HELPED)
        return daemon

    def _wait_right(self, daemon, timeout):
        self.world.wait(lambda: self.is_right() or not daemon.running, timeout,
                        self.world.diagnosis)
        assert daemon.running

    def is_right(self):
        part = self.world.parts().get("sda1")
        return (part and part.free_size > 0 and (part.label, part.fs_type) == ("COLD", "EXT4")
                and self.world.mounted() == {"/dev/sda1": part.path}
                and self.world.disk_num() == "1")

    def _end(self, daemon):
        assert daemon.stop() == 0
