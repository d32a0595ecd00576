"""A router whose disks are pulled at any instant, and what must hold after every round."""

import contextlib
import math
import random
import threading
import time
from collections import namedtuple

from world import Partition, WaitTimeout, add_messages, remove_messages
from world.state import DISK_DB

KERNEL_NAMES = [f"sd{letter}" for letter in "abcdefghij"]
# How the hotplug script's messages reach the daemon.
PATTERNS = ("in order", "late", "reversed", "doubled", "partly lost", "none")
LATEST_MESSAGE = 6
# A pull is as likely at any instant of so many seconds after the plug.
AFTER_PLUG = 12
SHORTEST_GAP, LONGEST_GAP = 0.05, 3
# Removing and mounting six partitions, and the check behind the next rescan, on a busy machine.
SETTLE_SECONDS = 75
SLOW_MOUNT = "/run/world/slow-mount"
# Mounts of one device appear later than the command ends, as those of a userspace filesystem.
_MOUNT_STUB = """
case "$*" in
*" /dev/"*)
    [ -s {slow} ] && read -r device seconds < {slow} || device=none
    case "$*" in *"$device "*) (sleep "$seconds"; exec {real} "$@") & exit 0 ;; esac ;;
esac
exec {real} "$@"
"""

# instant: seconds from the plug, or from the last quiet moment, to the pull
Round = namedtuple("Round", "kind pattern instant story faults")


class PulledRouter:
    """Four disks, each with the directories that it must always have."""

    def __init__(self, world, seed):
        self.world, self.random = world, random.Random(seed)
        self._disks = [
            world.partitioned_disk(Partition("ext4", 1500), Partition("ext4", 1450)),
            world.whole_disk("ext4", 1400),
            world.partitioned_disk(Partition("ext4", 1300)),
            world.whole_disk("ext4", 1200)]
        self._senders, self._story, self._begun = [], [], 0
        self._absent = self._result = None
        # Faults that came to light only after the round that may have caused them.
        self.late_faults = []
        world.start_companion()
        world.tools.stub("mount", _MOUNT_STUB.format(slow=SLOW_MOUNT,
                                                     real=world.tools.real("mount")))
        for disk, name in zip(self._disks, KERNEL_NAMES):
            world.plug(disk, name)
        self._start_first_time()

    def _start_first_time(self):
        """Every disk gets its row, and with it the directories that it must keep."""
        self.daemon = self.world.start_daemon()
        self.world.wait(lambda: len(self.world.parts()) == len(self.world.mounts()) == 5, 90,
                        "five partitions mounted and published")
        mounted = self.world.mounted()
        self._places = [[mounted[f"/dev/{name}"] for name in _mountable(disk)]
                        for disk in self._disks]
        faults = self._settle(self.daemon.mark())
        assert not faults, faults
        self._database = self.world.path(DISK_DB).read_bytes()
        self._rows = self._row_texts()

    # Rounds.

    def pull(self):
        """One disk is plugged, and pulled at an instant of the first seconds."""
        victim = self._one_absent()
        with self._round("pull"):
            self._plug(victim, *self._new_names(1))
            self._sleep_until(self.random.uniform(0, AFTER_PLUG))
            self._pull(victim)
        return self._result

    def bounce(self):
        """One disk is away for a moment and returns, under the same name or another."""
        fresh = self.random.random() < 0.5
        victim = self._one_absent() if fresh else self.random.choice(self._all_plugged())
        with self._round("bounce"):
            if fresh:
                self._plug(victim, *self._new_names(1))
            self._sleep_until(self.random.uniform(0, AFTER_PLUG))
            names = [victim.name] if self.random.random() < 0.5 else self._new_names(1)
            self._away([victim], [victim], names)
        return self._result

    def hub(self):
        """All disks drop at once and return in another order."""
        self._all_plugged()
        with self._round("hub"):
            self._sleep_until(self.random.uniform(0, 8))
            names = [disk.name for disk in self._disks]
            if self.random.random() < 0.5:
                names = self._new_names(len(names))
            order = self.random.sample(self._disks, len(self._disks))
            self._away(self._disks, order, self.random.sample(names, len(order)))
        return self._result

    def wait(self):
        """One disk is pulled while another one's mount is waited for."""
        slow = self._one_absent()
        victim = self.random.choice([disk for disk in self._disks if disk is not slow])
        seconds = self.random.uniform(1, 9)
        fresh = self.random.random() < 0.5
        if fresh:
            self._send(*self.world.pull(victim))
            self._settle_between()
        with self._round("wait"):
            name, other = self._new_names(2)
            device = f"/dev/{name}1" if slow.partitions else f"/dev/{name}"
            self.world.write(SLOW_MOUNT, f"{device} {seconds:.2f}\n")
            mark = self.daemon.mark()
            arrivals = [(slow, name), (victim, other)] if fresh else [(slow, name)]
            for disk, its_name in self.random.sample(arrivals, len(arrivals)):
                self._plug(disk, its_name)
            with contextlib.suppress(AssertionError):
                self.daemon.wait_log(f" {device} /tmp/mountd/", 25, mark)
            self._sleep_until(time.monotonic() - self._begun + self.random.uniform(0, seconds))
            self._pull(victim)
        self.world.path(SLOW_MOUNT).unlink(missing_ok=True)
        return self._result

    @contextlib.contextmanager
    def _round(self, kind):
        self._pattern = self.random.choice(PATTERNS)
        self._story, self._instant, self._begun = [], 0, time.monotonic()
        yield
        for sender in self._senders:
            sender.join()
        self._senders = []
        faults = self._settle(self.daemon.mark()) or self._row_faults()
        self._result = Round(kind, self._pattern, self._instant, "; ".join(self._story), faults)
        if faults:
            self._start_over()

    # Hands.

    def _plug(self, disk, name):
        self.world.plug(disk, name)
        self._note(f"plug {name}")
        if disk is self._absent:
            self._absent = None
        self._tell(self._pattern, add_messages(disk))

    def _pull(self, disk):
        self._instant = time.monotonic() - self._begun
        self._note(f"pull {disk.name}")
        self._absent = disk
        self._tell(self._pattern, self.world.pull(disk))

    def _away(self, gone, back, names):
        """Disks are pulled together and come back one after the other; one script tells of all."""
        self._instant = time.monotonic() - self._begun
        self._note(f"pull {' '.join(disk.name for disk in gone)}")
        messages = [message for disk in gone for message in remove_messages(disk)]
        for disk in gone:
            self.world.pull(disk)
        if self._pattern in ("in order", "doubled"):
            self._tell(self._pattern, messages)
            messages = []
        time.sleep(self.random.uniform(SHORTEST_GAP, LONGEST_GAP))
        for disk, name in zip(back, names):
            self.world.plug(disk, name)
            self._note(f"plug {name}")
            messages += add_messages(disk)
        self._tell(self._pattern, messages)

    def _tell(self, pattern, messages):
        """Messages as the pattern has them; late ones are sent by a thread."""
        delay = 0
        if pattern == "none":
            return
        if pattern == "late":
            delay = self.random.uniform(0.3, LATEST_MESSAGE)
        if pattern == "reversed":
            messages = messages[::-1]
        if pattern == "doubled":
            each = [message for message in messages for _ in range(2)]
            messages = each if self.random.random() < 0.5 else messages * 2
        if pattern == "partly lost":
            messages = [message for message in messages if self.random.random() < 0.5]
        self._note(f"{'tell ' if not delay else f'tell {delay:.2f} s later '}{' '.join(messages)}")
        sender = threading.Timer(delay, self._send, messages)
        sender.start()
        self._senders.append(sender)
        if not delay:
            sender.join()

    def _send(self, *messages):
        # Nobody reads once the daemon has ended, which is seen soon enough.
        with contextlib.suppress(WaitTimeout, OSError):
            self.world.send(*messages, timeout=1)

    def _sleep_until(self, instant):
        time.sleep(max(0, self._begun + instant - time.monotonic()))

    def _note(self, text):
        self._story.append(f"{time.monotonic() - self._begun:.2f} {text}")

    def _new_names(self, count):
        used = {disk.name for disk in self._disks}
        return self.random.sample([name for name in KERNEL_NAMES if name not in used], count)

    # Between rounds.

    def _one_absent(self):
        """The disk that is not plugged; now and then it returns first and another one goes."""
        if self._absent is None or self.random.random() < 0.3:
            self._all_plugged()
            self._absent = self.random.choice(self._disks)
            self._send(*self.world.pull(self._absent))
            self._settle_between()
        return self._absent

    def _all_plugged(self):
        if self._absent is not None:
            self.world.plug(self._absent, *self._new_names(1))
            self._send(*add_messages(self._absent))
            self._absent = None
        self._settle_between()
        return self._disks

    def _settle_between(self):
        faults = self._settle(self.daemon.mark()) or self._row_faults()
        if faults:
            self.late_faults.append(faults)
            self._start_over()

    def _start_over(self):
        """After a fault: everything plugged, the rows as they were, a fresh daemon."""
        world = self.world
        self.daemon.kill()
        world.wait(lambda: not world.read("/proc/1/task/1/children").split()[1:], 20,
                   "the last command")
        for disk in self._disks:
            if disk.name:
                world.pull(disk)
        for entry in world.mounts():
            world.run("umount", "-l", entry.path, check=False)
        world.sh(f"rm -f {DISK_DB}* {SLOW_MOUNT} /tmp/tarn_nas/disk_manager_pid")
        world.path(DISK_DB).write_bytes(self._database)
        for disk, name in zip(self._disks, KERNEL_NAMES):
            world.plug(disk, name)
        self._absent = None
        self.daemon = world.start_daemon()
        faults = self._settle(self.daemon.mark())
        assert not faults, f"not even a fresh start helps: {faults}"

    # What must hold.

    def _expected(self):
        """{device: path} of everything that is plugged."""
        return {f"/dev/{name}": path for disk, paths in zip(self._disks, self._places) if disk.name
                for name, path in zip(_mountable(disk), paths)}

    def _settle(self, mark):
        """Wait until all is as it must be and has outlived a self-check; returns what is not."""
        with contextlib.suppress(WaitTimeout):
            self.world.wait(lambda: not self.daemon.running
                            or (_checked(self.daemon.log_since(mark)) and not self._faults()),
                            SETTLE_SECONDS, "")
        return self._faults()

    def _faults(self):
        if not self.daemon.running:
            return [f"the daemon ended with {self.daemon.returncode}"]
        expected = self._expected()
        mounts = sorted((entry.dev, entry.path) for entry in self.world.mounts())
        faults = []
        if mounts != sorted(expected.items()):
            faults.append(f"mounted {mounts}, not {sorted(expected.items())}")
        published = {f"/dev/{name}": part.path for name, part in self.world.parts().items()}
        if published != expected:
            faults.append(f"disk.json has {published}, not {expected}")
        return faults

    def _row_faults(self):
        rows = self._row_texts()
        return [] if rows == self._rows else [f"rows {rows}, not {self._rows}"]

    def _row_texts(self):
        """The rows without the column that follows every mount and unmount."""
        columns = ("uid", "dev_name", "disk_name", "mount_path")
        return sorted(tuple(row[name] for name in columns) for row in self.world.db_rows())


def _mountable(disk):
    return [disk.name] if disk.root_fs else [disk.part_name(part) for part in disk.partitions]


def _checked(log):
    """True when a self-check that began within this log is over, and a cycle without events."""
    cycles = log.split("no event ...")[:-1]
    return any(cycle.count("mount dev num = ") >= 2 for cycle in cycles)


def histogram(instants):
    """How many of the instants fell into each second."""
    counts = [0] * (math.floor(max(instants, default=0)) + 1)
    for instant in instants:
        counts[math.floor(instant)] += 1
    return " ".join(f"{second}s:{count}" for second, count in enumerate(counts))
