"""Signals, the copy in syslog, and a reader of the output that goes away."""

import fcntl
import os
import re
import signal
import subprocess
import sys
import termios
import time
from pathlib import Path

import pytest

from world import PIPES, Partition
from world.daemon import Daemon
from world.state import DISK_JSON, PID_FILE

DAEMON_INFO = 3 * 8 + 6


def test_the_first_sigint_is_only_logged_and_the_second_ends_the_daemon_within_a_cycle(
        world, daemon):
    daemon.signal(signal.SIGINT)
    daemon.wait_log("get sig = SIGINT, c = 0")
    daemon.wait_idle_cycles(2)
    assert world.exists(PID_FILE)
    assert "manager work again!" not in daemon.log()

    mark = daemon.mark()
    daemon.signal(signal.SIGINT)
    daemon.wait_log("get sig = SIGINT, c = 1", since=mark)
    assert daemon.wait_exit() == 0
    assert daemon.log_since(mark).count("no event ...") <= 1
    assert daemon.log().count("manager work again!") == 1
    assert daemon.log().count("get sig = ") == 2
    assert not world.exists(PID_FILE)


@pytest.mark.needs_fs("ext4")
def test_an_end_by_sigint_leaves_mounts_status_files_and_pipes_in_place(world, start_daemon):
    world.plug(world.whole_disk("ext4"), "sda")
    daemon = start_daemon()
    world.wait(lambda: "sda" in world.parts(), 30, "sda in disk.json")
    published = world.read(DISK_JSON)

    assert daemon.stop() == 0
    assert world.mounted() == {"/dev/sda": "/tmp/mountd/disk1_part1"}
    assert world.read(DISK_JSON) == published
    assert world.db_rows()[0]["mountd"] == "yes"
    assert all(world.path(pipe).is_fifo() for pipe in PIPES.values())
    assert not world.exists(PID_FILE)
    assert world.tools.service_calls() == []


def test_sigterm_has_no_effect(world, daemon):
    for _ in range(3):
        mark = daemon.mark()
        daemon.signal(signal.SIGTERM)
        daemon.wait_idle_cycles(1)
        assert "get sig" not in daemon.log_since(mark)
    assert world.exists(PID_FILE)
    world.send("#heart_beat")
    daemon.wait_log("===> get event = EVENT_DISK_HEART_BEAT")


def test_other_signals_are_only_logged_with_their_number_and_sigpipe_by_name(world, daemon):
    for number in (signal.SIGUSR1, signal.SIGALRM, signal.SIGHUP, signal.SIGCHLD):
        mark = daemon.mark()
        daemon.signal(number)
        line = daemon.wait_log(f"*** *** get sig = {int(number)}", 30, since=mark)
        assert re.fullmatch(r"Warning\[signals\.cpp:\d+\]\*\*\* \*\*\* get sig = \d+", line)
    daemon.signal(signal.SIGPIPE)
    line = daemon.wait_log("get sig = SIGPIPE", 30)
    assert re.fullmatch(r"signals\.cpp\(\d+\)get sig = SIGPIPE", line)

    world.send("#heart_beat")
    daemon.wait_log("===> get event = EVENT_DISK_HEART_BEAT")
    assert daemon.log().count("get sig = ") == 5
    assert world.exists(PID_FILE)


def test_commands_of_the_daemon_give_no_child_signal_lines(world, daemon):
    world.send("#remove_dev:sdx")
    world.wait(lambda: len(world.tools.service_calls()) == 8, 30, "the services' restart")
    daemon.wait_idle_cycles(1)
    assert "get sig = " not in daemon.log()


def messages_until(lines, last):
    """Log messages up to the one that holds `last`; what the runner prints is none."""
    kept = [line for line in lines if line and not re.match(r"\S+\(\d+\)exec cmd = ", line)]
    return kept[:next(place for place, line in enumerate(kept) if last in line) + 1]


def test_after_sigusr2_every_message_also_reaches_syslog_as_info_of_tarndisk(world, daemon):
    syslog = world.syslog()
    daemon.wait_idle_cycles(1)
    assert syslog.messages() == []

    daemon.signal(signal.SIGUSR2)
    syslog.wait_message("no event ...", timeout=30)
    world.send("#heart_beat", "#nonsense", "#add", "#remove_dev:sdx")
    syslog.wait_message("want remove dev(sdx) not exist!")
    world.send("#heart_beat:last")
    syslog.wait_message("get event = #heart_beat:last")

    messages = syslog.messages()
    assert {(message.priority, message.ident) for message in messages} == {
        (DAEMON_INFO, "tarndisk")}
    copied = [line for message in messages for line in message.text.splitlines()]
    copied = messages_until(copied, "#heart_beat:last")
    printed = messages_until(daemon.log().splitlines(), "#heart_beat:last")
    assert copied == printed[-len(copied):]
    assert sum(line.startswith("ERROR[") for line in copied) == 2
    assert any(line.startswith("Warning[") for line in copied)
    assert "get sig" not in daemon.log()


def test_a_second_sigusr2_does_not_switch_the_syslog_copy_off(world, daemon):
    syslog = world.syslog()
    daemon.signal(signal.SIGUSR2)
    syslog.wait_message("no event ...", timeout=30)
    daemon.signal(signal.SIGUSR2)
    daemon.wait_idle_cycles(1)
    world.send("#heart_beat")
    syslog.wait_message("===> get event = EVENT_DISK_HEART_BEAT", timeout=30)


def test_sigusr2_without_a_syslog_is_survived(world, daemon):
    daemon.signal(signal.SIGUSR2)
    world.send("#heart_beat")
    daemon.wait_log("===> get event = EVENT_DISK_HEART_BEAT")
    daemon.wait_idle_cycles(1)
    assert daemon.stop() == 0


def cpu_seconds(daemon):
    """Processor time of the daemon and of the commands that it has waited for."""
    fields = Path(f"/proc/{daemon.outer_pid}/stat").read_text().rsplit(")", 1)[1].split()
    return sum(int(ticks) for ticks in fields[11:15]) / os.sysconf("SC_CLK_TCK")


def unread_bytes(world):
    """What waits in the add/remove pipe."""
    pipe = os.open(world.path(PIPES["add_remove"]), os.O_WRONLY | os.O_NONBLOCK)
    try:
        return int.from_bytes(fcntl.ioctl(pipe, termios.FIONREAD, bytes(4)), sys.byteorder)
    finally:
        os.close(pipe)


@pytest.mark.needs_fs("ext4")
def test_the_reader_of_the_output_that_goes_away_neither_ends_the_daemon_nor_makes_it_spin(world):
    if not world.program.exists():
        pytest.skip(f"{world.program} is not built")
    process = world.popen(world.program, stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
                          stderr=subprocess.STDOUT)
    text = b""
    while b"no event ..." not in text:
        piece = os.read(process.stdout.fileno(), 65536)
        assert piece, f"the daemon has ended: {text.decode(errors='replace')}"
        text += piece
    process.stdout.close()
    daemon = Daemon(process, "/dev/null")

    disk = world.partitioned_disk(Partition("ext4", 1200, "DATA"))
    world.hotplug(disk, "sda")
    world.wait(lambda: "sda1" in world.parts(), 30, "sda1 in disk.json")
    assert world.mounted() == {"/dev/sda1": "/tmp/mountd/disk1_part1"}
    # The next message is read when the cycle with the first rescan and its check is over.
    world.send("#heart_beat")
    world.wait(lambda: unread_bytes(world) == 0, 30, "the end of the cycle")
    world.hotunplug(disk)
    world.wait(lambda: world.disk_num() == "0", 30, "an empty inventory")

    # Idle, its part is a few hundred short writes; a loop would use whole seconds.
    spent, started = cpu_seconds(daemon), time.monotonic()
    world.wait(lambda: time.monotonic() - started > 7, 30, "two idle cycles")
    assert cpu_seconds(daemon) - spent < 1
    for _ in range(2):
        daemon.signal(signal.SIGUSR1)
    assert daemon.running

    # Without a log the lost SIGINT of a moment with a command cannot be told: more are sent.
    def ended():
        daemon.signal(signal.SIGINT)
        return not daemon.running
    world.wait(ended, 30, "the daemon's end")
    assert daemon.returncode == 0
    assert not world.exists(PID_FILE)
