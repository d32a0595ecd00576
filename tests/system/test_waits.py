"""Slow disks and busy ones: however the daemon waits for them, the same comes of it."""

import re
from collections import Counter

import pytest
from shared.waits import BOTH_PROGRAMS, PROMPT_PROGRAM, is_prompt

from world import Partition
from world.state import DISK_JSON

pytestmark = pytest.mark.needs_fs("ext4")

SPIN_UP = 20
PATIENCE = 120
HOME = "/tmp/mountd/disk1_part1"


@pytest.fixture(params=BOTH_PROGRAMS, ids=["steady", "prompt"])
def router(request, make_world):
    """A world with a running daemon of each build and a disk that is not plugged yet."""
    if not request.param.exists():
        pytest.skip(f"{request.param} is not built (scripts/test system builds it)")
    assert is_prompt(request.param) == (request.param == PROMPT_PROGRAM)
    world = make_world(program=request.param)
    world.start_companion()
    world.disk = world.partitioned_disk(Partition("ext4", 1200, "DATA"))
    world.daemon = world.start_daemon()
    return world


def stub_first(world, name, pattern, action):
    """The first call of a program whose arguments hold `pattern` does `action`."""
    world.tools.stub(name, f"""
case "$*" in
*"{pattern}"*)
    if mkdir /run/world/{name}-was-called 2> /dev/null; then
        {action}
    fi ;;
esac
exec {world.tools.real(name)} "$@"
""")


def expect_mounted_and_published(router):
    router.wait(lambda: "sda1" in router.parts(), PATIENCE, "sda1 in disk.json")
    part = router.parts()["sda1"]
    assert (part.path, part.label, part.disk_name) == (HOME, "DATA", "disk1_part1")
    assert part.free_size > 0
    assert router.mounted() == {"/dev/sda1": HOME}
    assert [(row["disk_name"], row["mountd"]) for row in router.db_rows()] == [("disk1_part1", "yes")]
    log = router.daemon.log()
    assert log.count("exec cmd = mount -t ext4") == 1
    assert log.count("mount OK, ") == 1
    assert "mount ERROR" not in log


@pytest.mark.takes_minutes
@pytest.mark.parametrize(("name", "pattern"), [("mount", "-t ext4"), ("blkid", "/dev/sda1")])
def test_a_disk_that_takes_20_seconds_to_spin_up_is_mounted_and_published(router, name, pattern):
    stub_first(router, name, pattern, f"sleep {SPIN_UP}")
    router.hotplug(router.disk, "sda")
    expect_mounted_and_published(router)


@pytest.mark.takes_minutes
def test_a_mount_that_appears_seconds_after_its_command_is_waited_for(router):
    later = f'(sleep 7; exec {router.tools.real("mount")} "$@") > /dev/null 2>&1 & exit 0'
    stub_first(router, "mount", "-t ext4", later)
    router.hotplug(router.disk, "sda")
    expect_mounted_and_published(router)


@pytest.mark.takes_minutes
def test_a_mount_that_never_appears_is_given_up_after_18_seconds_and_tried_again(router):
    stub_first(router, "mount", "-t ext4", "read -r uptime idle < /proc/uptime; "
               "echo $uptime > /run/world/first; exit 0")
    router.hotplug(router.disk, "sda")
    router.daemon.wait_log("mount ERROR, /dev/sda1 ==> " + HOME, PATIENCE)
    given_up = float(router.sh("read -r uptime idle < /proc/uptime; echo $uptime").stdout)
    assert 18 <= given_up - float(router.read("/run/world/first"))
    router.daemon.wait_log("mount OK, /dev/sda1 ==> " + HOME, PATIENCE)
    router.wait(lambda: router.parts().get("sda1") and router.parts()["sda1"].free_size > 0, PATIENCE,
                "sda1 in disk.json")
    assert router.daemon.log().count("exec cmd = mount -t ext4") == 2


@pytest.mark.takes_minutes
def test_a_disk_that_is_busy_for_some_seconds_is_unmounted(router):
    router.hotplug(router.disk, "sda")
    expect_mounted_and_published(router)
    router.tools.stub("umount", f"""
count=$(cat /run/world/umounts 2> /dev/null || echo 0)
echo $((count + 1)) > /run/world/umounts
[ $count -ge 5 ] || exit 32
exec {router.tools.real("umount")} "$@"
""")
    router.send("#remove_disk:disk1_part1", pipe="remove")
    router.wait(lambda: not router.parts(), PATIENCE, "no disk in disk.json")
    assert router.mounted() == {}
    assert int(router.read("/run/world/umounts")) == 6, "by device, by path, and four further tries"
    assert [row["mountd"] for row in router.db_rows()] == ["no"]


def uptime(router):
    return float(router.sh("read -r uptime idle < /proc/uptime; echo $uptime").stdout)


@pytest.mark.takes_minutes
def test_a_calm_daemon_does_as_much_in_both_builds(router):
    router.hotplug(router.disk, "sda")
    expect_mounted_and_published(router)
    router.daemon.wait_rescan()
    # From 30 s after the last change on, the status files are written in each cycle.
    router.daemon.wait_idle_cycles(11)
    mark, begun, written = router.daemon.mark(), uptime(router), set()

    def six_cycles():
        written.add(router.path(DISK_JSON).stat().st_mtime_ns)
        return router.daemon.log_since(mark).count("no event ...") >= 6
    router.wait(six_cycles, PATIENCE, "six idle cycles")
    took, log = uptime(router) - begun, router.daemon.log_since(mark)

    assert log.count("no event ...") <= took / 3 + 1
    # Two looks at the mount table in each check, which comes every 9 s, and one for the companion in a minute.
    commands = Counter(re.findall(r"exec cmd = (\S+)", log))
    assert set(commands) <= {"mount", "pidof"}
    assert 0 < commands["mount"] <= 2 * (took / 9 + 1)
    assert commands["pidof"] <= 1
    assert 3 <= len(written) <= took / 3 + 2
