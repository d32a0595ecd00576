"""One life of the daemon under valgrind, from the first disk to the second SIGINT."""

import re
import signal

import pytest
from shared.moments import quiet_moment

from world import Partition

pytestmark = pytest.mark.needs_fs("ext4", "ext2")

LOGS = "/run/world/valgrind"
# An empty line is no event, but ends the loop's wait for one.
NO_EVENT = ""


@pytest.fixture
def world(make_world, valgrind, debug_program, tmp_path):
    """A world whose daemon is that of the debug preset, under valgrind."""
    words = [*valgrind, "--track-fds=yes", f"--log-file={LOGS}/%p",
             debug_program("tarn_nas_diskmanager")]
    program = tmp_path / "tarn_nas_diskmanager"
    program.write_text(f'#!/bin/sh\nexec {" ".join(map(str, words))} "$@"\n')
    program.chmod(0o755)
    made = make_world(program=program)
    made.run("mkdir", LOGS)
    return made


def wait_mounted(world, *names):
    world.wait(lambda: set(world.parts()) == set(names) and len(world.mounts()) == len(names), 120,
               lambda: f"{names} mounted and published, where {world.mounted()} is")


def open_descriptors(report):
    """Descriptors that were the daemon's own and still open at its end, as valgrind tells them."""
    return [line for line, inherited in re.findall(
        r"Open (.*)\n.*?(<inherited from parent>)?\n", report) if not inherited]


def test_a_whole_life_loses_no_byte_and_no_descriptor(world):
    disk = world.partitioned_disk(Partition("ext4", 1300, "DATA"), Partition("ext2", 1100))
    stick = world.whole_disk("ext2", 16, label="STICK")
    syslog = world.syslog()
    world.plug(disk, "sda")
    daemon = world.start_daemon(wait=False)
    daemon.wait_started(90)
    pid = daemon.pid
    wait_mounted(world, "sda1", "sda2")
    for number in (signal.SIGUSR1, signal.SIGUSR2, signal.SIGHUP, signal.SIGCHLD, signal.SIGPIPE):
        daemon.signal(number)

    world.hotplug(stick, "sdb")
    world.send(NO_EVENT)
    wait_mounted(world, "sda1", "sda2", "sdb")
    daemon.wait_rescan(120)
    quiet_moment(world, daemon)
    world.send("#remove_disk:disk1_part2", pipe="remove")
    quiet_moment(world, daemon)
    wait_mounted(world, "sda1", "sdb")
    world.send("#nonsense", "junk", "#add:sdx", "#add:" + "x" * 60, "#remove_dev:sdx", "x" * 400)
    world.hotunplug(disk)
    wait_mounted(world, "sdb")
    quiet_moment(world, daemon)
    world.safe_remove()
    daemon.wait_log("disk safe remove ...", 120)
    wait_mounted(world)
    world.hotplug(disk, "sdc")
    world.send(NO_EVENT)
    world.wait(lambda: "sdc1" in world.parts(), 120, "sdc1 in disk.json")
    assert daemon.stop(120) == 0

    assert syslog.messages("tarndisk")
    # Beside it lie those of children up to the moment in which they become a command.
    report = world.read(f"{LOGS}/{pid}")
    assert "ERROR SUMMARY: 0 errors from 0 contexts (suppressed: 0 from 0)" in report, report
    assert "definitely lost: 0 bytes" in report or "All heap blocks were freed" in report, report
    assert open_descriptors(report) == [], report
