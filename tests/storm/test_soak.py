"""Thousands of events of all kinds, and nothing grows."""

import random
import re
import time
from collections import Counter

import pytest
from shared.footprint import Footprint
from shared.moments import quiet_moment
from storm.stormy_router import SCRATCH

from world import Partition
from world.built import RELEASE, STATIC, why_not

pytestmark = pytest.mark.needs_fs("ext4")

RELEASE_WORLDS, STATIC_WORLDS = 6, 2
# For each world once it is warm; the six of the release binary have 10,000 in the long form.
EVENTS = {"short": 70, "long": 1700}
KINDS = ["ADD", "REMOVE_DEV", "REMOVE_DISK", "SAFE_REMOVE", "HEART_BEAT"]
# Passes through all kinds of rounds before anything is measured. musl's allocator keeps, after about
# eighteen rounds, blocks that it gave back before: 8 KiB, once.
WARM_UP = {RELEASE: 1, STATIC: 3}
# Nothing of a round survives it, so what is held at its end may not depend on how many there were.
# An allocator that has met its largest round needs no more; one page is left for its bookkeeping.
# A leak shows when it has filled the gaps that the first rounds left: hundreds of bytes a round do
# so in the long form.
# Pages of the program and of libraries are dropped and read again as the kernel likes, and the
# proportional size follows who else has them mapped: it is printed, but says nothing of growth.
UNREST_KIB = {"private_dirty": 4, "heap": 4, "mapped": 0, "rss": 64}
PROGRAMS = [pytest.param(program, number, id=f"{name}-{number}")
            for name, program, count in (("release", RELEASE, RELEASE_WORLDS),
                                         ("static", STATIC, STATIC_WORLDS))
            for number in range(count)]
# An empty line is no event, but ends the loop's wait for one.
NO_EVENT = ""


class Rounds:
    """Disks that come and go, each round leaving everything as it was."""

    def __init__(self, world, daemon, seed):
        self.world, self.daemon, self.random = world, daemon, random.Random(seed)
        self._disk = world.partitioned_disk(Partition("ext4", 1200, "DATA"))
        self._stick = world.whole_disk("ext4", 16, label="STICK")
        self._rounds = [self._mounted, self._mounted, self._safely_removed, self._announced,
                        self._announced, self._announced, self._announced_stick, self._unknown]

    def events(self):
        """How many events of each kind the daemon has taken so far."""
        return Counter(re.findall(r"===> get event = EVENT_DISK_(\w+)", self.daemon.log()))

    def one_of_each(self):
        for each in self._rounds:
            self._run(each)

    def one(self):
        self._run(self.random.choice(self._rounds))

    def _run(self, one):
        one(f"sd{self.random.choice('abcd')}")
        quiet_moment(self.world, self.daemon)
        assert self.world.mounts() == []

    def _mount(self, disk, name):
        self.world.hotplug(disk, name)
        self.world.send(NO_EVENT)
        quiet_moment(self.world, self.daemon)
        assert len(self.world.mounts()) == 1

    def _mounted(self, name):
        self._mount(self._disk, name)
        if self.random.random() < 0.5:
            directory = self.world.mounts()[0].path.rsplit("/", 1)[1]
            self.world.send(f"#remove_disk:{directory}", pipe="remove")
            quiet_moment(self.world, self.daemon)
        self.world.hotunplug(self._disk, surprise=self.random.random() < 0.1)

    def _safely_removed(self, name):
        self._mount(self._stick, name)
        self.world.safe_remove()
        quiet_moment(self.world, self.daemon)
        self.world.pull(self._stick, surprise=False)

    def _announced(self, name):
        self.world.hotplug(self._disk, name)
        self.world.send(f"#remove_dev:{name}1", f"#remove_dev:{name}")
        quiet_moment(self.world, self.daemon)
        self.world.pull(self._disk, surprise=False)

    def _announced_stick(self, name):
        self.world.hotplug(self._stick, name)
        self.world.send(f"#remove_dev:{name}", "#remove_disk:disk9_part9")
        quiet_moment(self.world, self.daemon)
        self.world.pull(self._stick, surprise=False)

    def _unknown(self, name):
        self.world.send(f"#add:{name}", f"#add:{name}1", "#heart_beat", f"#remove_dev:{name}",
                        "#remove_disk:disk1_part1", "#nonsense", "junk")


def quarters(samples):
    """The largest values of the second and of the last quarter."""
    step = len(samples) // 4
    return Footprint.largest(samples[step:2 * step]), Footprint.largest(samples[3 * step:])


def leftovers(world):
    """Everything outside the process that a round could leave."""
    tmp = sorted(entry.name for entry in world.path("/tmp").iterdir())
    return {"tmp": tmp, "mounts": world.mounts("/"), "rows": len(world.db_rows()),
            "scratch": [path for path in SCRATCH if world.exists(path)]}


@pytest.mark.parametrize(("program", "number"), PROGRAMS)
def test_neither_memory_nor_descriptors_grow_with_the_events(
        make_world, request, long_form, figure, program, number):
    if reason := why_not(program):
        pytest.skip(reason)
    seed = request.config.getoption("--seed") or 40_000 + number
    figure("seed", seed)
    world = make_world(program=program)
    daemon = world.start_daemon()
    rounds = Rounds(world, daemon, seed)
    for _ in range(WARM_UP[program]):
        rounds.one_of_each()
    before, samples = leftovers(world), []
    enough = rounds.events().total() + EVENTS["long" if long_form else "short"]
    while rounds.events().total() < enough:
        rounds.one()
        samples.append(Footprint.of(daemon.outer_pid))
    taken = rounds.events()
    early, late = quarters(samples)
    figure("events", f"{taken.total()} {dict(taken)} in {len(samples)} rounds")
    figure("first", samples[0])
    figure("second quarter, largest", early)
    figure("last quarter, largest", late)
    figure("last", samples[-1])
    figure("log, bytes for an event", daemon.mark() // taken.total())

    assert set(taken) == set(KINDS)
    assert leftovers(world) == before
    assert before["scratch"] == [] and before["rows"] == 2
    assert late.descriptors == early.descriptors == samples[0].descriptors
    for name, unrest in UNREST_KIB.items():
        assert getattr(late, name) <= getattr(early, name) + unrest, name
    assert daemon.stop() == 0
    # The end of the world fails when the kernel keeps a loop device attached.


def bytes_an_hour(daemon, cycles):
    """Growth of the log over so many cycles without an event, for an hour."""
    daemon.wait_idle_cycles(1)
    mark, begun = daemon.mark(), time.monotonic()
    daemon.wait_idle_cycles(cycles)
    return round((daemon.mark() - mark) / (time.monotonic() - begun) * 3600)


def test_the_log_of_an_idle_daemon_has_a_known_volume(make_world, long_form, figure):
    world = make_world()
    if not world.program.exists():
        pytest.skip(f"{world.program} is not built")
    world.start_companion()
    world.plug(world.partitioned_disk(Partition("ext4", 1200, "DATA")), "sda")
    daemon = world.start_daemon()
    world.wait(lambda: "sda1" in world.parts(), 40, "sda1 in disk.json")
    # From 30 s after the last change on, the status files are written in each cycle.
    daemon.wait_idle_cycles(11)
    volume = bytes_an_hour(daemon, 80 if long_form else 8)
    figure("log of an hour with one mounted disk, bytes", volume)
    assert 100_000 < volume < 4_000_000
