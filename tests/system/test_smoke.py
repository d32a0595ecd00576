"""The shortest proof that world and daemon work together, and the world alone."""

import pytest

from world import Partition


def test_world_shows_a_plugged_disk_as_the_kernel_does(world):
    disk = world.partitioned_disk(Partition("ext4", 1200, "BIG"), Partition("ntfs", 500))
    world.plug(disk, "sda")

    assert 'PTTYPE="gpt"' in world.run("blkid", "/dev/sda").stdout
    assert 'TYPE="ext4"' in world.run("blkid", "/dev/sda1").stdout
    assert 'TYPE="ntfs"' in world.run("blkid", "/dev/sda2").stdout
    assert "usb1" in world.run("readlink", "/sys/block/sda").stdout
    assert world.read("/sys/class/block/sda1/size") == f"{1200 * 2048}\n"
    assert world.read("/sys/block/sda/sda2/size") == f"{500 * 2048}\n"
    assert world.read("/sys/block/sda/queue/hw_sector_size") == "512\n"


def test_two_worlds_do_not_see_each_other(make_world):
    first, second = make_world(), make_world()
    disk = first.whole_disk("ext4")
    first.plug(disk, "sda")
    first.run("mkdir", "/tmp/mountd")
    first.run("mount", "/dev/sda", "/tmp/mountd")
    first.start_companion()

    assert first.mounted() == {"/dev/sda": "/tmp/mountd"}
    assert second.mounted() == {}
    assert not second.exists("/dev/sda")
    assert not second.exists("/tmp/mountd")
    assert second.run("pidof", "tarn_nas_sys", check=False).stdout == ""


def test_a_disk_pulled_while_mounted_gives_errors_and_comes_back_whole(world):
    disk = world.whole_disk("ext4")
    world.plug(disk, "sda")
    world.run("mkdir", "/tmp/mountd")
    world.run("mount", "/dev/sda", "/tmp/mountd")
    world.sh("echo kept > /tmp/mountd/file; sync")
    read_medium = "dd if=/tmp/mountd/file of=/dev/null iflag=direct"
    assert world.sh(read_medium).returncode == 0
    world.pull(disk)

    assert "Input/output error" in world.sh(read_medium, check=False).stderr
    world.run("umount", "/dev/sda")
    world.plug(disk, "sdb")
    world.run("mount", "/dev/sdb", "/tmp/mountd")
    assert world.read("/tmp/mountd/file") == "kept\n"


@pytest.mark.needs_fs("ext4", "ntfs")
def test_a_plugged_disk_is_mounted_published_and_remembered(world, daemon):
    disk = world.partitioned_disk(Partition("ext4", 1200, "DATA"), Partition("ntfs", 500))
    world.hotplug(disk, "sda")
    daemon.wait_log("mount OK, /dev/sda1 ==> /tmp/mountd/disk1_part1")
    world.wait(lambda: "sda1" in world.parts(), 30, "sda1 in disk.json")

    part = world.parts()["sda1"]
    assert (part.disk_name, part.fs_type, part.label) == ("disk1_part1", "EXT4", "DATA")
    assert (part.total_len, part.sd_card) == (1200, 0)
    assert set(world.parts()) == {"sda1"}
    assert world.disk_num() == "1"
    assert [row["mount_path"] for row in world.db_rows()] == [part.path]
    assert world.mounted() == {"/dev/sda1": part.path}

    assert daemon.stop() == 0
    assert not world.exists("/tmp/tarn_nas/disk_manager_pid")
