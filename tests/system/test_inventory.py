"""Discovery at start-up, the order and size rules, and the two published files."""

import json

import pytest
from shared.published import directories, wait_directories, wait_mounted

from world import Partition
from world.state import DISK_JSON, DISK_NUM

pytestmark = pytest.mark.usefixtures("watched_status")

PART_KEYS = ["dev_name", "disk_name", "fs_type", "uid", "label", "total_len", "free_size"]


def no_disks(world):
    document = world.disk_json()
    return document is not None and document["disk"] == [] and world.disk_num() == "0"


def swap(size_mib, **options):
    """A partition that is listed but never mounted, so that nobody waits for its mount."""
    return Partition("swap", size_mib, **options)


@pytest.mark.needs_fs("ext4")
def test_disks_found_at_start_are_numbered_by_size_and_their_partitions_too(world, start_daemon):
    small = world.partitioned_disk(Partition("ext4", 1200))
    middle = world.whole_disk("ext4", 3000)
    large = world.partitioned_disk(swap(1100), Partition("ext4", 1400), swap(1300))
    # Neither from first to last nor from last to first is this the order of their sizes.
    for disk, name in ((middle, "sdc"), (large, "sdb"), (small, "sda")):
        world.plug(disk, name)
    start_daemon()

    wait_directories(world, {"sdb2": "disk1_part1", "sdb3": "disk1_part2", "sdb1": "disk1_part3",
                             "sdc": "disk2_part1", "sda1": "disk3_part1"})
    assert world.mounted() == {"/dev/sdb2": "/tmp/mountd/disk1_part1",
                               "/dev/sdc": "/tmp/mountd/disk2_part1",
                               "/dev/sda1": "/tmp/mountd/disk3_part1"}
    document = world.disk_json()
    assert document["disk_number"] == 3
    assert [[part["dev_name"] for part in disk["part"]] for disk in document["disk"]] == [
        ["sdb2", "sdb3", "sdb1"], ["sdc"], ["sda1"]]
    assert [disk["part_num"] for disk in document["disk"]] == [3, 1, 1]
    assert world.disk_num() == "3"


def exchange_sorted(parts):
    """The daemon's sort: not stable, a swap can carry a partition past one of its size."""
    parts = list(parts)
    for left in range(len(parts) - 1):
        for right in range(left + 1, len(parts)):
            if parts[right].size_mib > parts[left].size_mib:
                parts[left], parts[right] = parts[right], parts[left]
    return parts


def test_partitions_of_one_size_stand_as_the_exchange_sort_leaves_them(world, start_daemon):
    disk = world.partitioned_disk(swap(1500), swap(1100), swap(1100), swap(1100))
    world.plug(disk, "sda", only=[])
    # The kernel's list decides who is met first; here the largest is met last.
    for part in disk.partitions:
        world.show_partition(disk, part)
    by_name = {disk.part_name(part): part for part in disk.partitions}
    listed = world.run("ls", "-U", "/sys/block/sda").stdout.split()
    met = [by_name[name] for name in listed if name in by_name]
    assert exchange_sorted(met) != sorted(met, key=lambda part: -part.size_mib)
    start_daemon()

    wait_directories(world, {disk.part_name(part): f"disk1_part{number}"
                             for number, part in enumerate(exchange_sorted(met), 1)})


def test_partitions_below_1000_mib_are_never_listed(world, start_daemon):
    mixed = world.partitioned_disk(Partition("ext4", 999), swap(1000), Partition("ntfs", 500))
    tiny = world.partitioned_disk(Partition("ext4", 999), table="dos", size_mib=5000)
    world.plug(mixed, "sda")
    world.plug(tiny, "sdb")
    daemon = start_daemon()
    wait_directories(world, {"sda2": "disk2_part1"})

    assert world.parts()["sda2"].total_len == 1000
    assert world.mounted() == {}
    assert world.disk_json()["disk_number"] == 1
    assert world.disk_num() == "1"
    log = daemon.log()
    assert "=== Delete part[" in log
    assert log.count("total len = 999\n") >= 2
    assert "clear dev = sdb\n" in log


def test_a_disk_without_table_and_filesystem_is_not_added(world, start_daemon):
    blank = world.blank_disk(2000)
    world.plug(blank, "sda")
    daemon = start_daemon()
    daemon.wait_log("=== ===> dev err, dev = /dev/sda")
    world.wait(lambda: no_disks(world), 30, "a status without disks")
    assert "set root part(sda)" not in daemon.log()


def test_other_block_devices_are_passed_over(world, start_daemon):
    for name in ("nvme0n1", "dm-0", "sr0", "loop7", "mtdblock3", "md0", "sd", "vda"):
        world.plug(world.whole_disk("swap", 1200), name)
    daemon = start_daemon()
    daemon.wait_log("have disk = 0")
    # An event of whatever name makes the daemon rescan.
    world.send("#add:nothing")
    daemon.wait_log("mount dev num = ")

    assert world.parts() == {}
    assert daemon.log().count("add dev name = ") == 1


def test_announced_devices_of_another_kind_are_never_added(world, daemon):
    names = ["nvme0n1", "sr0", "loop7", "mtdblock3", "vda"]
    for name in names[:-1]:
        world.plug(world.whole_disk("ext4", 1200), name)
    world.plug(world.partitioned_disk(Partition("ext4", 1200)), "vda")
    world.send(*(f"#add:{name}" for name in names), "#add:vda1")
    daemon.wait_log("mount dev num = ", 60)

    assert "set root part(" not in daemon.log()
    assert world.parts() == {}
    assert world.mounts() == []


def test_sizes_are_sectors_times_the_hardware_sector_size(world, start_daemon):
    # The kernel counts in units of 512 bytes, whatever the hardware's sector is.
    whole = world.whole_disk("swap", 1200, sector_size=4096)
    parts = world.partitioned_disk(swap(1100), swap(124), swap(125), sector_size=4096)
    world.plug(whole, "sda")
    world.plug(parts, "sdb")
    start_daemon()
    world.wait(lambda: len(world.parts()) == 2, 30, "two partitions")
    assert {name: part.total_len for name, part in world.parts().items()} == {
        "sdb1": 8800, "sdb3": 1000}


def test_the_size_and_free_space_are_those_of_the_partition_and_its_filesystem(world, start_daemon):
    disk = world.partitioned_disk(Partition("ext4", 1200, options=("-m", "40")))
    world.plug(disk, "sda")
    daemon = start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1"})
    part = world.parts()["sda1"]
    free = world.run("stat", "-f", "-c", "%f %a %S", part.path).stdout.split()
    with_reserved, without, block = (int(word) for word in free)

    assert part.total_len == 1200
    assert part.free_size == with_reserved * block >> 20
    assert part.free_size > (without * block >> 20) + 300

    world.sh(f"dd if=/dev/zero of={part.path}/file bs=1M count=20; sync")
    world.wait(lambda: world.parts()["sda1"].free_size <= part.free_size - 20, 25,
               "less free space in disk.json")
    daemon.wait_idle_cycles(1)


def test_the_document_has_the_fixed_keys_in_the_fixed_order(world, start_daemon):
    disk = world.partitioned_disk(swap(1200, label="DATA"), table="dos")
    world.plug(disk, "sda")
    start_daemon()
    wait_directories(world, {"sda1": "disk1_part1"})
    text = world.read(DISK_JSON)
    document = json.loads(text)

    assert text.startswith('{\n\t"disk_number":\t1,\n\t"disk":\t[{\n')
    assert text.endswith("}")
    assert list(document) == ["disk_number", "disk"]
    assert list(document["disk"][0]) == ["part_num", "sd_card", "part"]
    assert list(document["disk"][0]["part"][0])[:len(PART_KEYS)] == PART_KEYS
    assert '"total_len":\t1200,\n' in text
    assert world.run("blkid", "-s", "UUID", "-o", "value", "/dev/sda1").stdout.strip() == \
        document["disk"][0]["part"][0]["uid"]
    assert world.read(DISK_NUM) == "1"


@pytest.mark.needs_fs("ext4")
def test_a_filesystem_without_uuid_is_mounted_and_published_but_not_remembered(
        world, start_daemon):
    disk = world.whole_disk("ext4", 1200, options=("-U", "clear"))
    world.plug(disk, "sda")
    assert "UUID" not in world.run("blkid", "/dev/sda").stdout
    start_daemon()
    wait_mounted(world, {"sda": "disk1_part1"})
    assert world.parts()["sda"].uid == ""
    assert world.db_rows() == []


def test_a_partition_without_filesystem_goes_by_its_partition_uuid_and_is_not_mounted(
        world, start_daemon):
    disk = world.partitioned_disk(Partition(None, 1200), table="dos")
    world.plug(disk, "sda")
    daemon = start_daemon()
    wait_directories(world, {"sda1": "disk1_part1"})
    part = world.parts()["sda1"]
    assert part.uid == world.run("blkid", "-s", "PARTUUID", "-o", "value",
                                 "/dev/sda1").stdout.strip() != ""
    assert (part.fs_type, part.label, part.free_size) == ("ERR FS", "sda1", 0)
    daemon.wait_log("err fs type = ERR FS")
    assert world.mounted() == {}
    assert not world.exists("/tmp/mountd/disk1_part1")


@pytest.mark.needs_fs("ext4")
def test_an_mmc_device_is_the_sd_card_whatever_its_path(world, start_daemon):
    card = world.partitioned_disk(Partition("ext4", 1200))
    stick = world.partitioned_disk(swap(1100))
    world.plug(card, "mmcblk0")
    world.plug(stick, "sda")
    start_daemon()
    wait_directories(world, {"mmcblk0p1": "disk1_part1", "sda1": "disk2_part1"})
    assert {name: part.sd_card for name, part in world.parts().items()} == {
        "mmcblk0p1": 1, "sda1": 0}
    assert world.mounted() == {"/dev/mmcblk0p1": "/tmp/mountd/disk1_part1"}


def test_the_platform_text_in_the_device_path_makes_a_disk_the_sd_card(world, start_daemon):
    world.write("/etc/tarn_utils/sdcard_point", "1-2:1.0\n")
    reader, stick = world.partitioned_disk(swap(1200)), world.partitioned_disk(swap(1100))
    world.plug(reader, "sda", port="platform/1e1c0000.xhci/usb1/1-2/1-2:1.0")
    world.plug(stick, "sdb", port="platform/1e1c0000.xhci/usb1/1-1/1-1:1.0")
    daemon = start_daemon()
    wait_directories(world, {"sda1": "disk1_part1", "sdb1": "disk2_part1"})
    assert {name: part.sd_card for name, part in world.parts().items()} == {"sda1": 1, "sdb1": 0}
    assert "find sd card ok, dev = /sys/block/sda\n" in daemon.log()


def publications(daemon, mark):
    return daemon.log_since(mark).count("clear empty disk")


def idle_passes(daemon, mark):
    return daemon.log_since(mark).count("=== === ===> update = ")


def test_files_deleted_by_someone_are_written_again_in_the_next_idle_cycle(world, start_daemon):
    world.plug(world.partitioned_disk(swap(1200)), "sda")
    daemon = start_daemon()
    wait_directories(world, {"sda1": "disk1_part1"})
    before = world.read(DISK_JSON)
    daemon.wait_log("=== === ===> update = 1")
    daemon.wait_log("no event ...", since=daemon.mark())

    mark = daemon.mark()
    world.path(DISK_JSON).unlink()
    world.path(DISK_NUM).unlink()
    world.wait(lambda: world.exists(DISK_NUM), 30, "the files to come back")
    assert "=== === ===> update = 1" in daemon.log_since(mark)
    assert (world.read(DISK_JSON), world.disk_num()) == (before, "1")


@pytest.mark.takes_minutes
def test_30_s_after_the_last_change_the_files_are_rewritten_in_every_idle_cycle(
        world, start_daemon):
    world.plug(world.partitioned_disk(swap(1200)), "sda")
    daemon = start_daemon()
    # The first rescan offers every disk again, which counts as a change.
    daemon.wait_rescan()
    daemon.wait_log("=== === ===> update = 1", since=daemon.log().index("mount dev num"))
    daemon.wait_log("=== === ===> update = 0", since=daemon.mark())
    # Sound, so that whoever looks meanwhile finds nothing amiss, and not the daemon's.
    world.write(f"{DISK_JSON}.other", '{"disk_number": 0, "disk": []}')
    world.path(f"{DISK_JSON}.other").rename(world.path(DISK_JSON))
    mark = daemon.mark()
    world.wait(lambda: publications(daemon, mark), 45, "a publication without a change")
    assert 6 <= idle_passes(daemon, mark) <= 11

    mark = daemon.mark()
    daemon.wait_idle_cycles(3)
    world.wait(lambda: publications(daemon, mark) >= 2, 30, "a publication in every cycle")
    assert abs(publications(daemon, mark) - idle_passes(daemon, mark)) <= 1
    assert "=== === ===> update = 1" not in daemon.log_since(mark)
    assert directories(world) == {"sda1": "disk1_part1"}


def test_the_disk_count_follows_arrivals_and_departures(world, daemon):
    first, second = (world.partitioned_disk(swap(1200)) for _ in range(2))
    world.hotplug(first, "sda")
    world.hotplug(second, "sdb")
    world.wait(lambda: world.disk_num() == "2", 30, "2 in disk_num.txt")
    world.hotunplug(first)
    world.wait(lambda: world.disk_num() == "1", 30, "1 in disk_num.txt")
    world.hotunplug(second)
    world.wait(lambda: no_disks(world), 30, "a status without disks")


def test_of_nine_partitions_the_first_eight_met_are_kept(world, start_daemon):
    disk = world.partitioned_disk(*(swap(1000 + number) for number in range(9)))
    world.plug(disk, "sda")
    listed = world.run("ls", "-U", "/sys/block/sda").stdout.split()
    met = [name for name in listed if name.startswith("sda")]
    daemon = start_daemon()
    world.wait(lambda: len(world.parts()) == 8, 40, "8 partitions")

    by_size = sorted(met[:8], key=lambda name: int(name.removeprefix("sda")), reverse=True)
    assert directories(world) == {name: f"disk1_part{number}"
                                  for number, name in enumerate(by_size, 1)}
    assert f"sub part full, root dev name = sda, sub dev = {met[8]}\n" in daemon.log()
