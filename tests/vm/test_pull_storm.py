"""Real USB sticks pulled at any instant: none of them loses its directory.

What the private world cannot show: the kernel's own order of nodes, entries and messages, names that a mount
keeps taken, and filesystems whose device is really gone.
"""

import base64
import contextlib
import random
import sqlite3
import time
from collections import Counter

import pytest

from vm.daemon import HOTPLUG
from vm.disks import Part
from vm.vm import VmError
from world.state import DISK_DB, MOUNT_BASE

AFTER_PLUG = 12
SHORTEST_GAP, LONGEST_GAP = 0.05, 3
ROUNDS = {"pull": (6, 40), "bounce": (4, 24), "hub": (3, 12)}
SCRIPT, KEPT = f"/{HOTPLUG}", "/run/hotplug.kept"
# What becomes of the script that sends the messages; each begins with the script as it came.
PATTERNS = {
    "in order": "",
    "late": f"(echo 'sleep 1'; cat {KEPT}) >{SCRIPT}",
    "doubled": f"cp {KEPT} {SCRIPT}.again",
    "partly lost": f"(echo 'case $(cat /proc/uptime) in *[02468]) return ;; esac'; cat {KEPT}) >{SCRIPT}",
    "none": f"rm {SCRIPT}",
}


class StickStorm:
    """Four sticks, each partition known by its UUID and its one directory."""

    def __init__(self, vm, daemon, box, seed):
        self.vm, self.daemon, self.random = vm, daemon, random.Random(seed)
        self.images = {
            "first": box.disk("first", "dos", [Part("vfat", 1500, "ONE"), Part("ext4", 1450, "TWO")]),
            "second": box.whole("second", Part("ext4", 1400, "THREE")),
            "third": box.disk("third", "dos", [Part("ext4", 1300, "FOUR")]),
            "fourth": box.whole("fourth", Part("exfat", 1200, "FIVE"))}
        vm.check(f"cp {SCRIPT} {KEPT}")
        daemon.start()
        # One after the other, which tells whose directories appear.
        self.homes = {}
        for name, count in zip(self.images, (2, 3, 4, 5)):
            self.plug(name)
            daemon.wait_until(lambda: len(self.published()) == len(daemon.mounts()) == count, f"{count} mounts")
            known = {uid for homes in self.homes.values() for uid in homes}
            self.homes[name] = {uid: place for uid, place in self.published().items() if uid not in known}
        self.rows = self.read_rows()
        self.absent = None

    def pull_round(self):
        name = self.absent or self.random.choice(list(self.images))
        if not self.absent:
            self.vm.pull_usb(name)
            self.settle(self.images.keys() - {name})
        self.plug(name)
        instant = self.random.uniform(0, AFTER_PLUG)
        time.sleep(instant)
        self.vm.pull_usb(name)
        self.absent = name
        self.settle(self.images.keys() - {name})
        return instant

    def bounce_round(self):
        self.plug_absent()
        name = self.random.choice(list(self.images))
        return self.away([name])

    def hub_round(self):
        self.plug_absent()
        return self.away(self.random.sample(list(self.images), len(self.images)))

    def away(self, names):
        instant = self.random.uniform(0, AFTER_PLUG)
        time.sleep(instant)
        for name in names:
            self.vm.pull_usb(name)
        time.sleep(self.random.uniform(SHORTEST_GAP, LONGEST_GAP))
        for name in self.random.sample(names, len(names)):
            self.plug(name)
        self.settle(self.images.keys())
        return instant

    def plug(self, name):
        self.vm.plug_usb(name, self.images[name])

    def plug_absent(self):
        if self.absent:
            self.plug(self.absent)
            self.absent = None
        self.settle(self.images.keys())

    def use(self, pattern):
        self.vm.check(f"cp {KEPT} {SCRIPT}; rm -f {SCRIPT}.again; {PATTERNS[pattern] or ':'}")

    def published(self):
        status = self.daemon.status() or {"disk": []}
        return {part["uid"]: part["disk_name"] for disk in status["disk"] for part in disk["part"]}

    def settle(self, plugged):
        """Everything at its place after a look and a check that began now; the rows as they were."""
        begun = self.checks()
        expected = {uid: place for name in plugged for uid, place in self.homes[name].items()}

        def is_settled():
            assert "dev not find" not in self.fatal_end(), self.fatal_end()
            if self.checks() < begun + 3 or self.published() != expected:
                return False
            mounts = self.vm.check("cat /proc/mounts")
            count = sum(f" {MOUNT_BASE}/" in line for line in mounts.splitlines())
            return count == len(expected) and set(self.daemon.mounts()) == set(expected.values())
        self.daemon.wait_until(is_settled, expected)
        assert self.read_rows() == self.rows

    def checks(self):
        return int(self.vm.run("grep -c 'mount dev num = ' /tmp/daemon.log").output or 0)

    def fatal_end(self):
        """The last lines of a daemon that had itself restarted, else nothing."""
        if "tarn_nas_diskmanager restart" not in self.daemon.services():
            return ""
        return self.vm.run("grep -B 3 'manager work again' /tmp/daemon.log").output + "dev not find"

    def read_rows(self):
        """The rows without the column that follows every mount and unmount."""
        content = base64.b64decode(self.vm.check(f"base64 {DISK_DB}"))
        with contextlib.closing(sqlite3.connect(":memory:")) as database:
            database.deserialize(content)
            return sorted(database.execute("select uid, dev_name, disk_name, mount_path from disk"))


@pytest.mark.takes_minutes
@pytest.mark.parametrize("kind", ROUNDS)
def test_no_pull_costs_a_stick_its_directory(daemon_vm, daemon, box, request, long_form, figure, kind):
    seed = request.config.getoption("--seed") or 70_000
    storm = StickStorm(daemon_vm, daemon, box, seed)
    rounds, faults, instants = ROUNDS[kind][long_form], [], []
    patterns = Counter()

    try:
        for _ in range(rounds):
            pattern = storm.random.choice(list(PATTERNS))
            storm.use(pattern)
            patterns[pattern] += 1
            instants.append(round(getattr(storm, f"{kind}_round")(), 1))
    except (AssertionError, VmError) as error:
        faults.append(f"{pattern}: {error}")
    finally:
        storm.use("in order")

    figure("seed", seed)
    figure("rounds", f"{len(instants)} of {rounds} without a fault")
    figure("patterns", dict(patterns))
    figure("pulled at", sorted(instants))
    assert not faults, faults
