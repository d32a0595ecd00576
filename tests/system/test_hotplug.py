"""Disks and partitions that arrive while the daemon runs, announced or only found."""

import pytest
from shared.moments import quiet_moment
from shared.published import directories, wait_directories, wait_mounted

from world import Partition

pytestmark = [pytest.mark.needs_fs("ext4"), pytest.mark.usefixtures("watched_status")]


def swap(size_mib, **options):
    """A partition that is listed but never mounted, so that nobody waits for its mount."""
    return Partition("swap", size_mib, **options)


def test_a_disk_announced_first_comes_with_all_its_partitions_and_only_once(world, daemon):
    disk = world.partitioned_disk(Partition("ext4", 1100), swap(1200))
    world.plug(disk, "sda")
    world.send("#add:sda", "#add:sda1", "#add:sda2", "#add:sda")
    wait_directories(world, {"sda2": "disk1_part1", "sda1": "disk1_part2"})

    log = daemon.log()
    for name in ("sda", "sda1", "sda2"):
        assert f"=== ===> dev is already add! dev name = {name}\n" in log
    assert log.count("=== ===> set root part(sda)") == 1
    assert world.disk_json()["disk_number"] == 1
    assert world.mounted() == {"/dev/sda1": "/tmp/mountd/disk1_part2"}


def test_a_partition_announced_first_brings_its_disk_and_the_other_partitions(world, daemon):
    disk = world.partitioned_disk(Partition("ext4", 1100), swap(1200))
    world.plug(disk, "sdb")
    world.send("#add:sdb1", "#add:sdb2", "#add:sdb")
    wait_directories(world, {"sdb2": "disk1_part1", "sdb1": "disk1_part2"})

    log = daemon.log()
    assert "not find disk obj, root dev name = sdb\n" in log
    assert log.index("set root part(sdb)") < log.index("dev already exist, name = sdb1\n")
    for name in ("sdb2", "sdb"):
        assert f"=== ===> dev is already add! dev name = {name}\n" in log
    assert world.mounted() == {"/dev/sdb1": "/tmp/mountd/disk1_part2"}


def test_disks_announced_together_before_the_first_mount_are_numbered_by_size(world, daemon):
    small, large = world.partitioned_disk(swap(1100)), world.partitioned_disk(swap(2100))
    world.plug(small, "sda")
    world.plug(large, "sdb")
    world.send_bytes(b"#add:sda\n#add:sda1\n#add:sdb\n#add:sdb1\n")
    wait_directories(world, {"sdb1": "disk1_part1", "sda1": "disk2_part1"})
    assert [disk["part"][0]["dev_name"] for disk in world.disk_json()["disk"]] == ["sdb1", "sda1"]


def test_later_disks_take_the_lowest_number_that_is_free(world, start_daemon):
    disks = [world.partitioned_disk(swap(size)) for size in (1300, 1200, 1100)]
    for disk, name in zip(disks, ("sda", "sdb", "sdc"), strict=True):
        world.plug(disk, name)
    start_daemon()
    wait_directories(world, {"sda1": "disk1_part1", "sdb1": "disk2_part1", "sdc1": "disk3_part1"})
    world.hotunplug(disks[1])
    wait_directories(world, {"sda1": "disk1_part1", "sdc1": "disk3_part1"})

    huge, last = world.partitioned_disk(swap(5000)), world.partitioned_disk(swap(1000))
    world.hotplug(huge, "sdd")
    world.hotplug(last, "sde")
    wait_directories(world, {"sda1": "disk1_part1", "sdd1": "disk2_part1", "sdc1": "disk3_part1",
                             "sde1": "disk4_part1"})


def test_a_number_under_which_something_is_mounted_is_not_given(world, start_daemon):
    foreign, first, late = (world.partitioned_disk(Partition(fs, 1200))
                            for fs in ("ext4", "swap", "swap"))
    world.plug(first, "sda")
    start_daemon()
    wait_directories(world, {"sda1": "disk1_part1"})
    world.plug(foreign, "sdx")
    world.run("mkdir", "-p", "/tmp/mountd/disk2_part1")
    world.run("mount", "/dev/sdx1", "/tmp/mountd/disk2_part1")
    world.hotplug(late, "sdb")
    world.wait(lambda: directories(world).get("sdb1"), 30, "sdb1 in disk.json")
    assert directories(world)["sdb1"] == "disk3_part1"


def test_a_partition_that_comes_later_has_its_size_at_once_and_moves_no_other(
        world, start_daemon):
    disk = world.partitioned_disk(Partition("ext4", 1100), Partition("ext4", 1300), swap(1200))
    world.plug(disk, "sda", only=[1, 3])
    daemon = start_daemon()
    before = {"sda3": "disk1_part1", "sda1": "disk1_part2"}
    wait_directories(world, before)

    world.show_partition(disk, disk.partitions[1])
    world.send("#add:sda2")
    wait_directories(world, {**before, "sda2": "disk1_part3"})
    assert world.parts()["sda2"].total_len == 1300
    both = {"/dev/sda1": "/tmp/mountd/disk1_part2", "/dev/sda2": "/tmp/mountd/disk1_part3"}
    assert world.mounted() == both
    assert "=== Delete part[" not in daemon.log()

    # Removed and announced again while the disk stays.
    world.send("#remove_dev:sda2")
    wait_directories(world, before)
    assert world.mounted() == {"/dev/sda1": "/tmp/mountd/disk1_part2"}
    world.send("#add:sda2")
    wait_directories(world, {**before, "sda2": "disk1_part3"})
    assert world.mounted() == both
    assert world.parts()["sda2"].total_len == 1300


def test_a_small_partition_that_comes_later_stays_out(world, start_daemon):
    disk = world.partitioned_disk(swap(1100), swap(999))
    world.plug(disk, "sda", only=[1])
    daemon = start_daemon()
    wait_directories(world, {"sda1": "disk1_part1"})
    world.show_partition(disk, disk.partitions[1])
    world.send("#add:sda2")
    daemon.wait_log("=== Delete part[1], dev name = sda2")
    daemon.wait_idle_cycles(1)
    assert directories(world) == {"sda1": "disk1_part1"}


def test_rescans_alone_find_arrivals_and_departures(world, start_daemon):
    stays, comes = (world.partitioned_disk(Partition("ext4", size)) for size in (1300, 1200))
    world.plug(stays, "sda")
    daemon = start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1"})

    world.plug(comes, "sdb")
    wait_mounted(world, {"sda1": "disk1_part1", "sdb1": "disk2_part1"})
    assert world.disk_num() == "2"

    quiet_moment(world, daemon)
    world.pull(comes)
    wait_mounted(world, {"sda1": "disk1_part1"})
    world.wait(lambda: world.disk_num() == "1", 30, "1 in disk_num.txt")
    log = daemon.log()
    assert "EVENT_DISK_ADD" not in log and "EVENT_DISK_REMOVE" not in log
    assert log.index("remove disk, root dev = sdb") < log.index("==> umount dev = sdb1")
    # Not by an event, so nobody stopped the services.
    assert world.tools.service_calls() == []
    assert daemon.running


def test_an_unknown_device_changes_nothing(world, start_daemon):
    world.plug(world.partitioned_disk(swap(1200)), "sda")
    daemon = start_daemon()
    wait_directories(world, {"sda1": "disk1_part1"})
    world.send("#add:sdq", "#add:sda9", "#add:mmcblk3p1")
    daemon.wait_log("=== ===> dev err, dev = /dev/mmcblk3p1")
    daemon.wait_idle_cycles(2)
    assert directories(world) == {"sda1": "disk1_part1"}


def test_a_partition_whose_disk_the_kernel_does_not_list_is_not_added(world, daemon):
    disk = world.partitioned_disk(swap(1200))
    world.plug(disk, "sda")
    world.path("/sys/block/sda").unlink()
    world.send("#add:sda1")
    daemon.wait_log("not find dev name = sda1")
    daemon.wait_idle_cycles(2)
    assert world.parts() == {}
