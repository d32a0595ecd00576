"""A hundred rounds of plug and pull, and a thousand messages, without a leak."""

from pathlib import Path

import pytest
from shared.moments import quiet_moment

from world import Partition

# A mount is looked at 2 s after its command at the earliest, and that wait cannot be shortened
# from outside.  So four rounds of ten really mount and are pulled like a stick; in the others the
# same disk is announced and removed before the mount pass.  An empty line is no event and ends
# the 3 s wait for one, which spares that part of a round.
#
# A heap that gives every freed byte back at once shows a leak at the next page boundary; as it is
# by default it grows by pages for a while that only its own bookkeeping fills.
ROUNDS = 100
WARM_UP = 10
NO_EVENT = ""
COMPACT_HEAP = {"GLIBC_TUNABLES": ":".join(f"glibc.malloc.{setting}" for setting in (
    "tcache_count=0", "mxfast=0", "trim_threshold=1", "top_pad=0"))}


def mounted_round(world, daemon, disk, number):
    world.hotplug(disk, "sda")
    world.send(NO_EVENT)
    quiet_moment(world, daemon)
    assert world.mounted() == {"/dev/sda1": "/tmp/mountd/disk1_part1"}
    world.hotunplug(disk, surprise=number % 20 == 0)
    quiet_moment(world, daemon)
    assert world.mounted() == {}


def announced_round(world, daemon, disk):
    world.plug(disk, "sda")
    world.announce(disk)
    world.send("#remove_dev:sda1", "#remove_dev:sda")
    quiet_moment(world, daemon)
    world.pull(disk, surprise=False)


def run_rounds(world, daemon, disk, count):
    for number in range(count):
        if number % 10 < 4:
            mounted_round(world, daemon, disk, number)
        else:
            announced_round(world, daemon, disk)


def own_memory_kib(daemon):
    """Memory that the daemon has written to: heap, stack, data.  Pages of the program and of the
    libraries come and go as the kernel likes."""
    rollup = Path(f"/proc/{daemon.outer_pid}/smaps_rollup").read_text()
    return int(next(line for line in rollup.splitlines() if line.startswith("Anonymous:")).split()[1])


def footprint(world, daemon):
    """All that could be leaked."""
    scratch = sorted(entry.name for entry in world.path("/tmp").iterdir())
    children = Path(f"/proc/{daemon.outer_pid}/task/{daemon.outer_pid}/children").read_text()
    return {"memory": own_memory_kib(daemon), "descriptors": daemon.fds(), "tmp": scratch,
            "mounts": world.mounts("/"), "children": children,
            "rows": [row["mountd"] for row in world.db_rows()]}


@pytest.mark.takes_minutes
@pytest.mark.needs_fs("ext4")
def test_a_hundred_rounds_of_plug_and_pull_leak_no_mount_descriptor_or_byte(world, start_daemon):
    daemon = start_daemon(environ=COMPACT_HEAP)
    disk = world.partitioned_disk(Partition("ext4", 1200, "DATA"))
    run_rounds(world, daemon, disk, WARM_UP)
    before, rss = footprint(world, daemon), daemon.rss_kib()
    run_rounds(world, daemon, disk, ROUNDS)

    assert footprint(world, daemon) == before
    assert before["rows"] == ["no"]
    assert daemon.rss_kib() - rss < 64
    world.wait(lambda: world.disk_num() in ("0", None), 30, "an empty inventory")


def send_all_kinds(world, daemon, count):
    kinds = ("#heart_beat", "#nonsense", "junk", NO_EVENT, "#add", "#add:" + "x" * 60,
             "#add:sdx;#heart_beat", "#remove_disk:disk9_part9", "#remove_dev:sdx", "#add:a/b")
    for number in range(count):
        world.send(kinds[number % len(kinds)])
        if number % 100 == 99:
            quiet_moment(world, daemon)


def test_a_thousand_messages_of_every_kind_leak_no_descriptor_or_byte(world, start_daemon):
    daemon = start_daemon(environ=COMPACT_HEAP)
    send_all_kinds(world, daemon, 100)
    before = footprint(world, daemon)
    send_all_kinds(world, daemon, 1000)
    assert footprint(world, daemon) == before
