"""Remembered directories: what the database holds and when it wins."""

import pytest
from shared.moments import first_rescan_over, quiet_moment
from shared.published import directories, wait_directories, wait_mounted

from world import Partition

pytestmark = [pytest.mark.needs_fs("ext4"), pytest.mark.usefixtures("watched_status")]


def row(world, dev_name, directory, mountd="yes", uid=None):
    """The row that the database must hold, with the UUID that blkid reads now."""
    uid = uid or uuid_of(world, dev_name)
    return {"uid": uid, "dev_name": dev_name, "disk_name": directory,
            "mount_path": f"/tmp/mountd/{directory}", "mountd": mountd}


def uuid_of(world, dev_name):
    return world.run("blkid", "-s", "UUID", "-o", "value", f"/dev/{dev_name}").stdout.strip()


def wait_rows(world, *rows):
    world.wait(lambda: world.db_rows() == list(rows), 30,
               lambda: f"rows {list(rows)}, where {world.db_rows()} are")


def test_the_first_mount_makes_directory_database_table_and_one_row(world, start_daemon):
    world.plug(world.partitioned_disk(Partition("ext4", 1200)), "sda")
    assert not world.exists("/etc/config/tarn_nas")
    start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1"})
    assert world.db_rows() == [row(world, "sda1", "disk1_part1")]
    assert list(world.db_rows()[0]) == ["uid", "dev_name", "disk_name", "mount_path", "mountd"]


def test_disks_come_back_to_their_directories_under_other_names_and_in_another_order(
        world, start_daemon):
    first, second = (world.partitioned_disk(Partition("ext4", size)) for size in (1300, 1200))
    world.plug(first, "sda")
    world.plug(second, "sdb")
    daemon = start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1", "sdb1": "disk2_part1"})
    uids = [uuid_of(world, name) for name in ("sda1", "sdb1")]
    wait_rows(world, row(world, "sda1", "disk1_part1"), row(world, "sdb1", "disk2_part1"))
    world.sh("cd /tmp/mountd; echo first > disk1_part1/file; echo second > disk2_part1/file; sync")

    quiet_moment(world, daemon)
    world.hotunplug(first)
    world.hotunplug(second)
    wait_mounted(world, {})
    wait_rows(world, row(world, "sda1", "disk1_part1", "no", uids[0]),
              row(world, "sdb1", "disk2_part1", "no", uids[1]))

    mark = daemon.mark()
    world.hotplug(second, "sdc")
    wait_mounted(world, {"sdc1": "disk2_part1"})
    log = daemon.log_since(mark)
    assert "===> update mount path /tmp/mountd/disk1_part1 --> /tmp/mountd/disk2_part1\n" in log
    assert "===> update disk name disk1_part1 --> disk2_part1\n" in log

    world.hotplug(first, "sdb")
    wait_mounted(world, {"sdc1": "disk2_part1", "sdb1": "disk1_part1"})
    assert world.read("/tmp/mountd/disk1_part1/file") == "first\n"
    assert world.read("/tmp/mountd/disk2_part1/file") == "second\n"
    # On this way the row's device name is not refreshed.
    wait_rows(world, row(world, "sda1", "disk1_part1", "yes", uids[0]),
              row(world, "sdb1", "disk2_part1", "yes", uids[1]))


def test_an_occupied_directory_is_given_up_for_the_new_one_and_the_row_follows(
        world, start_daemon):
    mine, other = world.whole_disk("ext4", 1200), world.whole_disk("ext4", 1100)
    world.plug(mine, "sda")
    daemon = start_daemon()
    wait_mounted(world, {"sda": "disk1_part1"})
    uid = uuid_of(world, "sda")
    first_rescan_over(world, daemon)
    world.send("#remove_dev:sda")
    wait_mounted(world, {})
    world.pull(mine)
    world.hotplug(other, "sdb")
    wait_mounted(world, {"sdb": "disk1_part1"})

    world.hotplug(mine, "sdc")
    wait_mounted(world, {"sdb": "disk1_part1", "sdc": "disk2_part1"})
    wait_rows(world, row(world, "sdc", "disk2_part1", "yes", uid), row(world, "sdb", "disk1_part1"))


def test_a_restarted_daemon_mounts_known_disks_where_they_were(world, start_daemon):
    small, large = (world.partitioned_disk(Partition("ext4", size)) for size in (1200, 5000))
    world.plug(small, "sda")
    first = start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1"})
    world.hotplug(large, "sdb")
    both = {"sda1": "disk1_part1", "sdb1": "disk2_part1"}
    wait_mounted(world, both)
    rows = world.db_rows()
    world.sh("echo kept > /tmp/mountd/disk1_part1/file; sync")
    assert first.stop() == 0

    # By size the numbers would now be the other way round.
    second = start_daemon()
    second.wait_log("mount OK, /dev/sda1 ==> /tmp/mountd/disk1_part1")
    wait_mounted(world, both)
    log = second.log()
    assert "===> update mount path /tmp/mountd/disk1_part1 --> /tmp/mountd/disk2_part1\n" in log
    assert "===> update mount path /tmp/mountd/disk2_part1 --> /tmp/mountd/disk1_part1\n" in log
    assert len(world.mounts()) == 2
    assert world.db_rows() == rows
    assert world.read("/tmp/mountd/disk1_part1/file") == "kept\n"


def test_a_restarted_daemon_gives_an_unknown_larger_disk_the_first_number(world, start_daemon):
    small, large = (world.partitioned_disk(Partition("ext4", size)) for size in (1200, 5000))
    world.plug(small, "sda")
    first = start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1"})
    assert first.stop() == 0
    world.plug(large, "sdb")
    second = start_daemon()
    second.wait_log("mount OK, /dev/sda1 ==> ")
    wait_mounted(world, {"sdb1": "disk1_part1", "sda1": "disk2_part1"})
    wait_rows(world, row(world, "sda1", "disk2_part1"), row(world, "sdb1", "disk1_part1"))


def test_two_disks_with_one_uuid_lie_in_two_directories_and_share_one_row(world, start_daemon):
    uid = "0c5b9d7e-3c1f-4a57-9a3e-6f1f1d0a77e1"
    large, small = (world.partitioned_disk(Partition("ext4", size, options=("-U", uid)))
                    for size in (1300, 1200))
    world.plug(large, "sda")
    world.plug(small, "sdb")
    start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1", "sdb1": "disk2_part1"})
    assert world.db_rows() == [row(world, "sdb1", "disk2_part1", "yes", uid)]


def test_a_partition_that_cannot_be_mounted_is_remembered_with_its_directory(world, start_daemon):
    world.plug(world.partitioned_disk(Partition("swap", 1300), Partition("swap", 1200)), "sda")
    daemon = start_daemon()
    wait_directories(world, {"sda1": "disk1_part1", "sda2": "disk1_part2"})
    daemon.wait_idle_cycles(2)
    assert world.db_rows() == [row(world, "sda1", "disk1_part1"), row(world, "sda2", "disk1_part2")]
    assert directories(world) == {"sda1": "disk1_part1", "sda2": "disk1_part2"}


def test_a_row_written_by_hand_decides_the_directory(world, start_daemon):
    world.plug(world.whole_disk("ext4", 1200), "sda")
    uid = uuid_of(world, "sda")
    world.db_execute("CREATE TABLE disk (uid TEXT,dev_name TEXT,disk_name TEXT,mount_path TEXT,"
                     "mountd TEXT);")
    world.db_execute("insert into disk values (?,?,?,?,?)",
                     (uid, "sdz9", "disk7_part4", "/tmp/mountd/disk7_part4", "no"))
    start_daemon()
    wait_mounted(world, {"sda": "disk7_part4"})
    assert world.db_rows() == [row(world, "sdz9", "disk7_part4", "yes", uid)]


def test_rows_of_other_disks_are_left_alone(world, start_daemon):
    world.plug(world.whole_disk("ext4", 1200), "sda")
    foreign = ("DEAD-BEEF", "sdz9", "disk7_part4", "/tmp/mountd/disk7_part4", "no")
    world.db_execute("CREATE TABLE disk (uid TEXT,dev_name TEXT,disk_name TEXT,mount_path TEXT,"
                     "mountd TEXT);")
    world.db_execute("insert into disk values (?,?,?,?,?)", foreign)
    start_daemon()
    wait_mounted(world, {"sda": "disk1_part1"})
    rows = world.db_rows()
    assert tuple(rows[0].values()) == foreign
    assert rows[1:] == [row(world, "sda", "disk1_part1")]
