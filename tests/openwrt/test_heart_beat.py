"""What keeps the daemon alive on a router without its companion."""

import os
import re
import time

import pytest
from openwrt.router import BEAT, HEART_BEAT, HELPERS

from world import Partition, WaitTimeout, wait_for
from world.events import PIPES
from world.state import PID_FILE

# The daemon's patience without an event, in its own seconds.
SILENCE = 60
HASTE = 10


@pytest.fixture
def quick_router(router):
    """A router with the stand-in, whose heart beats every second."""
    router.beat_every(1)
    return router


def wait_beats(router, more):
    before = router.beats()
    wait_for(lambda: router.beats() >= before + more, 15, f"{more} messages more")


def test_the_daemon_hears_of_somebody_again_and_again(quick_router):
    quick_router.start()
    wait_beats(quick_router, 3)


def test_one_message_may_be_lost(router):
    text = router.world.read(f"{HELPERS}/pipe.sh")
    write_wait = int(re.search(r"^WRITE_WAIT=(\d+)$", text, re.MULTILINE).group(1))
    cycle = 3
    assert 2 * (router.beat_interval() + write_wait) + cycle < SILENCE


def test_it_stands_aside_while_the_companion_runs(quick_router):
    quick_router.start()
    wait_beats(quick_router, 1)
    companion = quick_router.world.start_companion()
    # One may have been on its way.
    time.sleep(1.5)
    before = quick_router.beats()
    time.sleep(4)
    assert quick_router.beats() == before
    quick_router.world.stop_companion(companion)
    wait_beats(quick_router, 1)


def wait_pause(router):
    """Wait for the pause between two messages: nothing holds the script up."""
    wait_for(lambda: router.world.run("pgrep", "-f", "^sleep 1$", check=False).stdout, 10, "its pause")


def beat_alone(router):
    """Run the script without a service for some beats; returns what it printed."""
    script = router.world.popen("/bin/sh", "-c", f"exec {HEART_BEAT} >/tmp/beat.out 2>&1")
    time.sleep(3)
    wait_pause(router)
    assert script.poll() is None
    script.terminate()
    router.world.sh(f"kill $(pgrep -f {HEART_BEAT})", check=False)
    script.wait(10)
    return router.world.read("/tmp/beat.out")


def test_without_a_daemon_nothing_is_made_and_nothing_said(quick_router):
    syslog = quick_router.world.syslog()
    quick_router.world.sh("mkdir -p /tmp/tarn_nas")
    assert beat_alone(quick_router) == ""
    assert not quick_router.world.exists(PIPES["add_remove"])
    assert syslog.messages() == []


def test_a_plain_file_in_the_pipes_place_stays_as_it_is(quick_router):
    quick_router.world.write(PIPES["add_remove"], "")
    quick_router.world.write(PID_FILE, "1")
    assert beat_alone(quick_router) == ""
    assert quick_router.world.read(PIPES["add_remove"]) == ""


def test_a_pipe_that_nobody_reads_is_left_alone(quick_router):
    quick_router.world.sh(f"mkdir -p /tmp/tarn_nas && mkfifo {PIPES['add_remove']}")
    quick_router.world.write(PID_FILE, "1")
    assert beat_alone(quick_router) == ""
    reader = os.open(quick_router.world.path(PIPES["add_remove"]), os.O_RDONLY | os.O_NONBLOCK)
    assert os.read(reader, 100) == b""
    os.close(reader)


def test_a_full_pipe_does_not_hold_it_up_and_is_not_told(quick_router):
    syslog = quick_router.world.syslog()
    quick_router.mode("deaf")
    quick_router.start()
    fd = os.open(quick_router.world.path(PIPES["add_remove"]), os.O_WRONLY | os.O_NONBLOCK)
    with pytest.raises(BlockingIOError):
        while True:
            os.write(fd, b"#add:sda\n" * 100)
    with pytest.raises(BlockingIOError):
        while True:
            os.write(fd, b"\n")
    os.close(fd)
    # Its pause between two messages goes on coming.
    time.sleep(3)
    wait_pause(quick_router)
    quick_router.mode("")
    wait_for(lambda: len(quick_router.messages()) > 1000, 30, "the pipe's contents")
    wait_beats(quick_router, 2)
    assert syslog.messages() == []
    assert quick_router.output() == ""


def beating(router):
    return router.world.run("pgrep", "-f", HEART_BEAT, check=False).stdout.split()


def test_it_ends_with_the_service_and_leaves_nothing_behind(router):
    router.start()
    wait_for(lambda: beating(router), 10, "the script")
    # The daemon's start and the first message have had their time.
    time.sleep(3)
    router.service("stop")
    wait_for(lambda: not beating(router), 5, "its end")
    assert router.world.run("pidof", "sleep", check=False).stdout == ""


def test_it_comes_back_when_it_was_killed(quick_router):
    quick_router.start()
    wait_for(lambda: beating(quick_router), 10, "the script")
    first = quick_router.instance_pid("heart_beat")
    quick_router.world.run("kill", "-KILL", first)
    wait_for(lambda: quick_router.instance_pid("heart_beat") not in (None, first), 10, "another")
    wait_beats(quick_router, 2)


def test_a_new_daemon_is_told_as_the_old_one_was(quick_router):
    old = quick_router.start()
    wait_beats(quick_router, 1)
    quick_router.world.run("kill", "-KILL", old)
    quick_router.wait_ready(but=[old])
    wait_beats(quick_router, 2)


# The real daemon, its clock faster and the messages as much more frequent.


def lives_on(router, pid, seconds):
    """The daemon's own seconds pass, and it is the same process all the time."""
    end = time.monotonic() + seconds / HASTE
    while time.monotonic() < end:
        assert router.pids() == [pid]
        time.sleep(0.5)


def test_nobody_plugs_anything_and_the_daemon_lives_on_in_silence(hasty_router, long_form):
    router = hasty_router(HASTE)
    router.world.tools.record("umount")
    syslog = router.world.syslog()
    pid = router.start()
    lives_on(router, pid, 3600 if long_form else 600)
    assert router.world.tools.commands() == []
    assert router.output() == ""
    assert syslog.messages() == []


def test_after_a_safe_removal_it_lives_on_as_well(hasty_router):
    router = hasty_router(HASTE, full_log=True)
    pid = router.start()
    router.world.sh(f"printf '#safe_remove\\n' 1<>{PIPES['add_remove']}")
    wait_for(lambda: "disk safe remove ..." in router.output(), 20, "the safe removal")
    lives_on(router, pid, 300)


def test_without_it_the_daemon_ends(hasty_router):
    router = hasty_router(HASTE, full_log=True)
    # Whoever takes the script away gets the daemon's own way back.
    router.world.write(HEART_BEAT, "#!/bin/sh\nexec sleep 1000\n", 0o755)
    pid = router.start()
    with pytest.raises((WaitTimeout, AssertionError)):
        lives_on(router, pid, 3 * SILENCE)
    assert "sys timeout" in router.output()
    assert BEAT not in router.output()


def test_a_mount_pass_of_more_than_its_patience_ends_the_daemon_all_the_same(hasty_router):
    router = hasty_router(5)
    mount = router.world.tools.real("mount")
    router.world.tools.stub("mount", f'case "$1" in -t) exit 1 ;; *) exec {mount} "$@" ;; esac')
    pid = router.start()
    # 18 s for each; the messages wait in the pipe until the pass is over, and then it looks at the time first.
    router.world.plug(router.world.partitioned_disk(*[Partition(fs="ext4") for _ in range(4)]), "sda")
    router.uevent("add", "sda", "disk")
    wait_for(lambda: router.pids() != [pid], 60, "the daemon's end")
    assert router.output().count("mount ERROR") == 4
    assert "sys timeout" in router.output()
