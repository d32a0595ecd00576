"""The service script: start, stop and restart of a daemon that ends only at its second SIGINT."""

import re
import time

import pytest
from openwrt.router import HELPERS, INIT

from world import wait_for
from world.state import PID_FILE


def starts(router):
    return router.notes().count("start")


def faults(router):
    """Starts that found the old daemon still there."""
    return [call for call in router.procd_calls() if call == "restart daemon"]


@pytest.mark.parametrize("instance", ["log", "daemon", "heart_beat"])
def test_start_hands_three_programs_to_procd_with_respawn_and_both_outputs_logged(router, instance):
    router.start()
    calls = router.procd_calls()
    assert [call for call in calls if call.startswith(f"set_param {instance} command {HELPERS}/")]
    assert [call for call in calls if call.startswith(f"set_param {instance} respawn")]
    assert f"set_param {instance} stdout 1" in calls
    assert f"set_param {instance} stderr 1" in calls


def test_what_logs_is_there_before_the_daemon(router):
    router.start()
    opened = [call.split()[1] for call in router.procd_calls() if call.startswith("open_instance")]
    assert opened == ["log", "daemon", "heart_beat"]


def test_the_process_that_procd_knows_is_the_daemon(router):
    assert router.start() == router.instance_pid("daemon")


def test_no_other_process_bears_the_name_that_the_daemon_looks_for(router):
    pid = router.start()
    wait_for(lambda: router.world.run("pgrep", "-f", "tarn_nas_diskmanager").stdout.split() == [str(pid)],
             10, "the daemon alone")


def test_the_service_runs_as_long_as_its_daemon_does(router):
    assert router.world.run(INIT, "running", check=False).returncode != 0
    pid = router.start()
    assert router.world.run(INIT, "running", check=False).returncode == 0
    router.world.write("/run/procd/respawn_delay", "100")
    router.world.run("kill", "-KILL", pid)
    wait_for(lambda: not router.pids(), 10, "the daemon's end")
    assert router.world.run(INIT, "running", check=False).returncode != 0


def test_procd_kills_later_than_the_script_does(router):
    router.start()
    timeouts = [int(call.split()[-1]) for call in router.procd_calls() if "term_timeout" in call]
    assert timeouts and timeouts[0] > 65


def test_sigterm_alone_does_not_end_the_stand_in(router):
    pid = router.start()
    router.world.run("kill", "-TERM", pid)
    time.sleep(1)
    assert router.pids() == [pid]


def test_stop_ends_the_daemon_in_good_order(router):
    router.start()
    began = time.monotonic()
    router.service("stop")
    # Far from the minute after which it is killed.
    assert time.monotonic() - began < 30
    assert router.pids() == []
    assert router.notes()[-1] == "end"
    assert not router.world.exists(PID_FILE)


def test_stop_prints_nothing_and_tells_procd_of_the_daemon_first(router):
    router.start()
    done = router.service("stop")
    assert done.stdout + done.stderr == ""
    assert kills(router) == ["kill tarn_nas_diskmanager daemon", "kill tarn_nas_diskmanager"]


def test_stop_without_a_daemon_is_quick_and_quiet(router):
    began = time.monotonic()
    done = router.service("stop")
    assert time.monotonic() - began < 30
    assert done.stdout + done.stderr == ""


def test_procd_does_not_start_a_stopped_daemon_again(router):
    router.world.write("/run/procd/respawn_delay", "0")
    router.start()
    router.service("stop")
    time.sleep(2)
    assert router.pids() == []
    assert starts(router) == 1


def test_procd_starts_a_crashed_daemon_again(router):
    pid = router.start()
    router.world.run("kill", "-KILL", pid)
    assert router.wait_ready(but=[pid]) != pid


def test_stop_repeats_a_sigint_that_a_running_command_swallowed(router):
    router.mode("busy")
    router.start()
    router.service("stop")
    assert router.notes()[-1] == "end"
    assert router.pids() == []


def test_restart_replaces_the_daemon(router):
    old = router.start()
    router.service("restart")
    assert router.wait_ready(but=[old]) != old
    assert router.notes() == ["start", "end", "start"]
    assert faults(router) == []


def test_restart_waits_for_a_process_whose_pid_file_is_gone_already(router):
    router.mode("slow")
    old = router.start()
    router.service("restart")
    router.wait_ready(but=[old])
    assert router.notes() == ["start", "end", "start"]
    assert faults(router) == []


@pytest.mark.parametrize("mode", ["", "slow"])
def test_the_daemon_can_restart_itself_on_its_way_out(router, mode):
    router.mode(mode)
    old = router.start()
    router.world.write("/tmp/restart", "")
    new = router.wait_ready(but=[old])
    # Long enough for a respawn that procd had in mind.
    time.sleep(4)
    assert router.pids() == [new]
    assert router.notes() == ["start", "end", "start"]
    assert faults(router) == []


def kills(router):
    return [call for call in router.procd_calls() if call.startswith("kill")]


def begin(router, action):
    """Run the init script in the background, until it has told procd to end the service."""
    before = len(kills(router))
    script = router.world.popen(INIT, action)
    wait_for(lambda: len(kills(router)) > before, 10, f"the beginning of {action}")
    return script


def test_a_restart_waits_for_a_stop_that_is_under_way(router):
    router.mode("slow")
    old = router.start()
    stop = begin(router, "stop")
    restart = router.world.popen(INIT, "restart")

    def old_is_gone():
        told = len(kills(router))
        if old not in router.pids():
            return True
        assert told == 1
        return False
    wait_for(old_is_gone, 30, "the old daemon's end")
    assert stop.wait(20) == 0
    assert restart.wait(20) == 0
    router.wait_ready(but=[old])
    assert router.notes() == ["start", "end", "start"]
    assert faults(router) == []


def test_a_daemon_that_restarts_itself_while_it_is_being_stopped_runs_again_afterwards(router):
    router.mode("hang")
    old = router.start()
    stop = begin(router, "stop")
    router.world.write("/tmp/restart", "")
    assert stop.wait(20) == 0
    new = router.wait_ready(but=[old])
    assert router.pids() == [new]
    assert router.notes() == ["start", "end", "start"]
    assert faults(router) == []


def shorten_stop_wait(router, seconds):
    """Let the installed script lose patience sooner; returns the seconds it would have had."""
    script = router.world.read(INIT)
    given = int(re.search(r"^STOP_WAIT=(\d+)$", script, re.MULTILINE).group(1))
    router.world.write(INIT, script.replace(f"STOP_WAIT={given}", f"STOP_WAIT={seconds}"), 0o755)
    return given


def test_a_daemon_that_does_not_end_is_killed_and_its_pid_file_removed(router):
    syslog = router.world.syslog()
    # A mount that hangs takes 18 s, an unmount about 10 s.
    given = shorten_stop_wait(router, 4)
    assert given > 28
    router.mode("hang")
    router.start()
    began = time.monotonic()
    router.service("stop")
    assert 3 < time.monotonic() - began < given - 10
    assert router.pids() == []
    assert not router.world.exists(PID_FILE)
    syslog.wait_message("killing it", ident="tarn_nas_diskmanager", timeout=5)


def test_a_stale_pid_file_does_not_keep_the_daemon_from_starting(router):
    # A single digit that occurs in any list of pids: without help the daemon gives way to it.
    router.world.write(PID_FILE, "1")
    router.service("start")
    router.wait_ready()
    assert "gave way" not in router.notes()


def test_the_pid_file_of_a_running_daemon_is_left_alone(router):
    pid = router.start()
    router.service("start")
    assert router.world.read(PID_FILE) == str(pid)
    assert router.pids() == [pid]


def test_stop_leaves_other_processes_with_the_name_in_their_command_line_alone(router):
    router.start()
    other = router.world.popen("tail", "-f", "/etc/init.d/tarn_nas_diskmanager")
    router.service("stop")
    assert other.poll() is None
    other.kill()
    other.wait(10)


def test_the_real_daemon_starts_stops_and_starts_again(real_router):
    old = real_router.start()
    assert real_router.world.read(PID_FILE) == str(old)
    assert real_router.service("stop").returncode == 0
    assert real_router.pids() == []
    assert not real_router.world.exists(PID_FILE)
    new = real_router.start()
    real_router.service("restart")
    assert real_router.wait_ready(but=[new]) != new


def test_the_real_daemon_restarts_itself_after_a_failed_consistency_check(real_router):
    old = real_router.start()
    # A mount below the mount base whose device does not exist is the broken state that it restarts for.
    real_router.world.sh("mkdir -p /tmp/mountd/disk1_part1 &&"
                         " mount -t tmpfs /dev/sdz1 /tmp/mountd/disk1_part1")
    real_router.uevent("add", "sda", "disk")
    new = wait_for(lambda: [pid for pid in real_router.pids() if pid != old], 60, "a new daemon")
    time.sleep(8)
    assert real_router.pids() == new
    assert faults(real_router) == []
