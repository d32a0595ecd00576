"""Commands that are killed, and a shell that is not there."""

import pytest
from shared.preload import install
from faults.rig import Rig
from faults.starting import Starts

from world.state import PID_FILE

pytestmark = pytest.mark.needs_fs("ext4")

# Takes the shell with it where that waits, and has become the command itself where not.
_KILL = """
read -r name < /proc/$PPID/comm
[ "$name" != sh ] || kill -KILL $PPID
kill -KILL $$
"""
_TOOLS = ("blkid", "mount", "umount", "mkdir", "chmod")
_KILLED = ", ret = 9\n"


@pytest.mark.parametrize("tool", _TOOLS)
def test_a_command_killed_in_a_cycle_is_survived_and_the_next_plug_is_right(rig, count, tool):
    mark = rig.daemon.mark()
    # A directory that is there already is not made again.
    rig.world.sh("umount /tmp/mountd/disk2_part1; rmdir /tmp/mountd/disk2_part1")
    rig.world.tools.stub(tool, _KILL)
    rig.busy_cycle()
    rig.world.tools.unstub(tool)
    killed = rig.daemon.log_since(mark).count(_KILLED)
    assert killed > 0
    count(f"killed {tool}", killed)
    rig.check()
    assert rig.daemon.stop() == 0


def test_service_scripts_killed_around_a_removal_leave_the_removal_whole(rig, count):
    world = rig.world
    before = world.read("/etc/init.d/samba4")
    mark = rig.daemon.mark()
    world.tools.init_script("samba4", f"#!/bin/sh\n{_KILL}")
    world.send("#remove_dev:sdb1")
    rig.answer()
    assert set(world.mounted()) == {"/dev/sda1"}
    assert rig.daemon.log_since(mark).count(_KILLED) == 2
    count("killed samba4", 2)
    world.tools.init_script("samba4", before)
    rig.check()


def test_a_mount_killed_after_it_mounted_counts_as_mounted(rig):
    world = rig.world
    world.tools.stub("mount", f"""
case "$*" in
"") ;;
*) {world.tools.real("mount")} "$@"; {_KILL} ;;
esac
exec {world.tools.real("mount")} "$@"
""")
    mark = rig.daemon.mark()
    rig.replug()
    rig.wait_right()
    assert rig.daemon.log_since(mark).count(_KILLED) == len(rig.disks)
    assert "mount ERROR" not in rig.daemon.log_since(mark)


@pytest.mark.parametrize("tool", ["pgrep", "blkid", "mount", "mkdir", "chmod"])
def test_a_command_killed_at_start_leads_to_a_right_state_or_an_orderly_end(
        world, start_daemon, libraries, count, tool):
    environ = install(world, libraries, "haste")
    starts = Starts(world, environ)
    world.write(PID_FILE, "999999")
    world.tools.stub(tool, _KILL)
    if tool == "mkdir":
        world.sh("rm -rf /tmp/tarn_nas")
    daemon = world.start_daemon(environ=environ, wait=False)
    world.wait(lambda: _KILLED in daemon.log(), 30, "a killed command")
    if tool == "mkdir":
        # No directory, no pipes.
        assert daemon.wait_exit() == 0
        assert not world.exists(PID_FILE)
        world.tools.unstub(tool)
        daemon = world.start_daemon(environ=environ)
    else:
        daemon.wait_started()
        world.tools.unstub(tool)
    starts.bring_back(daemon)
    count(f"killed {tool} at start", daemon.log().count(_KILLED) or 1)
    assert daemon.stop() == 0


def hide_shell(world):
    """No program at /bin/sh any more."""
    shell = world.run("readlink", "-e", "/bin/sh").stdout.strip()
    assert shell.startswith("/usr/bin/")
    world.cover_usr_bin()
    world.run("mv", "/usr/bin/sh", "/usr/bin/sh.hidden")


def test_a_shell_that_is_missing_for_a_cycle_is_survived_and_the_next_plug_is_right(rig):
    world = rig.world
    hide_shell(world)
    mark = rig.daemon.mark()
    rig.busy_cycle()
    assert "exec cmd = umount /dev/sdb1" in rig.daemon.log_since(mark)
    assert set(world.mounted()) == {"/dev/sda1", "/dev/sdb1"}
    world.run("mv", "/usr/bin/sh.hidden", "/usr/bin/sh")
    rig.check()
    assert rig.daemon.stop() == 0


def test_a_start_without_a_shell_ends_in_order_for_want_of_the_directory_and_the_next_one_works(
        world, start_daemon, libraries):
    environ = install(world, libraries, "haste")
    starts = Starts(world, environ)
    hide_shell(world)
    daemon = world.start_daemon(environ=environ, wait=False)
    assert daemon.wait_exit() == 0
    assert "mknod err:" in daemon.log()
    assert not world.exists(PID_FILE)
    world.run("mv", "/usr/bin/sh.hidden", "/usr/bin/sh")
    starts.bring_back(world.start_daemon(environ=environ))


def test_the_cycle_is_right_at_the_pace_of_everybody_too(world, start_daemon):
    # So the preloaded haste is not what makes it right.
    rig = Rig(world)
    rig.check()
    assert rig.daemon.stop() == 0
