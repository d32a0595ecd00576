"""Every allocation in SQLite, in cJSON and of the daemon itself fails."""

import pytest
from shared.allocations import CJSON, OWN, SQLITE, Allocations
from shared.preload import install
from faults.rig import Rig
from faults.starting import Starts
from shared.strace import Strace

from world import Partition
from world.state import DISK_DB, SCRATCH

# A cycle of a tenth of a second: the sweeps take many.
HASTE = 30
# Swap has no mount command: such a partition is looked up in the database and entered
# there in every mount pass, with no wait for a mount.
SWAPS = 8
SWEEP_END = 240
# Some twenty cycles, and a little for a machine with other work.
BY_ITSELF = 2 + 4
CLEAN = 6
NEVER = 1_000_000


@pytest.fixture
def prepared(world, start_daemon, libraries):
    """(world, switch, environment) of a daemon whose allocations can fail."""
    environ = install(world, libraries, "haste", "alloc", haste=HASTE)
    return world, Allocations(world), environ


def wait_swept(world, daemon, allocations, meanwhile=lambda: None):
    """Wait until the sweep has reached operations that end before the allocation to fail."""
    def swept():
        assert daemon.running, f"ended with {daemon.returncode}"
        meanwhile()
        last = allocations.operations()[-CLEAN:]
        return len(last) == CLEAN and not any(operation.failed for operation in last)
    world.wait(swept, SWEEP_END, lambda: f"the end of the sweep; {allocations.operations()[-5:]}")
    allocations.disarm()
    done = allocations.operations()
    assert any(operation.failed for operation in done), "nothing failed at all"
    return done


@pytest.mark.needs_fs("ext4")
@pytest.mark.parametrize("from_on", [False, True], ids=["one", "all-from-it-on"])
def test_the_publication_survives_each_allocation_that_fails_in_it(prepared, count, from_on):
    world, allocations, environ = prepared
    rig = Rig(world, environ=environ)
    allocations.arm(CJSON, from_on=from_on)
    done = wait_swept(world, rig.daemon, allocations)
    count(f"cJSON  {'all from the Nth on' if from_on else 'the Nth'}",
          sum(operation.failed for operation in done))
    assert [operation for operation in done if operation.left] == []
    rig.wait_right(BY_ITSELF)
    rig.check()
    assert rig.daemon.stop() == 0


def swap_disks(world):
    return [world.partitioned_disk(*[Partition("swap", 1001 + number, f"S{number}")
                                     for number in range(SWAPS)]) for _ in range(2)]


@pytest.mark.parametrize("from_on", [False, True], ids=["one", "all-from-it-on"])
@pytest.mark.parametrize("fresh", [False, True], ids=["known", "fresh"])
def test_the_database_survives_each_allocation_that_fails_in_it(prepared, count, from_on, fresh):
    world, allocations, environ = prepared
    for disk, name in zip(swap_disks(world), ("sda", "sdb"), strict=True):
        world.plug(disk, name)
    world.start_companion()
    daemon = world.start_daemon(environ=environ)
    world.wait(lambda: len(world.db_rows()) == 2 * SWAPS, 30, "a row for each partition")
    before = world.db_rows()

    def forget_rows():
        fault = world.db_fault()
        assert not fault, fault
        if fresh:
            world.path(DISK_DB).unlink(missing_ok=True)

    # Reading a row is one operation and writing it another, so each number comes twice
    # and more, with the table or the row there already and not.
    allocations.arm(SQLITE, repeat=4, from_on=from_on)
    done = wait_swept(world, daemon, allocations, forget_rows)
    assert [operation for operation in done if operation.left] == []
    count(f"SQLite {'all from the Nth on' if from_on else 'the Nth'}, "
          f"{'no rows yet' if fresh else 'rows there'}",
          sum(operation.failed for operation in done))
    world.wait(lambda: len(world.db_rows()) == 2 * SWAPS, 30, "all rows again")
    assert not world.db_fault()
    if not fresh:
        assert world.db_rows() == before
    assert daemon.running


def test_a_database_that_cannot_be_opened_keeps_no_memory(prepared):
    world, allocations, environ = prepared
    world.path(DISK_DB).mkdir(parents=True)
    world.plug(swap_disks(world)[0], "sda")
    world.start_companion()
    daemon = world.start_daemon(environ=environ)
    # Counted, and none fails.
    allocations.arm(SQLITE, first=NEVER, step=0)
    world.wait(lambda: len(allocations.operations()) > 2 * SWAPS, 30, "a pass over the partitions")
    allocations.disarm()
    assert "open err, db = /etc/config/tarn_nas/disk.db" in daemon.log()
    assert [operation for operation in allocations.operations() if operation.left] == []
    assert daemon.running


@pytest.mark.needs_fs("ext4")
def test_memory_that_stays_short_is_survived_in_every_library(
        world, start_daemon, libraries, count):
    environ = install(world, libraries, "haste", "alloc")
    allocations = Allocations(world)
    rig = Rig(world, environ=environ)
    for kind, name in ((SQLITE, "SQLite"), (CJSON, "cJSON")):
        allocations.arm(kind, step=0, from_on=True)
        rig.busy_cycle()
        allocations.disarm()
        failed = sum(operation.failed for operation in allocations.operations())
        assert failed > 0
        count(f"{name} all of a cycle", failed)
        rig.check()
    assert rig.daemon.stop() == 0


@pytest.mark.needs_fs("ext4")
def test_own_allocations_that_fail_in_a_cycle_are_survived(
        world, start_daemon, libraries, count, long_form):
    environ = install(world, libraries, "haste", "alloc")
    allocations = Allocations(world)
    rig = Rig(world, environ=environ)
    steps = (1, 2, 3, 5, 7) if long_form else (1, 2, 3)
    for step in steps:
        for first in range(1, step + 1):
            allocations.arm(OWN, first=first, every=step)
            rig.busy_cycle()
            allocations.disarm()
            assert allocations.own_failed > 0
            count("own    every so many-th of a cycle", allocations.own_failed)
            rig.check()
    assert rig.daemon.stop() == 0


@pytest.mark.needs_fs("ext4")
def test_memory_for_what_cannot_be_read_is_given_back(world, start_daemon, libraries, count):
    environ = install(world, libraries, "haste", "alloc")
    allocations = Allocations(world)
    rig = Rig(world, environ=environ)
    for name, error in (("read", "EIO"), ("openat", "EMFILE"), ("newfstatat", "ENOMEM")):
        # Counted, and none fails.
        allocations.arm(OWN, first=NEVER)
        with Strace(rig.daemon, [name], f"error={error}:when=1+2", SCRATCH) as strace:
            rig.busy_cycle(lambda: strace.injected > 0)
        rig.answer()
        assert allocations.own_left == 0
        allocations.disarm()
        assert strace.injected > 0
        count(f"files   {name} {error}", strace.injected)
        rig.check()
    assert rig.daemon.stop() == 0


@pytest.mark.needs_fs("ext4")
@pytest.mark.parametrize("kind", [SQLITE, CJSON, OWN], ids=["sqlite", "cjson", "own"])
def test_a_start_without_memory_ends_in_order_or_is_right_once_there_is_some(
        world, start_daemon, libraries, count, outcome, kind):
    starts = Starts(world, install(world, libraries, "haste", "alloc"))
    allocations = Allocations(world)
    patterns = [(first, every) for every in (1, 2, 3) for first in range(1, every + 1)]
    for first, every in patterns if kind == OWN else [(1, 1)]:
        daemon = starts.held()
        allocations.arm(kind, first=first, every=every, step=0, from_on=kind != OWN)
        daemon.release()
        world.wait(lambda: "no event ..." in daemon.log() or not daemon.running, 30, "a cycle")
        allocations.disarm()
        failed = allocations.own_failed + sum(done.failed for done in allocations.operations())
        assert failed > 0
        count("start   memory", failed)
        if not daemon.running or starts.settle(daemon, True):
            daemon = starts.start_after(daemon)
        assert not world.db_fault()
        assert daemon.stop() == 0
    for what, times in starts.outcomes.items():
        outcome(what, times)
