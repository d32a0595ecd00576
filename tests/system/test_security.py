"""What strangers can plant: links and directories in /tmp, commands in names and labels."""

import contextlib
import os

import pytest
from shared.published import wait_mounted

from world import Partition

STRANGER = 4711
VICTIM = "/etc/victim"
SCRATCH = ("disk_pid_tmp", "pid", "mount.txt", "tmp_blkid", "out.txt", "disk_uid.txt", "disk_label")
HARM = "/tmp/harm"
COMMANDS = ("; touch /tmp/harm", "$(touch${IFS}/tmp/harm)", "`touch${IFS}/tmp/harm`",
            "|touch${IFS}/tmp/harm", "&touch${IFS}/tmp/harm", "\"';touch${IFS}/tmp/harm;'\"")


def give_away(world, path):
    os.chown(world.path(path), STRANGER, STRANGER, follow_symlinks=False)


def plant_links(world, target):
    """A stranger's link under every scratch name that is free: /tmp is sticky."""
    for name in SCRATCH:
        with contextlib.suppress(FileExistsError):
            world.path(f"/tmp/{name}").symlink_to(target)
            give_away(world, f"/tmp/{name}")


@pytest.mark.needs_fs("ext4")
@pytest.mark.parametrize("target", [VICTIM, "/etc/not_there"])
def test_links_planted_under_the_scratch_names_are_not_followed(world, start_daemon, target):
    world.write(VICTIM, "precious\n")
    world.label_script("#!/bin/sh\necho 'From the script'\n")
    world.write("/tmp/tarn_nas/disk_manager_pid", "99999")
    plant_links(world, target)
    daemon = start_daemon()
    disk = world.partitioned_disk(Partition("ext4", 1200, "DATA"))
    plant_links(world, target)
    world.hotplug(disk, "sda")
    wait_mounted(world, {"sda1": "disk1_part1"})
    assert world.parts()["sda1"].label == "From the script"
    plant_links(world, target)
    daemon.wait_rescan()
    world.hotunplug(disk)
    wait_mounted(world, {})

    assert world.read(VICTIM) == "precious\n"
    assert not world.exists("/etc/not_there")
    assert daemon.running


@pytest.mark.needs_fs("ext4")
def test_directories_planted_under_the_scratch_names_are_moved_aside(world, start_daemon):
    for name in SCRATCH:
        world.write(f"/tmp/{name}/inside", "x")
        give_away(world, f"/tmp/{name}")
    # With a pid file and a label script all are used but the companion's, which is asked for much later.
    world.write("/tmp/tarn_nas/disk_manager_pid", "99999")
    world.label_script("#!/bin/sh\necho 'From the script'\n")
    world.plug(world.partitioned_disk(Partition("ext4", 1200, "DATA")), "sda")
    start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1"})
    assert world.parts()["sda1"].label == "From the script"
    assert [name for name in SCRATCH if world.path(f"/tmp/{name}").is_dir()] == ["pid"]
    assert len(list(world.path("/tmp").glob("foreign-*/entry/inside"))) == len(SCRATCH) - 1


@pytest.mark.needs_fs("ext4")
def test_runtime_and_mount_directories_of_a_stranger_are_replaced(world, start_daemon):
    world.write(VICTIM, "precious\n")
    for directory in ("/tmp/tarn_nas", "/tmp/mountd"):
        world.path(directory).mkdir()
    for name in ("disk.json", "disk_num.txt", "disk_manager_pid"):
        world.path(f"/tmp/tarn_nas/{name}").symlink_to(VICTIM)
    world.path("/tmp/mountd/disk1_part1").symlink_to("/etc")
    for directory in ("/tmp/tarn_nas", "/tmp/mountd"):
        give_away(world, directory)
    world.plug(world.partitioned_disk(Partition("ext4", 1200)), "sda")
    start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1"})

    assert world.read(VICTIM) == "precious\n"
    for directory in ("/tmp/tarn_nas", "/tmp/mountd", "/tmp/mountd/disk1_part1"):
        status = os.lstat(world.path(directory))
        assert status.st_uid == 0
    assert not world.path("/tmp/tarn_nas/disk.json").is_symlink()
    assert world.mounted() == {"/dev/sda1": "/tmp/mountd/disk1_part1"}


@pytest.mark.needs_fs("ext4")
def test_a_command_in_a_label_is_only_text(world, start_daemon):
    world.plug(world.partitioned_disk(Partition("ext4", 1200, "$(touch /harm)"),
                                      Partition("ext4", 1100, "`touch /harm`")), "sda")
    start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1", "sda2": "disk1_part2"})
    assert not world.exists("/harm")
    assert world.parts()["sda1"].label == "$(touch"


@pytest.mark.needs_fs("ext4")
@pytest.mark.parametrize("text", COMMANDS)
def test_a_command_in_what_blkid_tells_is_only_text(world, start_daemon, text):
    answer = f'UUID="{text}" TYPE="ext4" LABEL="{text}"'.replace("'", "'\\''")
    world.tools.stub("blkid", f"for node; do :; done\nprintf '%s: %s\\n' \"$node\" '{answer}'\n")
    world.plug(world.partitioned_disk(Partition("ext4", 1200)), "sda")
    daemon = start_daemon()
    world.wait(lambda: "/dev/sda1" in world.mounted(), 30, "a mount of sda1")
    daemon.wait_idle_cycles(1)
    assert not world.exists(HARM)
    assert daemon.running


@pytest.mark.needs_fs("ext4")
def test_a_command_in_the_label_scripts_output_is_only_text(world, start_daemon):
    world.label_script("#!/bin/sh\necho '$(touch /tmp/harm);touch /tmp/harm'\n")
    world.plug(world.partitioned_disk(Partition("ext4", 1200, "DATA")), "sda")
    start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1"})
    assert world.parts()["sda1"].label == "$(touch /tmp/harm);touch /tmp/harm"
    assert not world.exists(HARM)


def test_a_command_in_the_name_of_an_event_is_not_run(world, daemon):
    for text in COMMANDS:
        for event in ("add", "remove_dev", "remove_disk"):
            mark = daemon.mark()
            # A semicolon would end the message.
            world.send_bytes(f"#{event}:sda{text}".replace(";", "&").encode() + b"\n")
            daemon.wait_log("===> get event = ", since=mark)
    daemon.wait_idle_cycles(1)
    assert not world.exists(HARM)


@pytest.mark.needs_fs("ext4")
def test_a_device_whose_name_is_a_command_is_passed_over(world, start_daemon):
    world.sysfs.add_disk("sdb;touch${IFS}harm", 4096 * 1024, os.makedev(7, 250))
    world.plug(world.partitioned_disk(Partition("ext4", 1200)), "sda")
    daemon = start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1"})
    daemon.wait_rescan()
    assert "exec cmd = blkid /dev/sdb;" not in daemon.log()
    assert not list(world.path("/").glob("harm")) and not list(world.path("/tmp").glob("harm"))


@pytest.mark.needs_fs("ext4")
@pytest.mark.parametrize("path", ["/tmp/mountd/x;touch /tmp/harm", "/tmp/mountd/$(touch /tmp/harm)",
                                  "/etc", "/tmp/mountd/../../etc", "/tmp/mountd/a/b", "/tmp/mountd"])
def test_a_tampered_row_is_no_row_and_is_logged(world, start_daemon, path):
    disk = world.partitioned_disk(Partition("ext4", 1200))
    world.plug(disk, "sda")
    daemon = start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1"})
    daemon.wait_rescan()
    world.hotunplug(disk)
    wait_mounted(world, {})
    world.db_execute("update disk set mount_path=?, disk_name=?, dev_name=?",
                     (path, "x;touch /tmp/harm", "sda;touch /tmp/harm"))
    world.hotplug(disk, "sda")
    wait_mounted(world, {"sda1": "disk1_part1"})
    daemon.wait_log("remembered path err, uid = ")
    assert world.db_rows()[0]["mount_path"] == "/tmp/mountd/disk1_part1"
    assert not world.exists(HARM)
    assert world.mounted() == {"/dev/sda1": "/tmp/mountd/disk1_part1"}


def test_the_pipes_are_roots_alone(world, daemon):
    for name in ("add_remove", "safe_remove", "remove"):
        status = os.stat(world.path(f"/tmp/tarn_nas/pipe_disk_{name}"))
        assert (status.st_uid, status.st_mode & 0o777) == (0, 0o600)
    for path in ("/tmp/tarn_nas", "/tmp/tarn_nas/disk_manager_pid", "/etc/config/tarn_nas"):
        status = os.stat(world.path(path))
        assert status.st_uid == 0 and not status.st_mode & 0o022, path
