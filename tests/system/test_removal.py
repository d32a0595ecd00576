"""Removal of partitions and disks, by event, by pulling and all at once."""

import pytest
from shared.busy import END_HOLDER, hold
from shared.moments import first_rescan_over, quiet_moment
from shared.published import directories, wait_directories, wait_mounted

from world import Partition

pytestmark = [pytest.mark.needs_fs("ext4"), pytest.mark.usefixtures("watched_status")]

SERVICES = ["samba4", "nas_samba3", "tarn_nas_sys_dl", "tarn_nas_sys_up"]
STOPPED = [(name, "stop") for name in SERVICES]
STARTED = [(name, "start") for name in SERVICES]
# A service that works on the shared files as long as it runs.
_FILE_SERVER = f"""#!/bin/sh
echo "samba4 $1 0" >> /run/world/services.log
[ "$1" = stop ] || exit 0
{END_HOLDER}
"""


def swap(size_mib, **options):
    """A partition that is listed but never mounted, so that nobody waits for its mount."""
    return Partition("swap", size_mib, **options)


def calls(world):
    return [(name, argument) for name, argument, _ in world.tools.service_calls()]


def commands(log):
    """What the daemon ran, in order."""
    return [line.split("exec cmd = ", 1)[1] for line in log.splitlines() if "exec cmd = " in line]


def mountd_flags(world):
    return {row["dev_name"]: row["mountd"] for row in world.db_rows()}


def test_a_mounted_partition_is_removed_while_the_services_that_use_it_are_stopped(
        world, start_daemon):
    disk = world.partitioned_disk(Partition("ext4", 1300), swap(1200))
    world.plug(disk, "sda")
    daemon = start_daemon()
    wait_directories(world, {"sda1": "disk1_part1", "sda2": "disk1_part2"})
    world.tools.init_script("samba4", _FILE_SERVER)
    server = hold(world, "/tmp/mountd/disk1_part1")
    assert world.run("umount", "/dev/sda1", check=False).returncode != 0

    mark = daemon.mark()
    world.send("#remove_dev:sda1", pipe="remove")
    wait_directories(world, {"sda2": "disk1_part2"})
    server.wait(30)
    assert world.mounted() == {}
    assert calls(world) == STOPPED + STARTED
    ran = [command for command in commands(daemon.log_since(mark))
           if not command.startswith("mount")]
    assert ran[:10] == [f"/etc/init.d/{name} stop" for name in SERVICES] + [
        "umount /dev/sda1", "umount /tmp/mountd/disk1_part1"] + [
        f"/etc/init.d/{name} start" for name in SERVICES]
    assert mountd_flags(world)["sda1"] == "no"
    assert world.path("/tmp/mountd/disk1_part1").is_dir()


@pytest.mark.parametrize("message", ["#remove_dev:sdq1", "#remove_disk:disk9_part9"])
def test_services_are_stopped_and_started_for_an_unknown_name_too(world, start_daemon, message):
    world.plug(world.partitioned_disk(Partition("ext4", 1200)), "sda")
    daemon = start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1"})
    world.send(message)
    world.wait(lambda: calls(world) == STOPPED + STARTED, 30, "the services' calls")
    daemon.wait_log("no event ...", since=daemon.mark())
    wait_mounted(world, {"sda1": "disk1_part1"})
    assert "umount" not in "".join(commands(daemon.log()))


def test_a_whole_disk_is_removed_by_its_name_with_all_its_partitions(world, start_daemon):
    disk = world.partitioned_disk(Partition("ext4", 1300), Partition("ext4", 1200))
    other = world.partitioned_disk(swap(1100))
    world.plug(disk, "sda")
    world.plug(other, "sdb")
    daemon = start_daemon()
    wait_directories(world, {"sda1": "disk1_part1", "sda2": "disk1_part2", "sdb1": "disk2_part1"})
    world.send("#remove_dev:sda", pipe="remove")
    wait_directories(world, {"sdb1": "disk2_part1"})

    log = daemon.log()
    order = ["remove root dev = sda\n", "remove disk, root dev = sda\n", "==> umount dev = sda1\n",
             "==> umount dev = sda2\n", "=== === ===> remove root path:\n",
             "==> umount dev = sda\n"]
    places = [log.index(text) for text in order]
    assert places == sorted(places)
    assert world.mounted() == {}
    assert world.disk_num() == "1"
    assert calls(world) == STOPPED + STARTED


def test_a_directory_name_removes_its_partition_and_the_last_one_its_disk(world, start_daemon):
    disk = world.partitioned_disk(Partition("ext4", 1300), swap(1200))
    stick = world.whole_disk("ext4", 1100)
    world.plug(disk, "sda")
    world.plug(stick, "sdb")
    daemon = start_daemon()
    wait_directories(world, {"sda1": "disk1_part1", "sda2": "disk1_part2", "sdb": "disk2_part1"})

    # Only partitions are found by directory name, a whole device is not.
    world.send("#remove_disk:disk2_part1", "#remove_disk:sda1", "#remove_disk:disk1_part1",
               pipe="remove")
    wait_directories(world, {"sda2": "disk1_part2", "sdb": "disk2_part1"})
    assert world.mounted() == {"/dev/sdb": "/tmp/mountd/disk2_part1"}
    assert calls(world) == 3 * (STOPPED + STARTED)
    assert mountd_flags(world) == {"sda1": "no", "sda2": "yes", "sdb": "yes"}

    world.send("#remove_disk:disk1_part2", pipe="remove")
    wait_directories(world, {"sdb": "disk2_part1"})
    world.wait(lambda: world.disk_num() == "1", 30, "1 in disk_num.txt")
    assert daemon.running


def test_a_mount_that_stays_busy_is_left_after_ten_more_tries_and_forgotten(world, start_daemon):
    world.plug(world.partitioned_disk(Partition("ext4", 1200)), "sda")
    daemon = start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1"})
    holder = hold(world, "/tmp/mountd/disk1_part1")
    mark = daemon.mark()
    world.send("#remove_dev:sda1")
    wait_directories(world, {}, 40)

    tries = [command for command in commands(daemon.log_since(mark))
             if command.startswith("umount ")]
    assert tries == ["umount /dev/sda1"] + 11 * ["umount /tmp/mountd/disk1_part1"]
    assert world.mounted() == {"/dev/sda1": "/tmp/mountd/disk1_part1"}
    assert mountd_flags(world) == {"sda1": "no"}
    assert calls(world) == STOPPED + STARTED
    holder.kill()


def test_after_a_safe_removal_the_daemon_rests_and_only_announced_disks_return(
        world, start_daemon):
    disk = world.partitioned_disk(Partition("ext4", 1300), swap(1250))
    stick = world.whole_disk("ext4", 1200)
    world.plug(disk, "sda")
    world.plug(stick, "sdb")
    daemon = start_daemon()
    wait_directories(world, {"sda1": "disk1_part1", "sda2": "disk1_part2", "sdb": "disk2_part1"})
    first_rescan_over(world, daemon)

    world.safe_remove()
    world.wait(lambda: world.parts() == {} and world.disk_num() == "0", 30,
               "a status without disks")
    assert world.mounted() == {}
    assert calls(world) == STOPPED + STARTED
    assert set(mountd_flags(world).values()) == {"no"}
    assert world.disk_json() == {"disk_number": 0, "disk": []}

    mark = daemon.mark()
    daemon.wait_log("disk safe remove ...", since=mark)
    assert "=== === ===> update" not in daemon.log_since(mark)
    assert world.mounted() == {}

    world.send("#add:sdb")
    wait_mounted(world, {"sdb": "disk2_part1"})
    mark = daemon.mark()
    daemon.wait_log("mount dev num = ", since=mark)
    daemon.wait_idle_cycles(1)
    assert directories(world) == {"sdb": "disk2_part1"}
    assert world.mounted() == {"/dev/sdb": "/tmp/mountd/disk2_part1"}


def test_a_disk_pulled_while_mounted_is_unmounted_and_forgotten(world, start_daemon):
    disk = world.partitioned_disk(Partition("ext4", 1300), Partition("ext4", 1200))
    world.plug(disk, "sda")
    daemon = start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1", "sda2": "disk1_part2"})
    quiet_moment(world, daemon)
    world.hotunplug(disk)
    wait_mounted(world, {})
    world.wait(lambda: world.disk_num() == "0", 30, "0 in disk_num.txt")

    assert mountd_flags(world) == {"sda1": "no", "sda2": "no"}
    daemon.wait_log("want remove dev(sda) not exist!")
    daemon.wait_log("mount dev num = 0", since=daemon.mark())
    assert daemon.running
    assert "dev not find" not in daemon.log()


def test_a_pulled_stick_without_a_table_is_forgotten_by_the_next_rescan(world, start_daemon):
    stick = world.whole_disk("ext4", 1200)
    world.plug(stick, "sda")
    daemon = start_daemon()
    wait_mounted(world, {"sda": "disk1_part1"})
    first_rescan_over(world, daemon)

    mark = daemon.mark()
    world.hotunplug(stick)
    daemon.wait_log("clear err, not find dev = sda", since=mark)
    assert world.mounted() == {}
    wait_directories(world, {})
    log = daemon.log_since(mark)
    assert log.index("remove sub dev = sda\n") < log.index("remove disk, root dev = sda\n")
    assert daemon.running

    # Its next plug is a new arrival.
    world.hotplug(stick, "sda")
    wait_mounted(world, {"sda": "disk1_part1"})
