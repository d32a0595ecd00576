"""Faults of the outside: mounts that fail, programs that are missing, busy disks."""

import subprocess

import pytest
from shared.busy import hold
from shared.waits import looks_after_mount

from world import Partition

FURTHER_UMOUNTS = 10
CALLS = "/run/world/mount-calls.txt"


def stub_mount(world, pattern, failures):
    """The first `failures` mounts whose arguments hold `pattern` do nothing.

    Notes the uptime of each such call, of the later real ones too.
    """
    world.tools.stub("mount", f"""
case "$*" in
*{pattern}*)
    read -r uptime idle < /proc/uptime
    echo "$uptime" >> {CALLS}
    count=0
    while read -r line; do count=$((count + 1)); done < {CALLS}
    [ "$count" -gt {failures} ] || exit 0 ;;
esac
exec {world.tools.real("mount")} "$@"
""")


def mount_calls(world):
    """Uptimes of the noted calls."""
    return [float(line) for line in world.read(CALLS).split()] if world.exists(CALLS) else []


@pytest.mark.needs_fs("ext4")
def test_a_mount_that_fails_is_looked_for_for_18_seconds_and_tried_again_at_the_next_pass(
        world, start_daemon):
    stub_mount(world, "/dev/sda1", 1)
    world.plug(world.partitioned_disk(Partition("ext4", 1200, "DATA")), "sda")
    daemon = start_daemon()
    error = daemon.wait_log("=== === === mount ERROR, ", 40)
    assert error.startswith("Warning[mount.cpp:")
    assert error.endswith("/dev/sda1 ==> /tmp/mountd/disk1_part1")
    assert world.path("/tmp/mountd/disk1_part1").is_dir()
    assert [(row["disk_name"], row["mountd"]) for row in world.db_rows()] == [
        ("disk1_part1", "yes")]

    tried = daemon.log().split("exec cmd = mount -t ext4")[1].split("mount ERROR")[0]
    assert tried.count("exec cmd = mount > /tmp/mount.txt") == looks_after_mount(world.program)
    daemon.wait_log("mount OK, /dev/sda1 ==> /tmp/mountd/disk1_part1", 30)
    first, second = mount_calls(world)
    # The looks of 18 s and a cycle; the next pass but one would be 36 s away.
    assert 18 <= second - first < 36
    assert world.mounted() == {"/dev/sda1": "/tmp/mountd/disk1_part1"}
    world.wait(lambda: world.parts()["sda1"].free_size > 1000, 30, "its free space in disk.json")
    assert len(world.db_rows()) == 1


@pytest.mark.needs_fs("ext4")
def test_a_damaged_filesystem_is_mounted_once_it_is_repaired(world, start_daemon):
    disk = world.whole_disk("ext4", label="SICK")
    world.plug(disk, "sda")
    # Without its group descriptors it is still recognised and cannot be mounted.
    world.sh("dd if=/dev/sda of=/run/world/saved bs=4096 skip=1 count=1 &&"
             "dd if=/dev/zero of=/dev/sda bs=4096 seek=1 count=1 conv=notrunc")
    daemon = start_daemon()
    daemon.wait_log("mount ERROR, /dev/sda ==> /tmp/mountd/disk1_part1", 40)
    assert world.mounted() == {}
    assert daemon.log().count("exec cmd = fsck") == 0

    world.sh("dd if=/run/world/saved of=/dev/sda bs=4096 seek=1 count=1 conv=notrunc")
    daemon.wait_log("mount OK, /dev/sda ==> /tmp/mountd/disk1_part1", 40)
    assert world.mounted() == {"/dev/sda": "/tmp/mountd/disk1_part1"}


@pytest.mark.takes_minutes
@pytest.mark.needs_fs("ext4")
def test_a_mount_that_never_appears_holds_up_neither_the_other_disk_nor_the_events(
        world, start_daemon):
    stub_mount(world, "/dev/sdb1", 1000)
    good, bad = world.whole_disk("ext4"), world.partitioned_disk(Partition("ext4", 1100))
    world.plug(good, "sda")
    world.plug(bad, "sdb")
    daemon = start_daemon()
    daemon.wait_log("mount ERROR, /dev/sdb1 ==> /tmp/mountd/disk2_part1", 60)
    assert world.mounted() == {"/dev/sda": "/tmp/mountd/disk1_part1"}

    # Events wait in the pipe during a try and are read between two passes.
    world.wait(lambda: len(mount_calls(world)) == 2, 40, "the second try")
    world.send("#heart_beat")
    daemon.wait_log("===> get event = EVENT_DISK_HEART_BEAT", 40)
    world.hotunplug(bad)
    world.wait(lambda: world.disk_num() == "1", 60, "the bad disk gone from the inventory")
    mark = daemon.mark()
    daemon.wait_idle_cycles(3)
    assert "/dev/sdb1" not in daemon.log_since(mark)
    assert world.mounted() == {"/dev/sda": "/tmp/mountd/disk1_part1"}


@pytest.mark.needs_fs("ext4")
def test_without_blkid_nothing_is_added_and_disks_appear_once_it_is_back(world, start_daemon):
    cold, hot = world.whole_disk("ext4"), world.partitioned_disk(Partition("ext4", 1100))
    world.tools.hide("blkid")
    world.plug(cold, "sda")
    daemon = start_daemon()
    world.hotplug(hot, "sdb")
    daemon.wait_log("=== ===> dev err, dev = /dev/sdb1")
    daemon.wait_rescan()
    assert "=== ===> dev err, dev = /dev/sda" in daemon.log()
    assert world.parts() == {}
    assert world.mounted() == {}
    assert world.disk_num() == "0"

    world.tools.unstub("blkid")
    world.announce(hot)
    world.announce(cold)
    world.wait(lambda: set(world.parts()) == {"sda", "sdb1"}, 40, "both disks in disk.json")
    assert set(world.mounted()) == {"/dev/sda", "/dev/sdb1"}


@pytest.mark.needs_fs("ext4")
def test_without_mount_the_daemon_goes_on_and_mounts_once_it_is_back(world, start_daemon):
    world.tools.hide("mount")
    world.plug(world.whole_disk("ext4"), "sda")
    daemon = start_daemon()
    daemon.wait_log("mount ERROR, /dev/sda ==> /tmp/mountd/disk1_part1", 40)
    assert world.mounted() == {}

    world.tools.unstub("mount")
    daemon.wait_log("mount OK, /dev/sda ==> /tmp/mountd/disk1_part1", 40)
    assert world.mounted() == {"/dev/sda": "/tmp/mountd/disk1_part1"}
    assert len(world.db_rows()) == 1


@pytest.mark.needs_fs("ext4")
def test_a_node_that_vanishes_between_event_and_mount_is_survived(world, daemon):
    doomed, other = world.partitioned_disk(Partition("ext4", 1200)), world.whole_disk("ext4")
    world.hotplug(doomed, "sda")
    daemon.wait_log("=== ===> dev is already add! dev name = sda1")
    # The kernel still lists the disk: one that it does not is not tried.
    for name in doomed.device_names():
        world.path(f"/dev/{name}").unlink()
    world.wait(lambda: "exec cmd = mount -t ext4 -o rw,defaults /dev/sda1" in daemon.log(), 30,
               "the mount of a device without a node")
    world.hotunplug(doomed, surprise=False)
    world.hotplug(other, "sdb")
    daemon.wait_log("mount ERROR, /dev/sda1 ==> /tmp/mountd/disk1_part1", 40)
    world.wait(lambda: set(world.parts()) == {"sdb"}, 40, "the other disk alone in disk.json")
    assert set(world.mounted()) == {"/dev/sdb"}
    assert world.disk_num() == "1"


@pytest.mark.needs_fs("ext4")
def test_a_node_that_is_gone_before_its_event_is_read_adds_nothing(world, daemon):
    disk = world.partitioned_disk(Partition("ext4", 1200))
    world.plug(disk, "sda")
    with daemon.held_still():
        world.announce(disk)
        world.pull(disk, surprise=False)
    daemon.wait_log("=== ===> dev err, dev = /dev/sda1")
    daemon.wait_idle_cycles(1)
    assert "dev ok" not in daemon.log()
    world.wait(lambda: world.disk_num() == "0", 30, "an empty inventory")


@pytest.mark.takes_minutes
@pytest.mark.needs_fs("ext4")
def test_a_busy_partition_gets_ten_further_unmounts_and_is_forgotten_with_the_services_back(
        world, start_daemon):
    world.plug(world.partitioned_disk(Partition("ext4", 1200), Partition("ext4", 1100)), "sda")
    daemon = start_daemon()
    world.wait(lambda: len(world.parts()) == 2, 30, "two partitions in disk.json")
    hold(world, "/tmp/mountd/disk1_part1")
    daemon.wait_rescan()
    world.tools.clear_logs()
    mark = daemon.mark()
    world.send("#remove_dev:sda1", pipe="remove")
    daemon.wait_log("clear ok, find dev = sda1", 40, since=mark)
    world.wait(lambda: len(world.tools.service_calls()) == 8, 30, "the services' restart")

    log = daemon.log_since(mark)
    assert log.count("exec cmd = umount /dev/sda1\n") == 1
    assert log.count("exec cmd = umount /tmp/mountd/disk1_part1\n") == 1 + FURTHER_UMOUNTS
    calls = world.tools.service_calls()
    assert [argument for _, argument, _ in calls] == ["stop"] * 4 + ["start"] * 4
    assert calls[4][2] - calls[3][2] >= FURTHER_UMOUNTS
    assert world.mounted()["/dev/sda1"] == "/tmp/mountd/disk1_part1"
    rows = {row["dev_name"]: row["mountd"] for row in world.db_rows()}
    assert rows == {"sda1": "no", "sda2": "yes"}
    world.wait(lambda: set(world.parts()) == {"sda2"}, 30, "sda2 alone in disk.json")
    daemon.wait_rescan()
    assert daemon.running


@pytest.mark.needs_fs("ext4")
def test_a_partition_that_becomes_free_during_the_further_unmounts_is_unmounted(
        world, start_daemon):
    world.plug(world.partitioned_disk(Partition("ext4", 1200)), "sda")
    daemon = start_daemon()
    daemon.wait_log("mount OK, /dev/sda1")
    holder = world.popen("/bin/sh", "-c", "cd /tmp/mountd/disk1_part1; echo inside; read -r line",
                         stdin=subprocess.PIPE, stdout=subprocess.PIPE)
    assert holder.stdout.readline() == b"inside\n"
    mark = daemon.mark()
    world.send("#remove_dev:sda1")
    world.wait(lambda: daemon.log_since(mark).count("exec cmd = umount ") >= 3, 30,
               "the first further try")
    holder.communicate(timeout=10)
    daemon.wait_log("clear ok, find dev = sda1", 30, since=mark)
    assert world.mounted() == {}
    assert daemon.log_since(mark).count("exec cmd = umount ") < 2 + FURTHER_UMOUNTS
