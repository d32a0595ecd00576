"""The disk that the router itself runs from: nobody's to mount a second time or to remove."""

import os

import pytest
from shared.moments import first_rescan_over, quiet_moment
from shared.own_disk import run_from
from shared.published import directories, wait_directories, wait_mounted

from world import Partition

pytestmark = [pytest.mark.needs_fs("ext4"), pytest.mark.usefixtures("watched_status")]

ROOT = ("-t", "tmpfs", "router")


def own_line(name):
    return f"router's own disk, dev = {name}\n"


def times_left_alone(daemon, name="sda"):
    return daemon.log().count(own_line(name))


def plug_own_disk(world, name="sda"):
    """A disk like a user's, of which the first partition is about to be the router's."""
    disk = world.partitioned_disk(Partition("ext4", 1100), Partition("ext4", 1300))
    world.plug(disk, name)
    return disk


def plug_stick(world, name="sdb"):
    world.plug(world.partitioned_disk(Partition("ext4", 1200)), name)


def mounts_of(world, device):
    """The directories of the whole world on which a device is mounted."""
    return [entry.path for entry in world.mounts("/") if entry.dev == f"/dev/{device}"]


def unmounted(daemon):
    """What the daemon asked to unmount."""
    return [line.split("exec cmd = umount ", 1)[1] for line in daemon.log().splitlines()
            if "exec cmd = umount " in line]


def test_the_world_of_these_tests_has_its_root_on_the_disk(world):
    disk = plug_own_disk(world)
    run_from(world, "/dev/sda1")
    assert mounts_of(world, "sda1") == ["/"]
    number = world.run("stat", "-c", "%d", "/").stdout.strip()
    assert int(number) == disk.loops["sda1"].devno


def test_the_disk_with_the_root_is_left_alone_from_the_start_to_the_safe_removal(
        world, start_daemon):
    own = plug_own_disk(world)
    plug_stick(world)
    run_from(world, "/dev/sda1")
    daemon = start_daemon()
    wait_mounted(world, {"sdb1": "disk1_part1"})
    assert times_left_alone(daemon) == 1

    # The first rescan offers every disk again, and so does each event.
    first_rescan_over(world, daemon)
    assert times_left_alone(daemon) == 2
    for message in ("#add:sda", "#add:sda1", "#add:sda2"):
        before = times_left_alone(daemon)
        world.send(message)
        quiet_moment(world, daemon)
        assert times_left_alone(daemon) == before + 1, message
    wait_mounted(world, {"sdb1": "disk1_part1"})
    assert world.disk_num() == "1"

    world.safe_remove()
    wait_mounted(world, {})
    world.announce(own)
    world.send("#remove_dev:sda1", "#remove_dev:sda", pipe="remove")
    quiet_moment(world, daemon)
    assert (directories(world), world.mounted()) == ({}, {})
    assert mounts_of(world, "sda1") == ["/"]
    assert [place for place in unmounted(daemon) if place.startswith("/dev/sda")] == []
    assert [row["dev_name"] for row in world.db_rows()] == ["sdb1"]


def test_a_whole_device_with_the_root_is_left_alone(world, start_daemon):
    world.plug(world.whole_disk("ext4", 1200), "sda")
    plug_stick(world)
    run_from(world, "/dev/sda")
    daemon = start_daemon()
    wait_mounted(world, {"sdb1": "disk1_part1"})
    assert times_left_alone(daemon) == 1
    world.safe_remove()
    wait_mounted(world, {})
    assert mounts_of(world, "sda") == ["/"]


@pytest.mark.parametrize("directory", ["/boot", "/rom", "/overlay"])
def test_a_card_with_another_part_of_the_router_is_left_alone(world, start_daemon, directory):
    plug_own_disk(world, "mmcblk0")
    plug_stick(world)
    run_from(world, *ROOT)
    world.run("mount", "/dev/mmcblk0p1", directory)
    daemon = start_daemon()
    wait_mounted(world, {"sdb1": "disk1_part1"})
    assert times_left_alone(daemon, "mmcblk0") == 1
    world.safe_remove()
    wait_mounted(world, {})
    assert mounts_of(world, "mmcblk0p1") == [directory]


def test_another_directory_makes_a_disk_nobodys_own(world, start_daemon):
    plug_own_disk(world)
    run_from(world, *ROOT)
    world.run("mkdir", "/run/share")
    world.run("mount", "/dev/sda1", "/run/share")
    daemon = start_daemon()
    wait_directories(world, {"sda2": "disk1_part1", "sda1": "disk1_part2"})
    assert times_left_alone(daemon) == 0


def test_a_disk_is_told_by_its_number_and_not_by_its_name(world, start_daemon):
    disk = plug_own_disk(world)
    plug_stick(world)
    # A second name, as /dev/root is one, under which the kernel then lists the mount.
    os.mknod(world.path("/dev/sdb9"), 0o600 | 0o060000, disk.loops["sda1"].devno)
    run_from(world, "/dev/sdb9")
    daemon = start_daemon()
    wait_mounted(world, {"sdb1": "disk1_part1"})
    assert mounts_of(world, "sdb9") == ["/"]
    assert times_left_alone(daemon) == 1
    assert times_left_alone(daemon, "sdb") == 0


@pytest.mark.parametrize("announced", [True, False], ids=["event", "rescan"])
def test_a_disk_that_comes_later_is_left_alone(world, daemon, announced):
    stick = world.partitioned_disk(Partition("ext4", 1200))
    world.hotplug(stick, "sdb")
    wait_mounted(world, {"sdb1": "disk1_part1"})
    first_rescan_over(world, daemon)
    mark = daemon.mark()
    with daemon.held_still():
        own = plug_own_disk(world)
        run_from(world, "/dev/sda1")
    if announced:
        world.announce(own)
    daemon.wait_log(own_line("sda").strip(), since=mark)
    daemon.wait_rescan()
    quiet_moment(world, daemon)
    wait_mounted(world, {"sdb1": "disk1_part1"})
    assert mounts_of(world, "sda1") == ["/"]
    # Disk and partitions by their events, and the disk once more by the rescan that finds it.
    assert times_left_alone(daemon) == (4 if announced else 1)
