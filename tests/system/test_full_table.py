"""The table at its limits: 16 disks of 8 partitions, 16 rescan names, 16 mounts."""

import os
import string

import pytest

from world import Partition
from world.state import DISK_JSON

MAX_DISKS = 16
MAX_PARTS = 8
SECTORS_PER_MIB = 2048
SCSI_MAJOR = 8

# Disks that are made of /sys entries alone.  Their type has no mount command, so that no pass
# waits for a mount; everything that is not such a disk goes to the real program.
BLKID = """
for word; do device=$word; done
case "$device" in
/dev/sd?) [ -e "/sys/block/${{device#/dev/}}" ] && echo "$device: PTUUID=\\"disk\\" PTTYPE=\\"gpt\\"" ;;
/dev/sd?*) echo "$device: UUID=\\"uid-${{device#/dev/}}\\" TYPE=\\"swap\\"" ;;
*) exec {real} "$@" ;;
esac
"""


class PaperDisks:
    """Disks of a world that have /sys entries and a blkid line, no more."""

    def __init__(self, world):
        self._world = world
        self._minors = iter(range(1 << 20))
        world.tools.stub("blkid", BLKID.format(real=world.tools.real("blkid")))

    def add(self, name, parts):
        size = (parts + 1) * 2000 * SECTORS_PER_MIB
        self._world.sysfs.add_disk(name, size, self._devno())
        for number in range(1, parts + 1):
            self.add_part(name, number, 2000 - number)

    def add_part(self, name, number, size_mib=1900):
        self._world.sysfs.add_partition(name, f"{name}{number}", number, 2048,
                                        size_mib * SECTORS_PER_MIB, self._devno())

    def remove(self, name):
        for device in reversed([each for each in self._world.sysfs.names()
                                if each.startswith(name)]):
            self._world.sysfs.remove(device)

    def in_listed_order(self):
        """Names of the disks as the directory lists them, which is how the daemon meets them."""
        return [entry.name for entry in os.scandir(self._world.path("/sys/block"))
                if entry.name.startswith("sd")]

    def _devno(self):
        return os.makedev(SCSI_MAJOR, next(self._minors))


def disk_names(count):
    return [f"sd{letter}" for letter in string.ascii_lowercase[:count]]


def published_devices(world):
    """{disk: sorted partitions} of disk.json."""
    found = {}
    for part in world.parts().values():
        found.setdefault(part.dev_name[:3], []).append(part.dev_name)
    return {disk: sorted(parts) for disk, parts in found.items()}


def all_parts_of(names):
    return {name: [f"{name}{number}" for number in range(1, MAX_PARTS + 1)] for name in names}


def assert_table(world, names):
    """The document is whole and holds exactly these disks with all their partitions."""
    document = world.disk_json()
    assert document["disk_number"] == len(document["disk"]) == len(names)
    assert [disk["part_num"] for disk in document["disk"]] == [MAX_PARTS] * len(names)
    assert published_devices(world) == all_parts_of(names)
    assert world.disk_num() == str(len(names))
    directories = [part.disk_name for part in world.parts().values()]
    assert sorted(directories) == sorted(f"disk{disk}_part{part}"
                                         for disk in range(1, len(names) + 1)
                                         for part in range(1, MAX_PARTS + 1))


def wait_republished(world, daemon):
    """Wait for a publication after everything that has been sent so far."""
    world.path(DISK_JSON).unlink()
    world.wait(world.disk_json, 90, "a new disk.json")


@pytest.mark.takes_minutes
def test_a_full_table_refuses_a_ninth_partition_and_a_seventeenth_disk_and_stays_as_it_is(
        world, start_daemon):
    paper = PaperDisks(world)
    for name in disk_names(MAX_DISKS + 1):
        paper.add(name, MAX_PARTS)
    *held, extra = paper.in_listed_order()
    daemon = start_daemon()
    world.wait(lambda: world.disk_json() is not None, 90, "the first publication")
    assert daemon.log().count("disk sets is full") == 1
    assert_table(world, held)
    before = world.disk_json()

    mark = daemon.mark()
    paper.add_part(held[3], MAX_PARTS + 1)
    world.send(f"#add:{held[3]}9")
    line = daemon.wait_log("sub part full, root dev name = ", 60, since=mark)
    assert line.startswith("Warning[")
    assert line.endswith(f"root dev name = {held[3]}, sub dev = {held[3]}9")
    mark = daemon.mark()
    world.send(f"#add:{extra}", f"#add:{extra}1")
    daemon.wait_log("disk sets is full", 60, since=mark)
    daemon.wait_log(f"not find disk obj, root dev name = {extra}", 60, since=mark)
    wait_republished(world, daemon)
    assert world.disk_json() == before

    # One goes, and the one that had no room takes its entry and its number.
    gone = held[5]
    freed = {part.disk_name for part in world.parts().values() if part.dev_name.startswith(gone)}
    world.send(f"#remove_dev:{gone}")
    world.wait(lambda: len(world.tools.service_calls()) == 8, 60, "the services' restart")
    paper.remove(gone)
    world.send(f"#add:{extra}")
    world.wait(lambda: extra in published_devices(world), 90, "the extra disk in disk.json")
    wait_republished(world, daemon)
    assert_table(world, [name for name in held if name != gone] + [extra])
    assert {part.disk_name for part in world.parts().values()
            if part.dev_name.startswith(extra)} == freed
    assert daemon.running


@pytest.mark.takes_minutes
def test_a_full_rescan_list_that_shrinks_offers_an_empty_name_which_harms_nothing(
        world, start_daemon):
    paper = PaperDisks(world)
    names = disk_names(MAX_DISKS)
    for name in names:
        paper.add(name, 1)
    daemon = start_daemon()
    world.wait(lambda: world.disk_num() == "16", 60, "16 disks")
    daemon.wait_rescan()
    mark = daemon.mark()
    paper.remove("sdf")
    daemon.wait_log("remove disk, root dev = sdf", 40, since=mark)
    world.wait(lambda: world.disk_num() == "15", 40, "15 disks")
    offered = daemon.log_since(mark).splitlines()
    assert sum(line.endswith("add dev name = ") for line in offered) == 1
    assert any(line.endswith("=== ===> dev err, dev = /dev/") for line in offered)
    names.remove("sdf")
    assert set(published_devices(world)) == set(names)

    mark = daemon.mark()
    paper.add("sdq", 1)
    world.wait(lambda: world.disk_num() == "16", 60, "the room taken again by a rescan")
    assert set(published_devices(world)) == {*names, "sdq"}
    daemon.wait_rescan()
    assert not any(line.endswith("add dev name = ") for line in
                   daemon.log_since(mark).splitlines())


def test_names_longer_than_a_rescan_slot_are_cut_and_harm_nothing(world, start_daemon):
    paper = PaperDisks(world)
    paper.add("sda", 1)
    daemon = start_daemon()
    world.wait(lambda: world.disk_num() == "1", 30, "sda")
    long_name = "sdz" + "x" * 40
    world.sysfs.add_disk(long_name, 2048, os.makedev(9, 1))
    daemon.wait_log("add dev name = " + long_name[:15], 40)
    daemon.wait_rescan()
    assert "add dev name = " + long_name[:16] not in daemon.log()
    assert set(published_devices(world)) == {"sda"}
    assert world.disk_num() == "1"


@pytest.mark.takes_minutes
@pytest.mark.needs_fs("ext4")
def test_sixteen_mounts_are_seen_and_a_seventeenth_is_made_but_not_seen(world, start_daemon):
    disks = [world.partitioned_disk(*(Partition("ext4", 1000) for _ in range(MAX_PARTS)))
             for _ in range(2)]
    for disk, name in zip(disks, ("sda", "sdb"), strict=True):
        world.plug(disk, name)
    daemon = start_daemon()
    world.wait(lambda: len(world.parts()) == 16, 120, "16 partitions in disk.json")
    before = world.mounted()
    assert len(before) == 16
    assert sorted(before.values()) == sorted(f"/tmp/mountd/disk{disk}_part{part}"
                                             for disk in (1, 2) for part in range(1, 9))

    world.hotplug(world.whole_disk("ext4"), "sdc")
    daemon.wait_log("mount ERROR, /dev/sdc ==> /tmp/mountd/disk3_part1", 60)
    assert world.mounted() == {**before, "/dev/sdc": "/tmp/mountd/disk3_part1"}
    mark = daemon.mark()
    daemon.wait_log("exec cmd = mount -t ext4 -o rw,defaults /dev/sdc", 30, since=mark)
    assert world.mounted() == {**before, "/dev/sdc": "/tmp/mountd/disk3_part1"}
    assert "get dev mount[15]" in daemon.log()
    assert "get dev mount[16]" not in daemon.log()
    assert daemon.running
