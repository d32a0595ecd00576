"""Tables, filesystems and labels, as the distribution's own tools make and read them."""

import pytest
from shared.published import wait_directories, wait_mounted

from world import Partition

pytestmark = pytest.mark.usefixtures("watched_status")


def swap(size_mib, **options):
    """A partition that is listed but never mounted, so that nobody waits for its mount."""
    return Partition("swap", size_mib, **options)


def mount_types(world):
    return {entry.dev: entry.fs for entry in world.mounts()}


def blkid(world, name):
    return world.run("blkid", f"/dev/{name}").stdout


def labels(world):
    return {name: part.label for name, part in world.parts().items()}


def fs_types(world):
    return {name: part.fs_type for name, part in world.parts().items()}


@pytest.mark.needs_fs("ext2", "ext4", "ntfs")
def test_ext_and_ntfs_are_recognised_mounted_as_what_they_are_and_hold_files(world, start_daemon):
    disk = world.partitioned_disk(
        Partition("ext4", 1500, "FOUR"), Partition("ntfs", 1400, "NT"),
        Partition("ext2", 1300, "TWO"),
        Partition("ext3", 1200, "THREE"), Partition("ext4", 1100, options=("-O", "^has_journal")))
    world.plug(disk, "sda")
    # With the secondary type in front blkid's first "TYPE=" is ext2.
    assert 'SEC_TYPE="ext2"' in blkid(world, "sda4") and ' TYPE="ext3"' in blkid(world, "sda4")
    daemon = start_daemon()
    wait_mounted(world, {f"sda{number}": f"disk1_part{number}" for number in range(1, 6)}, 60)

    assert fs_types(world) == {"sda1": "EXT4", "sda2": "NTFS", "sda3": "EXT2", "sda4": "EXT2",
                               "sda5": "EXT4"}
    assert mount_types(world) == {"/dev/sda1": "ext4", "/dev/sda2": "fuseblk", "/dev/sda3": "ext2",
                                  "/dev/sda4": "ext2", "/dev/sda5": "ext4"}
    assert labels(world) == {"sda1": "FOUR", "sda2": "NT", "sda3": "TWO", "sda4": "THREE",
                             "sda5": "sda5"}
    for name, part in world.parts().items():
        assert f'UUID="{part.uid}"' in blkid(world, name)
        assert 0 < part.free_size <= part.total_len
        options = next(entry.options for entry in world.mounts() if entry.path == part.path)
        assert options.startswith("rw,")
        world.sh(f"echo {name} > {part.path}/file && grep -qx {name} {part.path}/file")
    assert "noatime" in next(entry.options for entry in world.mounts() if entry.fs == "fuseblk")

    ran = daemon.log()
    for command in ("mount -t ext4 -o rw,defaults /dev/sda1 /tmp/mountd/disk1_part1",
                    "mount.ntfs-3g -o noatime,big_writes,async,force /dev/sda2"
                    " /tmp/mountd/disk1_part2",
                    "mount -t ext2 -o rw,defaults /dev/sda4 /tmp/mountd/disk1_part4",
                    "chmod a+wr /tmp/mountd/disk1_part1"):
        assert f"exec cmd = {command}\n" in ran
    assert ran.index("mkdir -p '/tmp/mountd/disk1_part1'") < ran.index("chmod a+wr /tmp/mountd/")


@pytest.mark.needs_fs("ext4", "ntfs")
def test_files_on_every_filesystem_survive_removal_and_return(world, start_daemon):
    disk = world.partitioned_disk(Partition("ext4", 1200), Partition("ntfs", 1100), table="dos")
    places = {"sda1": "disk1_part1", "sda2": "disk1_part2"}
    world.plug(disk, "sda")
    daemon = start_daemon()
    wait_mounted(world, places)
    for place in places.values():
        world.sh(f"echo {place} > /tmp/mountd/{place}/file")
    daemon.wait_log("mount dev num = ")
    world.send("#remove_dev:sda")
    wait_mounted(world, {})
    assert not world.exists("/tmp/mountd/disk1_part2/file")
    world.send("#add:sda")
    wait_mounted(world, places)
    for place in places.values():
        assert world.read(f"/tmp/mountd/{place}/file") == f"{place}\n"


@pytest.mark.needs_fs("ext4")
@pytest.mark.parametrize("fs", ["ext4", pytest.param("ntfs", marks=pytest.mark.needs_fs("ntfs")),
                                pytest.param("exfat", marks=pytest.mark.needs_fs("exfat")),
                                pytest.param("vfat", marks=pytest.mark.needs_fs("vfat"))])
def test_a_filesystem_on_the_whole_device_is_part_1_and_shows_the_device_name(
        world, start_daemon, fs):
    world.plug(world.whole_disk(fs, 1200, label="LABEL"), "sda")
    start_daemon()
    wait_mounted(world, {"sda": "disk1_part1"})
    document = world.disk_json()
    assert (document["disk_number"], document["disk"][0]["part_num"]) == (1, 1)
    part = world.parts()["sda"]
    expected = {"ext4": "EXT4", "ntfs": "NTFS", "exfat": "EXFAT", "vfat": "FAT"}[fs]
    assert (part.fs_type, part.total_len) == (expected, 1200)
    # No label is read for a whole device.
    assert part.label == "sda"


@pytest.mark.parametrize("table", ["gpt", "dos"])
def test_a_disk_with_a_table_is_never_mounted_itself(world, start_daemon, table):
    disk = world.partitioned_disk(swap(1200), swap(1100), swap(1000), table=table)
    world.plug(disk, "sda")
    assert f'PTTYPE="{table}"' in blkid(world, "sda")
    daemon = start_daemon()
    wait_directories(world, {f"sda{number}": f"disk1_part{number}" for number in (1, 2, 3)})
    assert "dev /dev/sda fs = ERR FS\n" in daemon.log()
    assert "root path fs type err\n" in daemon.log()
    assert "mount root part" not in daemon.log()


@pytest.mark.needs_fs("ext4")
def test_logical_partitions_are_mounted_and_their_container_is_left_out(world, start_daemon):
    disk = world.partitioned_disk(swap(1100), Partition(type="5"), Partition("ext4", 1200),
                                  swap(500), table="dos", size_mib=3500)
    assert [part.number for part in disk.partitions] == [1, 2, 5, 6]
    world.plug(disk, "sda")
    daemon = start_daemon()
    wait_directories(world, {"sda5": "disk1_part1", "sda1": "disk1_part2"})

    assert world.mounted() == {"/dev/sda5": "/tmp/mountd/disk1_part1"}
    log = daemon.log()
    assert "dev = /dev/sda2, get err fs type = EXTENDED\n" in log
    assert log.count("=== Delete part[") == 2


def test_labels_as_blkid_tells_them(world, start_daemon):
    disk = world.partitioned_disk(
        swap(1700, label="PLAIN"), swap(1600), swap(1500, label="x"), swap(1400, label="My Disk"),
        swap(1300, label="Büro_ß"), swap(1200, name="table name"), swap(1100, label="A-B-C-D"),
        swap(1000, label="two"))
    world.plug(disk, "sda")
    start_daemon()
    world.wait(lambda: len(world.parts()) == 8, 30, "8 partitions")
    assert labels(world) == {
        "sda1": "PLAIN",
        "sda2": "sda2",
        "sda3": "sda3",
        "sda4": "My",
        "sda5": "Büro_ß",
        # The name in the table stands in, since "LABEL=" is found in "PARTLABEL=" too.
        "sda6": "table",
        "sda7": "A-B-C-D",
        "sda8": "two",
    }


def test_the_label_script_tells_the_whole_label_and_is_asked_only_when_there_is_one(
        world, start_daemon):
    world.label_script('#!/bin/sh\necho "$# $1" >> /run/asked\nblkid -o value -s LABEL "/dev/$1"\n')
    disk = world.partitioned_disk(swap(1400, label="My Disk"), swap(1300, label="x"), swap(1200),
                                  swap(1100, label="one two three"))
    world.plug(disk, "sda")
    start_daemon()
    world.wait(lambda: len(world.parts()) == 4, 30, "4 partitions")
    assert labels(world) == {"sda1": "My Disk", "sda2": "sda2", "sda3": "sda3",
                             "sda4": "one two three"}
    assert sorted(world.read("/run/asked").splitlines()) == ["1 sda1", "1 sda4"]


def test_a_label_script_with_nothing_to_say_leaves_the_device_name(world, start_daemon):
    world.label_script("#!/bin/sh\nexit 1\n")
    world.plug(world.partitioned_disk(swap(1200, label="LABEL")), "sda")
    start_daemon()
    wait_directories(world, {"sda1": "disk1_part1"})
    assert labels(world) == {"sda1": "sda1"}


@pytest.mark.needs_fs("ntfs")
def test_a_fat_label_with_three_hyphens_gives_way_to_the_device_name_on_fat_only(
        world, start_daemon):
    disk = world.partitioned_disk(Partition("vfat", 1200, "A1-B2-C3-D4"),
                                  Partition("ntfs", 1100, "A1-B2-C3-D4"), table="dos")
    world.plug(disk, "sda")
    start_daemon()
    # Where the kernel has no vfat the daemon waits 18 s for that mount in vain.
    world.wait(lambda: set(world.parts()) == {"sda1", "sda2"}, 60, "both partitions in disk.json")
    assert labels(world) == {"sda1": "sda1", "sda2": "A1-B2-C3-D4"}
    assert fs_types(world) == {"sda1": "FAT", "sda2": "NTFS"}
    assert world.mounted()["/dev/sda2"] == "/tmp/mountd/disk1_part2"


def test_a_fat_label_with_two_hyphens_is_kept(world, start_daemon):
    disk = world.partitioned_disk(Partition("vfat", 1200, "A1-B2-C3"), table="dos")
    world.plug(disk, "sda")
    start_daemon()
    world.wait(lambda: world.parts(), 60, "sda1 in disk.json")
    assert labels(world) == {"sda1": "A1-B2-C3"}
    assert fs_types(world) == {"sda1": "FAT"}


@pytest.mark.needs_fs("vfat", "exfat")
def test_fat_and_exfat_partitions_are_mounted(world, start_daemon):
    disk = world.partitioned_disk(Partition("vfat", 1200, "FATTY"),
                                  Partition("exfat", 1100, "EXTRA"))
    world.plug(disk, "sda")
    start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1", "sda2": "disk1_part2"})
    assert mount_types(world) == {"/dev/sda1": "vfat", "/dev/sda2": "exfat"}
    assert fs_types(world) == {"sda1": "FAT", "sda2": "EXFAT"}
    options = next(entry.options for entry in world.mounts() if entry.fs == "vfat")
    assert "uid=1000,gid=1000" in options and "iocharset=utf8" in options
