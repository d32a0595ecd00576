"""The main story with a router's tools: busybox as shell, mount, umount, pgrep, pidof and the rest.

Told by the release binary and by the static one for routers of this architecture.
"""

import os
from pathlib import Path

import pytest
from shared.moments import quiet_moment

from world import Partition, kernel_has
from world.built import RELEASE, STATIC, outdated, why_not
from world.state import PID_FILE

pytestmark = pytest.mark.needs_fs("ext4")


@pytest.fixture(params=[RELEASE, STATIC], ids=["release", "static"])
def router(request, make_world):
    """A world with busybox whose daemon is one of the two."""
    if reason := why_not(request.param):
        pytest.skip(reason)
    return make_world(tools="busybox", program=request.param)


def test_the_tools_are_busybox(router):
    for name in ("sh", "mount", "umount", "pgrep", "pidof", "mkdir", "chmod", "rm"):
        assert "BusyBox" in router.sh(f"{name} --help 2>&1", check=False).stdout


def test_a_program_that_is_older_than_a_source_is_told_from_a_fresh_one(tmp_path):
    for place in ("src/main", "platform"):
        (tmp_path / place).mkdir(parents=True)
    source, program = tmp_path / "src/main/main.cpp", tmp_path / "program"
    source.touch()
    program.touch()
    os.utime(source, ns=(0, 2000))
    os.utime(program, ns=(0, 2000))
    assert outdated(program, tmp_path) is None
    os.utime(program, ns=(0, 1999))
    assert outdated(program, tmp_path) == Path("src/main/main.cpp")


def test_cold_plugged_disks_are_mounted_published_and_remembered(router):
    second = Partition("ntfs", 1100, "WIN") if kernel_has("ntfs") else Partition("ext4", 1100, "WIN")
    big = router.partitioned_disk(Partition("ext4", 1300, "DATA"), second, Partition("ext4", 500))
    card = router.whole_disk("ext4")
    router.plug(card, "mmcblk0")
    router.plug(big, "sda")
    router.start_daemon()
    router.wait(lambda: len(router.parts()) == 3, 40, "three partitions in disk.json")

    parts = router.parts()
    assert {name: (part.disk_name, part.label, part.sd_card) for name, part in parts.items()} == {
        "sda1": ("disk1_part1", "DATA", 0), "sda2": ("disk1_part2", "WIN", 0),
        "mmcblk0": ("disk2_part1", "mmcblk0", 1)}
    assert router.mounted() == {f"/dev/{name}": part.path for name, part in parts.items()}
    assert parts["sda1"].free_size > 1000
    assert {(row["disk_name"], row["mountd"]) for row in router.db_rows()} == {
        (part.disk_name, "yes") for part in parts.values()}
    assert router.disk_num() == "2"


def test_a_hot_plugged_disk_comes_goes_and_returns_to_its_directory(router):
    daemon = router.start_daemon()
    first, other = (router.partitioned_disk(Partition("ext4", 1100)) for _ in range(2))
    router.hotplug(first, "sda")
    daemon.wait_log("mount OK, /dev/sda1 ==> /tmp/mountd/disk1_part1")
    router.sh("cd /tmp/mountd/disk1_part1 && echo kept > file && fsync file")
    router.hotplug(other, "sdb")
    daemon.wait_log("mount OK, /dev/sdb1 ==> /tmp/mountd/disk2_part1")
    daemon.wait_rescan()
    quiet_moment(router, daemon)

    router.hotunplug(first)
    router.hotunplug(other)
    router.wait(lambda: router.disk_num() == "0", 30, "an empty inventory")
    assert router.mounted() == {}
    assert [row["mountd"] for row in router.db_rows()] == ["no", "no"]
    calls = [(name, argument) for name, argument, _ in router.tools.service_calls()]
    assert calls[:2] == [("samba4", "stop"), ("nas_samba3", "stop")]
    assert len(calls) == 4 * 8

    router.hotplug(other, "sda")
    daemon.wait_log("mount OK, /dev/sda1 ==> /tmp/mountd/disk2_part1")
    router.hotplug(first, "sdb")
    daemon.wait_log("mount OK, /dev/sdb1 ==> /tmp/mountd/disk1_part1")
    assert router.read("/tmp/mountd/disk1_part1/file") == "kept\n"


def test_one_partition_is_removed_by_device_and_one_by_directory(router):
    disk = router.partitioned_disk(*(Partition("ext4", size) for size in (1300, 1200, 1100)))
    router.plug(disk, "sda")
    router.start_daemon()
    router.wait(lambda: len(router.parts()) == 3, 40, "three partitions in disk.json")
    router.send("#remove_dev:sda2", pipe="remove")
    router.send("#remove_disk:disk1_part3", pipe="remove")
    router.wait(lambda: set(router.parts()) == {"sda1"}, 30, "sda1 alone in disk.json")
    assert router.mounted() == {"/dev/sda1": "/tmp/mountd/disk1_part1"}


def test_a_safe_removal_unmounts_all_and_an_announced_disk_comes_back(router):
    disk = router.partitioned_disk(Partition("ext4", 1100))
    router.plug(disk, "sda")
    router.plug(router.whole_disk("ext4"), "sdb")
    daemon = router.start_daemon()
    router.wait(lambda: len(router.parts()) == 2, 40, "two partitions in disk.json")
    router.safe_remove()
    daemon.wait_log("disk safe remove ...", 30)
    assert router.mounted() == {}
    assert router.disk_num() == "0"
    router.announce(disk)
    daemon.wait_log("mount OK, /dev/sda1 ==> /tmp/mountd/disk", 30)
    router.wait(lambda: "sda1" in router.parts(), 30, "sda1 in disk.json")
    assert [part.path for part in router.parts().values() if part.dev_name == "sda1"] == [
        router.mounted()["/dev/sda1"]]


def test_a_restarted_daemon_forces_old_mounts_off_and_keeps_the_directories(router):
    small, large = router.whole_disk("ext4", 1100), router.whole_disk("ext4", 1300)
    router.plug(small, "sda")
    first = router.start_daemon()
    first.wait_log("mount OK, /dev/sda ==> /tmp/mountd/disk1_part1")
    router.hotplug(large, "sdb")
    first.wait_log("mount OK, /dev/sdb ==> /tmp/mountd/disk2_part1")
    kept = {"/dev/sda": "/tmp/mountd/disk1_part1", "/dev/sdb": "/tmp/mountd/disk2_part1"}
    assert first.stop() == 0
    assert not router.exists(PID_FILE)
    assert router.mounted() == kept

    # By size alone the two would change places.
    second = router.start_daemon()
    assert "exec cmd = umount -f /dev/sda\n" in second.log()
    router.wait(lambda: len(router.mounted()) == 2, 40, "two mounts")
    assert router.mounted() == kept
    assert len(router.mounts()) == 2


def test_a_failed_self_check_restarts_the_daemon_through_its_init_script(router):
    router.tools.init_script("tarn_nas_diskmanager", f"""#!/bin/sh
[ -e {PID_FILE} ] && exit 1
exec {router.program} > /run/world/second.log 2>&1
""")
    router.plug(router.whole_disk("ext4"), "sda")
    daemon = router.start_daemon()
    daemon.wait_log("mount OK, /dev/sda ==> /tmp/mountd/disk1_part1")
    router.path("/dev/sda").rename(router.path("/dev/sdb"))
    assert daemon.wait_exit(40) == 0
    router.path("/dev/sdb").rename(router.path("/dev/sda"))
    router.wait(lambda: router.exists("/run/world/second.log")
                and "mount OK, /dev/sda" in router.read("/run/world/second.log"), 40,
                "the second instance's mount")
    assert router.mounted() == {"/dev/sda": "/tmp/mountd/disk1_part1"}


def test_a_second_instance_is_refused_and_a_stale_pid_file_is_not(router):
    router.write(PID_FILE, "4000000")
    daemon = router.start_daemon()
    assert router.read(PID_FILE) == str(daemon.pid)
    second = router.run(router.program, check=False, timeout=20)
    assert second.returncode == 1
    assert "===> pid exist, file = /tmp/tarn_nas//disk_manager_pid" in second.stdout
    assert router.read(PID_FILE) == str(daemon.pid)
    assert daemon.stop() == 0
    assert not router.exists(PID_FILE)


@pytest.mark.takes_minutes
def test_the_companion_is_found_by_name_when_the_silence_is_too_long(router):
    router.start_companion()
    daemon = router.start_daemon()
    daemon.wait_log("get app = tarn_nas_sys, pid = ", 100)
    daemon.wait_idle_cycles(2)
    assert daemon.running
