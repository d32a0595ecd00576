"""The hotplug script: kernel events become lines in the daemon's pipe, and never hold up the router."""

import os
import time

import pytest

from world import PIPES, Partition, wait_for
from world.state import PID_FILE

PIPE = PIPES["add_remove"]

ACCEPTED = ["sda", "sda1", "sdab12", "hdc", "mmcblk0", "mmcblk0p1", "mmcblk12p3", "s" + "d" + "x" * 29]
REFUSED = ["sd", "hd", "sr0", "loop0", "ram1", "mtdblock3", "nvme0n1", "dm-0", "zram0", "mmc0", "",
           "mmcblk0boot0", "mmcblk1boot1", "mmcblk0rpmb", "sda;reboot", "sda 1", "sda/1", "SDA",
           "sda$(id)", "sd" + "x" * 30]


def expect(router, *wanted, timeout=10):
    wait_for(lambda: router.messages() == list(wanted), timeout,
             lambda: f"{wanted}, got {router.messages()}")


def sentinel(router):
    """Send an event that surely arrives and wait for it; all earlier ones have been read then."""
    router.uevent("add", "sdz9")
    wait_for(lambda: "#add:sdz9" in router.messages(), 10, "the last message")
    return [line for line in router.messages() if line != "#add:sdz9"]


def mount_device(router, device):
    """Something that the mount table lists with this device."""
    router.world.sh(f"mkdir -p /tmp/mountd/x && mount -t tmpfs {device} /tmp/mountd/x")


def test_added_disks_and_partitions_are_told_in_their_order(router):
    router.start()
    router.uevent("add", "sda", "disk")
    router.uevent("add", "sda1")
    router.uevent("add", "sda2")
    expect(router, "#add:sda", "#add:sda1", "#add:sda2")


def test_removed_partitions_are_told(router):
    router.start()
    router.uevent("remove", "sda2")
    router.uevent("remove", "sda1")
    expect(router, "#remove_dev:sda2", "#remove_dev:sda1")


def test_a_removed_disk_is_told_when_the_disk_itself_is_mounted(router):
    router.start()
    mount_device(router, "/dev/sdb")
    router.uevent("remove", "sdb", "disk")
    expect(router, "#remove_dev:sdb")


def test_a_removed_disk_with_partitions_stops_the_services_no_further_time(router):
    router.start()
    mount_device(router, "/dev/sdb1")
    router.uevent("remove", "sdb1")
    router.uevent("remove", "sdb", "disk")
    assert sentinel(router) == ["#remove_dev:sdb1"]


@pytest.mark.parametrize("name", ACCEPTED)
def test_a_disk_name_is_told(router, name):
    router.start()
    router.uevent("add", name)
    expect(router, f"#add:{name}")


def test_names_that_the_daemon_ignores_or_a_shell_would_take_apart_are_not_told(router):
    router.start()
    for name in REFUSED:
        router.uevent("add", name)
        router.uevent("remove", name)
    assert sentinel(router) == []


def test_other_events_are_not_told(router):
    router.start()
    for action in ("change", "bind", "move", ""):
        router.uevent(action, "sda", "disk")
    router.uevent("add", "sda", "")
    assert sentinel(router) == []


def test_a_burst_of_parallel_events_loses_none_and_mixes_none(router):
    router.start()
    names = [f"sd{letter}{number}" for letter in "abcdefgh" for number in range(1, 16)]
    script = " ".join(f"( DEVNAME={name}; . /etc/hotplug.d/block/60-tarn_nas_diskmanager ) &"
                      for name in names)
    router.world.sh(f"export ACTION=add DEVTYPE=partition; {script} wait", timeout=100)
    wanted = sorted(f"#add:{name}" for name in names)
    wait_for(lambda: sorted(router.messages()) == wanted, 20,
             lambda: f"{wanted}, got {sorted(router.messages())}")


def test_without_a_pipe_nothing_happens(router):
    def seconds():
        began = time.monotonic()
        router.uevent("add", "sda", "disk")
        return time.monotonic() - began
    # One that waited for a reader would take 2 s each time; a busy machine does not.
    assert min(seconds() for _ in range(5)) < 2
    assert not router.world.exists(PIPE)


def test_a_pipe_that_a_dead_daemon_left_is_not_written_to(router):
    pid = router.start()
    router.world.write("/run/procd/respawn_delay", "1000")
    router.world.run("kill", "-KILL", pid)
    wait_for(lambda: not router.pids(), 10, "the daemon's end")
    assert router.world.exists(PID_FILE)
    fd = os.open(router.world.path(PIPE), os.O_RDWR | os.O_NONBLOCK)
    try:
        router.uevent("add", "sda", "disk")
        with pytest.raises(BlockingIOError):
            os.read(fd, 100)
    finally:
        os.close(fd)


def test_a_pipe_that_is_being_replaced_does_not_come_back_as_a_plain_file(router):
    router.start()
    router.world.path(PIPE).unlink()
    router.uevent("add", "sda", "disk")
    assert not router.world.exists(PIPE)


def test_a_full_pipe_holds_the_event_up_for_seconds_only_and_is_logged(router):
    syslog = router.world.syslog()
    router.mode("deaf")
    router.start()
    fd = os.open(router.world.path(PIPE), os.O_WRONLY | os.O_NONBLOCK)
    with pytest.raises(BlockingIOError):
        while True:
            os.write(fd, b"#heart_beat\n" * 100)
    with pytest.raises(BlockingIOError):
        while True:
            os.write(fd, b"\n")
    os.close(fd)
    began = time.monotonic()
    router.uevent("add", "sda", "disk")
    assert 1 < time.monotonic() - began < 20
    syslog.wait_message("lost #add:sda", ident="tarn_nas_diskmanager", timeout=5)


def sleepers(router):
    return router.world.sh("pidof sleep; true").stdout.split()


def test_an_event_leaves_no_process_behind(router):
    router.start()
    # The heart-beat's pause stays; what else sleeps at the start ends within seconds.
    wait_for(lambda: len(sleepers(router)) == 1, 10, "the heart-beat's pause alone")
    router.uevent("add", "sda", "disk")
    assert len(sleepers(router)) == 1


def test_a_hundred_events_wait_for_a_busy_daemon(router):
    router.mode("deaf")
    router.start()
    script = ("i=0; while [ $i -lt 100 ]; do DEVNAME=sda$i;"
              " ( . /etc/hotplug.d/block/60-tarn_nas_diskmanager ); i=$((i + 1)); done")
    router.world.run("env", "ACTION=add", "DEVTYPE=partition", "/bin/sh", "-c", script, timeout=100)
    assert router.messages() == []
    router.mode("")
    expect(router, *(f"#add:sda{number}" for number in range(100)))


def quiet_moment(router):
    """Wait until the daemon has done all that was sent, almost 3 s before it acts on its own."""
    # Of this pipe the messages are taken last.
    message = f"#heart_beat:{len(router.output())}"
    router.world.send(message, pipe="remove", timeout=60)
    wait_for(lambda: f"get event = {message}\n" in router.output(), 60, f"{message} to be read")


STOPPED = [(name, "stop") for name in ("samba4", "nas_samba3", "tarn_nas_sys_dl", "tarn_nas_sys_up")]


def service_calls(router):
    return [call[:2] for call in router.world.tools.service_calls()]


def test_the_real_daemon_mounts_and_unmounts_a_disk_without_a_table(real_router):
    world = real_router.world
    real_router.start()
    stick = world.whole_disk("ext4", 1200, label="STICK")
    world.plug(stick, "sda")
    real_router.uevent("add", "sda", "disk")
    wait_for(lambda: "/dev/sda" in world.mounted(), 60, "the mount")
    quiet_moment(real_router)
    world.pull(stick)
    real_router.uevent("remove", "sda", "disk")
    wait_for(lambda: not world.mounted(), 10, "the unmount")
    assert service_calls(real_router)[:4] == STOPPED


def test_a_pulled_disk_stops_the_real_daemons_services_once_for_each_partition(real_router):
    world = real_router.world
    disk = world.partitioned_disk(Partition(fs="ext4"), Partition(fs="ext4"))
    world.plug(disk, "sda")
    real_router.start()
    wait_for(lambda: len(world.mounted()) == 2, 60, "both mounts")
    quiet_moment(real_router)
    world.pull(disk)
    for name in ("sda2", "sda1"):
        real_router.uevent("remove", name)
    real_router.uevent("remove", "sda", "disk")
    wait_for(lambda: not world.mounted(), 30, "the unmounts")
    wait_for(lambda: (world.disk_json() or {}).get("disk_number") == 0, 30, "an empty inventory")
    quiet_moment(real_router)
    assert service_calls(real_router).count(("samba4", "stop")) == 2
    assert "manager work again!" not in real_router.output()
