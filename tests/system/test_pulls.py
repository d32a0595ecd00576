"""Disks that are pulled or bounce at the moments that hurt, and what only looks like it."""

import pytest
from shared.moments import first_rescan_over, quiet_moment
from shared.published import directories, wait_mounted

from world import DaemonGone, Partition, add_messages, remove_messages
from world.state import DISK_DB

pytestmark = pytest.mark.needs_fs("ext4")

HELD, GO = "/run/world/held", "/run/world/go"
RESTART = ("tarn_nas_diskmanager", "restart")


def hold_mount(world, pattern, when="true"):
    """The next mount whose arguments match a shell pattern waits for `let_go`, once the command `when` says yes."""
    world.tools.stub("mount", f"""
case "$*" in
{pattern}) ! {when} || [ -e {GO} ] || {{ echo > {HELD}; while [ ! -e {GO} ]; do sleep 0.05; done; }} ;;
esac
exec {world.tools.real("mount")} "$@"
""")


def wait_held(world, timeout=40):
    world.wait(lambda: world.exists(HELD), timeout, "the mount command")


def let_go(world):
    world.write(GO, "")


def rows(world):
    """The rows without the column that follows every mount."""
    return sorted((row["uid"], row["dev_name"], row["disk_name"], row["mount_path"])
                  for row in world.db_rows())


def two_disks(world, start_daemon):
    """A disk at disk1_part1 as sda, a stick at disk2_part1 as sdb, both mounted long ago."""
    disk = world.partitioned_disk(Partition("ext4", 1300))
    stick = world.whole_disk("ext4", 1200)
    world.plug(disk, "sda")
    world.plug(stick, "sdb")
    daemon = start_daemon()
    wait_mounted(world, {"sda1": "disk1_part1", "sdb": "disk2_part1"})
    first_rescan_over(world, daemon)
    return disk, stick, daemon


def survives_its_checks(world, daemon):
    daemon.wait_rescan()
    assert daemon.running
    assert world.tools.service_calls().count(RESTART) == 0


def ends_afresh(world, daemon, *lines):
    """The end of a daemon that cannot trust its memory: its lines, no database, the restart."""
    assert daemon.wait_exit(60) == 0
    log = daemon.log()
    for line in lines:
        assert log.count(line) == 1, line
    assert not world.exists(DISK_DB)
    world.wait(lambda: RESTART in [call[:2] for call in world.tools.service_calls()], 10,
               "the restart")


def test_a_pull_between_a_rescan_and_its_check_costs_nothing(world, start_daemon):
    disk, _, daemon = two_disks(world, start_daemon)
    before = rows(world)
    # In an idle cycle only the check lists what is mounted.
    hold_mount(world, '""')
    wait_held(world)
    world.pull(disk)
    let_go(world)
    wait_mounted(world, {"sdb": "disk2_part1"})
    log = daemon.log()
    assert log.index("dev not find, dev = /dev/sda1") < log.index("disk was pulled, dev = sda\n")
    survives_its_checks(world, daemon)
    assert rows(world) == before


@pytest.mark.parametrize(("command", "when"), [
    ("*/dev/sda1*", "true"), ('""', "grep -q /dev/sda1 /proc/mounts")], ids=["command", "look"])
def test_a_pull_during_its_own_mount_costs_nothing(world, daemon, command, when):
    disk = world.partitioned_disk(Partition("ext4", 1300), Partition("ext4", 1200))
    # Two mounts that fail take as long as the daemon bears silence.
    world.start_companion()
    hold_mount(world, command, when)
    world.hotplug(disk, "sda")
    wait_held(world)
    world.pull(disk)
    let_go(world)
    daemon.wait_log("disk was pulled, dev = sda", 60)
    wait_mounted(world, {})
    survives_its_checks(world, daemon)
    before = rows(world)
    world.plug(disk, "sdb")
    wait_mounted(world, {"sdb1": "disk1_part1", "sdb2": "disk1_part2"})
    assert [row for row in before if row not in rows(world)] == []


def test_a_pull_while_another_disk_is_being_mounted_costs_nothing(world, start_daemon):
    disk, stick, daemon = two_disks(world, start_daemon)
    before = rows(world)
    third = world.whole_disk("ext4", 1100)
    hold_mount(world, "*/dev/sdc*")
    world.hotplug(third, "sdc")
    wait_held(world)
    world.pull(disk)
    let_go(world)
    wait_mounted(world, {"sdb": "disk2_part1", "sdc": "disk3_part1"})
    survives_its_checks(world, daemon)
    world.plug(disk, "sdd")
    wait_mounted(world, {"sdb": "disk2_part1", "sdc": "disk3_part1", "sdd1": "disk1_part1"})
    assert [row for row in before if row not in rows(world)] == []


def test_a_disk_pulled_behind_another_one_in_the_same_pass_is_not_even_tried(world, daemon):
    first, second = world.whole_disk("ext4", 1300), world.whole_disk("ext4", 1200)
    hold_mount(world, "*/dev/sda*")
    for disk, name in ((first, "sda"), (second, "sdb")):
        world.hotplug(disk, name)
    wait_held(world)
    world.pull(second)
    let_go(world)
    wait_mounted(world, {"sda": "disk1_part1"})
    assert "disk was pulled, dev = sdb\n" in daemon.log()
    assert "/dev/sdb /tmp/mountd" not in daemon.log()
    survives_its_checks(world, daemon)


def test_a_whole_device_pulled_before_the_first_rescan_is_forgotten_and_its_next_plug_mounted(
        world, start_daemon):
    *_, daemon = two_disks(world, start_daemon)
    stick = world.whole_disk("ext4", 1100)
    both = {"sda1": "disk1_part1", "sdb": "disk2_part1"}
    # Just behind a rescan, so that the next one is 8 s away.
    daemon.wait_rescan()
    world.hotplug(stick, "sdc")
    wait_mounted(world, {**both, "sdc": "disk3_part1"})
    world.hotunplug(stick)
    wait_mounted(world, both)
    world.hotplug(stick, "sdc")
    wait_mounted(world, {**both, "sdc": "disk3_part1"})
    survives_its_checks(world, daemon)


PATTERNS = {
    "in order": lambda removed, added: removed + added,
    "reversed": lambda removed, added: [*reversed(removed + added)],
    "doubled": lambda removed, added: 2 * (removed + added),
    "adds lost": lambda removed, added: removed,
    "removals lost": lambda removed, added: added,
    "none": lambda removed, added: [],
}


@pytest.mark.parametrize("name", ["same", "other"])
@pytest.mark.parametrize("pattern", PATTERNS)
def test_a_disk_that_bounces_returns_to_its_directory(world, start_daemon, pattern, name):
    disk, stick, daemon = two_disks(world, start_daemon)
    before = rows(world)
    names = ("sda", "sdb") if name == "same" else ("sdd", "sdc")
    quiet_moment(world, daemon)
    removed = [message for each in (disk, stick) for message in remove_messages(each)]
    for each in (disk, stick):
        world.pull(each)
    for each, its_name in zip((disk, stick), names):
        world.plug(each, its_name)
    added = [message for each in (disk, stick) for message in add_messages(each)]
    world.send(*PATTERNS[pattern](removed, added))
    expected = {f"{names[0]}1": "disk1_part1", names[1]: "disk2_part1"}

    # Under the same names the old mounts look like the new ones: their devices tell them apart.
    numbers = {world.path(f"/dev/{device}").stat().st_rdev for device in expected}
    world.wait(lambda: sorted(numbers) == sorted(
        world.path(entry.path).stat().st_dev for entry in world.mounts()), 60,
        lambda: f"fresh mounts, where {world.mounts()} are")
    wait_mounted(world, expected)
    survives_its_checks(world, daemon)
    wait_mounted(world, expected)
    assert rows(world) == before


def test_late_messages_about_a_pull_cost_the_disk_that_has_the_name_now_a_moment(
        world, start_daemon):
    disk, _, daemon = two_disks(world, start_daemon)
    messages = world.pull(disk)
    world.plug(disk, "sda")
    world.wait(lambda: "dev ok, dev = /dev/sda\n"
               in daemon.log().partition("disk was replaced, dev = sda")[2], 30,
               "the new disk of the name")
    world.send(*messages)
    daemon.wait_log("removal of a former disk, dev = sda1", 20)
    wait_mounted(world, {"sda1": "disk1_part1", "sdb": "disk2_part1"})
    survives_its_checks(world, daemon)
    wait_mounted(world, {"sda1": "disk1_part1", "sdb": "disk2_part1"})


def test_a_disk_removed_by_request_stays_removed_while_it_is_plugged(world, start_daemon):
    *_, daemon = two_disks(world, start_daemon)
    world.send("#remove_dev:sda1", pipe="remove")
    wait_mounted(world, {"sdb": "disk2_part1"})
    daemon.wait_rescan()
    daemon.wait_rescan()
    assert directories(world) == {"sdb": "disk2_part1"}


def test_a_new_disk_outlives_the_removal_of_another_before_its_first_mount_pass(
        world, start_daemon):
    *_, daemon = two_disks(world, start_daemon)
    late = world.partitioned_disk(Partition("ext4", 1100))
    # Found by a rescan, which lists it; then a removal comes before the pass.
    world.plug(late, "sdc")
    daemon.wait_log("dev ok, dev = /dev/sdc")
    world.send("#remove_dev:sda1")
    # The number of the disk that went is the lowest that is free.
    wait_mounted(world, {"sdb": "disk2_part1", "sdc1": "disk1_part1"})
    assert "clear dev = sdc" in daemon.log()


def test_a_node_gone_while_the_kernel_lists_its_disk_starts_afresh(world, start_daemon):
    _, _, daemon = two_disks(world, start_daemon)
    world.path("/dev/sda1").unlink()
    ends_afresh(world, daemon, "dev not find, dev = /dev/sda1\n")
    assert "disk was pulled" not in daemon.log()
    assert world.mounted()["/dev/sda1"] == "/tmp/mountd/disk1_part1"


def test_a_mount_that_the_inventory_does_not_know_starts_afresh_when_its_node_goes(
        world, start_daemon):
    _, _, daemon = two_disks(world, start_daemon)
    foreign = world.whole_disk("ext4", 16)
    world.plug(foreign, "sdx")
    world.path("/sys/block/sdx").unlink()
    world.sh("mkdir /tmp/mountd/disk7_part1 && mount /dev/sdx /tmp/mountd/disk7_part1")
    world.path("/dev/sdx").unlink()
    ends_afresh(world, daemon, "dev not find, dev = /dev/sdx\n")


def test_two_mounts_in_one_directory_start_afresh(world, start_daemon):
    _, _, daemon = two_disks(world, start_daemon)
    world.sh("mount /dev/sdb /tmp/mountd/disk1_part1")
    ends_afresh(world, daemon, "mount path err:\n")


def test_a_pulled_disk_that_stays_busy_starts_afresh_after_its_tries(world, start_daemon):
    disk, _, daemon = two_disks(world, start_daemon)
    world.sh("cd /tmp/mountd/disk1_part1 && sleep 300 >/dev/null 2>&1 &")
    world.pull(disk)
    ends_afresh(world, daemon, "dev not find, dev = /dev/sda1\n")
    assert daemon.log().count("exec cmd = umount /tmp/mountd/disk1_part1\n") == 11


def test_a_disk_that_loses_its_nodes_first_is_given_the_time_to_leave(world, start_daemon):
    disk, _, daemon = two_disks(world, start_daemon)
    before = rows(world)
    hold_mount(world, '""')
    wait_held(world)
    world.path("/dev/sda1").unlink()
    let_go(world)
    daemon.wait_log("dev not find, dev = /dev/sda1")
    world.pull(disk)
    wait_mounted(world, {"sdb": "disk2_part1"})
    try:
        survives_its_checks(world, daemon)
    except DaemonGone:
        pytest.fail("ended within the second")
    assert rows(world) == before
