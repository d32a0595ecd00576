"""How long the daemon lives: the heart-beat limit, and the restart after a failed self-check."""

import os
import stat
import time

import pytest
from shared.busy import hold

from world import Partition
from world.state import DISK_DB, PID_FILE

RESTART_NOTE = "/run/world/restart.txt"
SECOND_LOG = "/run/world/second.log"

# Says whether the pid file is there when the daemon asks for its restart.
NOTING_INIT_SCRIPT = f"""#!/bin/sh
[ -e {PID_FILE} ] && state=present || state=absent
[ -e {DISK_DB} ] && base=present || base=absent
echo "$* pid $state db $base" >> {RESTART_NOTE}
"""


def restart_notes(world):
    return world.read(RESTART_NOTE).splitlines() if world.exists(RESTART_NOTE) else []


@pytest.mark.takes_minutes
def test_silence_with_the_companion_only_warns_and_starts_the_count_again(world, start_daemon):
    world.start_companion()
    daemon = start_daemon()
    line = daemon.wait_log("sys timeout, ", 100)
    elapsed, limit = line.split("sys timeout, ")[1].split(" > ")
    assert limit == "60"
    # One cycle behind the limit, or the next where a command held the first up.
    assert 61 <= int(elapsed) <= 70
    daemon.wait_log("get app = tarn_nas_sys, pid = ")
    daemon.wait_idle_cycles(3)
    assert daemon.log().count("sys timeout, ") == 1
    world.send("#heart_beat")
    daemon.wait_log("===> get event = EVENT_DISK_HEART_BEAT")


@pytest.mark.takes_minutes
@pytest.mark.needs_fs("ext4")
def test_silence_without_the_companion_ends_the_daemon_with_0_and_keeps_mounts_and_memory(
        world, start_daemon):
    world.tools.init_script("tarn_nas_diskmanager", NOTING_INIT_SCRIPT)
    world.plug(world.whole_disk("ext4"), "sda")
    daemon = start_daemon()
    started = time.monotonic()
    assert daemon.wait_exit(110) == 0
    assert time.monotonic() - started > 58

    assert "sys timeout, " in daemon.log()
    assert "===> proc not exist, name = tarn_nas_sys" in daemon.log()
    assert daemon.log().count("manager work again!") == 1
    assert not world.exists(PID_FILE)
    assert world.mounted() == {"/dev/sda": "/tmp/mountd/disk1_part1"}
    assert [row["disk_name"] for row in world.db_rows()] == ["disk1_part1"]
    assert restart_notes(world) == []


@pytest.mark.takes_minutes
def test_a_companion_that_ends_during_the_silence_does_not_keep_the_daemon(world, start_daemon):
    companion = world.start_companion()
    daemon = start_daemon()
    daemon.wait_idle_cycles(10)
    world.stop_companion(companion)
    assert daemon.wait_exit(80) == 0
    assert daemon.log().count("sys timeout, ") == 1


@pytest.mark.takes_minutes
@pytest.mark.needs_fs("ext4")
def test_a_safe_removal_makes_the_silence_limit_five_times_as_long(world, start_daemon):
    world.plug(world.whole_disk("ext4"), "sda")
    daemon = start_daemon()
    world.safe_remove()
    daemon.wait_log("===> safe remove disk", 40)
    started = time.monotonic()
    # A parked cycle takes a second more than an idle one.
    daemon.wait_idle_cycles(18, 110)
    assert time.monotonic() - started > 66
    assert "sys timeout" not in daemon.log()
    world.send("#heart_beat")
    daemon.wait_log("===> get event = EVENT_DISK_HEART_BEAT")


@pytest.mark.takes_minutes
def test_each_heart_beat_starts_the_silence_anew(world, start_daemon):
    daemon = start_daemon()
    started = time.monotonic()
    while time.monotonic() - started < 66:
        world.send("#heart_beat", pipe="remove")
        daemon.wait_idle_cycles(6)
    assert "sys timeout" not in daemon.log()
    assert daemon.running


@pytest.mark.takes_minutes
def test_bad_messages_do_not_count_as_events_against_the_silence(world, start_daemon):
    daemon = start_daemon()
    started = time.monotonic()
    while daemon.running and time.monotonic() - started < 100:
        if world.exists(PID_FILE):
            world.send("#nonsense", "no event at all")
        world.wait(lambda mark=daemon.mark(): not daemon.running
                   or daemon.log_since(mark).count("no event ...") >= 4, 40, "idle cycles")
    assert daemon.returncode == 0
    assert "sys timeout, " in daemon.log()


def start_noting_daemon(world, start_daemon):
    """A daemon with one mounted disk, whose restart command is only noted."""
    world.tools.init_script("tarn_nas_diskmanager", NOTING_INIT_SCRIPT)
    world.plug(world.whole_disk("ext4"), "sda")
    daemon = start_daemon()
    daemon.wait_log("mount OK, /dev/sda ==> /tmp/mountd/disk1_part1")
    world.wait(world.db_rows, 30, "the remembered directory")
    return daemon


def mount_second_device(world, path):
    """Mount another disk's filesystem on `path`, under a node that the rescan cannot know."""
    other = world.whole_disk("ext4")
    world.plug(other, "nvme0n1")
    os.mknod(world.path("/dev/sdy"), stat.S_IFBLK | 0o660, other.loops["nvme0n1"].devno)
    world.run("mount", "/dev/sdy", path)


def assert_ended_for_restart(world, daemon):
    assert daemon.wait_exit(40) == 0
    assert "manager work again!" in daemon.log()
    world.wait(lambda: restart_notes(world), 30, "the restart command")
    assert restart_notes(world) == ["restart pid absent db absent"]
    assert "exec cmd = /etc/init.d/tarn_nas_diskmanager restart &" in daemon.log()


@pytest.mark.needs_fs("ext4")
def test_two_devices_on_one_directory_end_the_daemon_with_a_restart_and_without_database(
        world, start_daemon):
    daemon = start_noting_daemon(world, start_daemon)
    mount_second_device(world, "/tmp/mountd/disk1_part1")
    daemon.wait_log("mount path err:", 30)
    daemon.wait_log("/dev/sda ===> /tmp/mountd/disk1_part1")
    daemon.wait_log("/dev/sdy ===> /tmp/mountd/disk1_part1")
    assert_ended_for_restart(world, daemon)


@pytest.mark.needs_fs("ext4")
def test_a_mounted_device_whose_node_is_gone_ends_the_daemon_with_a_restart_and_without_database(
        world, start_daemon):
    daemon = start_noting_daemon(world, start_daemon)
    world.path("/dev/sda").unlink()
    daemon.wait_log("dev not find, dev = /dev/sda", 30)
    assert_ended_for_restart(world, daemon)


@pytest.mark.needs_fs("ext4")
def test_mounts_in_order_never_lead_to_a_restart(world, start_daemon):
    daemon = start_noting_daemon(world, start_daemon)
    mount_second_device(world, world.run("mktemp", "-d", "-p", "/tmp/mountd").stdout.strip())
    daemon.wait_rescan()
    daemon.wait_idle_cycles(2)
    assert daemon.running
    assert world.exists(DISK_DB)
    assert restart_notes(world) == []


def really_restarting(world):
    """An init script whose restart starts the daemon again, as procd would."""
    world.tools.init_script("tarn_nas_diskmanager", NOTING_INIT_SCRIPT
                            + f"exec {world.program} > {SECOND_LOG} 2>&1\n")


@pytest.mark.needs_fs("ext4")
def test_a_restart_starts_an_instance_that_mounts_everything_again(world, start_daemon):
    big = world.partitioned_disk(Partition("ext4", 1300), Partition("ext4", 1200))
    small = world.whole_disk("ext4")
    world.plug(small, "sda")
    daemon = start_daemon()
    first_pid = daemon.pid
    daemon.wait_log("mount OK, /dev/sda ==> /tmp/mountd/disk1_part1")
    really_restarting(world)
    mount_second_device(world, "/tmp/mountd/disk1_part1")
    world.plug(big, "sdb")
    assert daemon.wait_exit(60) == 0

    # Numbered afresh: the larger disk comes first, and the hand-made mount is gone.
    expected = {"/dev/sda": "/tmp/mountd/disk2_part1", "/dev/sdb1": "/tmp/mountd/disk1_part1",
                "/dev/sdb2": "/tmp/mountd/disk1_part2"}
    world.wait(lambda: world.mounted() == expected, 60, "all mounts of the second instance")
    world.wait(lambda: len(world.parts()) == 3, 30, "all partitions in disk.json")
    assert {row["mount_path"] for row in world.db_rows()} == set(expected.values())
    assert restart_notes(world) == ["restart pid absent db absent"]
    assert world.read(PID_FILE) not in ("", str(first_pid))
    assert "===> pid Not exist" in world.read(SECOND_LOG)
    world.send("#heart_beat")
    world.wait(lambda: "EVENT_DISK_HEART_BEAT" in world.read(SECOND_LOG), 30,
               "an event served by the second instance")


@pytest.mark.needs_fs("ext4")
def test_a_pulled_disk_that_a_process_keeps_busy_leads_to_a_restart(world, start_daemon):
    world.tools.init_script("tarn_nas_diskmanager", NOTING_INIT_SCRIPT)
    disk = world.partitioned_disk(Partition("ext4", 1200))
    world.plug(disk, "sda")
    daemon = start_daemon()
    daemon.wait_log("mount OK, /dev/sda1 ==> /tmp/mountd/disk1_part1")
    daemon.wait_rescan()
    hold(world, "/tmp/mountd/disk1_part1")

    world.hotunplug(disk)
    daemon.wait_log("dev not find, dev = /dev/sda1", 90)
    assert_ended_for_restart(world, daemon)
