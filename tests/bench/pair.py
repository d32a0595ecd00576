"""A daemon's world and its twin, in which the daemon's commands are run again."""

import os
import time
from dataclasses import dataclass
from pathlib import Path

from bench.floor import announced, replay
from bench.waits import Waits
from shared.moments import quiet_moment

from world import Partition, World
from world.state import DISK_JSON

_PATIENCE = 400
_POLL = 0.001
_PART_MIB = 1050


@dataclass
class Sample:
    """Seconds of one event."""

    total: float
    waits: float
    commands: float
    own_cpu: float

    @property
    def ratio(self):
        """To the floor: waits and commands."""
        return self.total / (self.waits + self.commands)

    @property
    def own(self):
        """What is neither wait nor command."""
        return self.total - self.waits - self.commands


class Pair:
    """`disks` disks of `parts` ext4 partitions each, in both worlds."""

    def __init__(self, program, disks, parts):
        self.waits = Waits(program)
        self.world, self.twin = World(program=program), World(program=program)
        self.world.start_companion()
        self.twin.start_companion()
        self._shape = (disks, parts)
        self._disks = self._make(self.world)
        self._twins = self._make(self.twin)
        self.daemon = self.world.start_daemon()
        # The directories that the daemon makes at its start; its commands redirect into some.
        self.twin.sh("mkdir -p /tmp/tarn_nas /tmp/mountd /etc/config/tarn_nas")

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.world.close()
        self.twin.close()

    @property
    def names(self):
        """Device names of all partitions."""
        disks, parts = self._shape
        return {f"{self._name(disk)}{part + 1}" for disk in range(disks) for part in range(parts)}

    def plug(self):
        """From the first message to the publication of all partitions."""
        self._settle()
        self._plug_all(self.world, self._disks)
        sample = self._measure(lambda: [self.world.announce(disk) for disk in self._disks],
                               self.names, self.waits.work_due)
        self._plug_all(self.twin, self._twins)
        return self._with_floor(*sample)

    def start(self):
        """From the start of the process to the publication; the disks were mounted before."""
        self.daemon.stop()
        # What was published before must not be taken for the new.
        self.world.path(DISK_JSON).unlink()
        self.daemon = self.world.start_daemon(held=True)
        return self._with_floor(*self._measure(self.daemon.release, self.names, 0, whole=True))

    def unplug(self):
        """From the first message, all disks gone, to the publication of none."""
        self._settle()
        messages = [message for disk in self._disks for message in self.world.pull(disk)]
        sample = self._measure(lambda: self.world.send(*messages), set(), self.waits.work_due)
        for disk in self._twins:
            self.twin.pull(disk)
        return self._with_floor(*sample)

    def _make(self, world):
        disks, parts = self._shape
        return [world.partitioned_disk(*(Partition("ext4", _PART_MIB) for _ in range(parts)))
                for _ in range(disks)]

    @staticmethod
    def _name(number):
        return f"sd{chr(ord('a') + number)}"

    def _plug_all(self, world, disks):
        for number, disk in enumerate(disks):
            world.plug(disk, self._name(number))

    def _settle(self):
        """Everything done, and a whole wait to come."""
        self.daemon.wait_idle_cycles(1)
        quiet_moment(self.world, self.daemon)
        self.world.wait(self.daemon.waits_for_events, 30, "the daemon's wait")

    def _measure(self, act, expected, silence, whole=False):
        """(seconds, log of the event, ordered silence, own processor seconds)."""
        mark = 0 if whole else self.daemon.mark()
        cpu = 0 if whole else own_cpu(self.daemon)
        begun = time.monotonic()
        act()
        ended = self._wait_published(expected)
        used = own_cpu(self.daemon) - cpu
        log = self.daemon.log_since(mark)
        # What follows in the same cycle is no part of the event.
        log = log.rpartition("===> update = 1\n")[0] or log
        return ended - begun, log, silence, used

    def _wait_published(self, expected):
        path, seen = self.world.path(DISK_JSON), None
        deadline = time.monotonic() + _PATIENCE
        while time.monotonic() < deadline:
            now, status = time.monotonic(), _status(path)
            if status is not None and status != seen:
                seen = status
                if set(self.world.parts()) == expected:
                    return now
            time.sleep(_POLL)
        raise TimeoutError(f"{sorted(expected)} were not published:\n{self.world.diagnosis()}")

    def _with_floor(self, total, log, silence, used):
        # What the daemon still does in that cycle would slow its own floor down.
        self.world.wait(self.daemon.waits_for_events, 30, "the end of the daemon's cycle")
        commands = replay(self.twin, announced(log))
        return Sample(total, silence + self.waits.of_mounts(log), commands, used)


def own_cpu(daemon):
    """Processor seconds of the daemon itself, without its commands."""
    return int(Path(f"/proc/{daemon.outer_pid}/schedstat").read_text().split()[0]) / 1e9


def commands_cpu(daemon):
    """Processor seconds of the commands that it has waited for; in steps of the kernel's ticks."""
    fields = Path(f"/proc/{daemon.outer_pid}/stat").read_text().rsplit(")", 1)[1].split()
    return (int(fields[13]) + int(fields[14])) / os.sysconf("SC_CLK_TCK")


def _status(path):
    try:
        status = path.stat()
    except FileNotFoundError:
        return None
    return status.st_ino, status.st_mtime_ns
