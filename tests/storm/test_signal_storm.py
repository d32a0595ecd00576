"""A storm of signals over a daemon that never rests."""

import json
import random
import re
import signal
import subprocess
import sys
import threading
from collections import Counter
from pathlib import Path

import pytest
from shared.moments import quiet_moment
from shared.whole_lines import broken_lines, is_announcement, is_foreign

from world import WaitTimeout, wait_for

pytestmark = pytest.mark.needs_fs("ext2")

DISKS = 16
# Three a second for as long as the signals last; on a machine with much else to do, fewer.
LEAST_EVENTS = 50
SIGNALS = {"short": 25_000, "long": 120_000}
SENDER = Path(__file__).with_name("signal_sender.py")
MASKS = "/run/world/masks.log"
MASK_TEXT = """#!/bin/sh
while read -r key value; do
    [ "$key" != SigBlk: ] || echo "$value" >> {log}
done < /proc/self/status
exec {real} "$@"
"""
# Blocked in the daemon's parent, so that "unchanged" is not "empty".
BLOCKED = signal.SIGWINCH
REPORTS = {"SIGPIPE": "get sig = SIGPIPE",
           **{name: f"get sig = {int(getattr(signal, name))}"
              for name in ("SIGUSR1", "SIGALRM", "SIGHUP", "SIGCHLD")}}
HANDLED = ("SIGPIPE", "SIGUSR1", "SIGUSR2", "SIGALRM", "SIGHUP", "SIGCHLD", "SIGINT")
WAITS = ("no event ...", "get event = ")


def plug_all(world):
    """Sixteen small sticks, so that every pass has that many rows, mounts and records."""
    for number in range(DISKS):
        world.plug(world.whole_disk("ext2", 4, label=f"S{number}"), f"sd{chr(ord('a') + number)}")


def watch_masks(world):
    """Let blkid and the file services note the mask that they were started with."""
    world.tools.stub("blkid", MASK_TEXT.format(log=MASKS, real=world.tools.real("blkid")))
    for name in ("samba4", "tarn_nas_sys_up"):
        world.tools.init_script(name, MASK_TEXT.format(log=MASKS, real="true"))


def start_with_blocked_signal(world):
    """The daemon from a parent with one signal blocked; returns it and that parent's mask."""
    before = signal.pthread_sigmask(signal.SIG_BLOCK, {BLOCKED})
    try:
        daemon = world.start_daemon(wait=False)
    finally:
        signal.pthread_sigmask(signal.SIG_SETMASK, before)
    return daemon, status_line(daemon.process.pid, "SigBlk")


def status_line(pid, key):
    text = Path(f"/proc/{pid}/status").read_text()
    return next(line.split()[1] for line in text.splitlines() if line.startswith(key))


def wait_handlers(world, daemon):
    def ready():
        caught = int(status_line(daemon.outer_pid, "SigCgt"), 16)
        return all(caught >> (getattr(signal, name) - 1) & 1 for name in HANDLED)
    world.wait(ready, 20, "the signal handlers")


class Bustle(threading.Thread):
    """Events of all kinds until it is told to stop; `fault` is what ended it before."""

    def __init__(self, world, seed):
        super().__init__(daemon=True)
        self._world, self._random = world, random.Random(seed)
        self._over = threading.Event()
        self.sent = 0
        self.fault = None

    def run(self):
        try:
            while not self._over.wait(self._random.uniform(0, 0.6)):
                self._send_one()
        except (OSError, WaitTimeout) as fault:
            self.fault = fault

    def stop(self):
        """End it; it must have bustled up to now."""
        self._over.set()
        self.join(70)
        assert not self.is_alive()
        assert self.fault is None, self.fault
        assert self.sent > LEAST_EVENTS

    def _send_one(self):
        name = f"sd{chr(ord('a') + self._random.randrange(DISKS))}"
        number = self._random.randrange(1, DISKS + 1)
        self._world.send(self._random.choice([
            f"#remove_dev:{name}", f"#add:{name}", f"#add:{name}", "#heart_beat", "#heart_beat",
            f"#remove_disk:disk{number}_part1", "#nonsense", ""]), timeout=60)
        self.sent += 1


def waits_since(daemon, mark):
    log = daemon.log_since(mark)
    return sum(log.count(text) for text in WAITS)


def send_sigint_until_told(daemon, told):
    """One SIGINT more in the log.

    Sent again only when the loop has waited twice without telling of it: the C library discards
    those that come while a command runs.
    """
    while daemon.running and daemon.log().count("get sig = SIGINT") < told:
        mark = daemon.mark()
        daemon.signal(signal.SIGINT)
        wait_for(lambda: not daemon.running or waits_since(daemon, mark) >= 2, 240,
                 "two waits of the loop behind a SIGINT")


def reported(log):
    """How many signals of each kind the log tells of."""
    told = Counter(re.findall(r"get sig = \w+", log))
    return {name: told[text] for name, text in REPORTS.items()}


def copied_and_printed(syslog, log):
    """The lines of syslog, and those of the log that should be there too, from the first on."""
    copied = [line for message in syslog.messages("tarndisk")
              for line in message.text.split("\n") if line]
    printed = [line for line in log.split("\n")
               if line and not is_announcement(line) and not is_foreign(line)]
    return copied, printed[-len(copied):]


def make_router(make_world):
    """A world in which every program that the daemon starts notes its mask."""
    # A router's shell: that of the distribution clears the mask of what it starts.
    world = make_world(tools="busybox")
    if not world.program.exists():
        pytest.skip(f"{world.program} is not built")
    watch_masks(world)
    plug_all(world)
    return world


def storm_over(world, daemon, signals, seed, figure):
    """Signals and events over the daemon from its first scan on; returns {name: how many sent}."""
    # In the first scan every disk is mounted and remembered.
    words = [sys.executable, SENDER, daemon.outer_pid, signals, seed]
    sender = subprocess.Popen([str(word) for word in words], stdout=subprocess.PIPE, text=True)
    daemon.wait_log("have disk = ", 180)
    bustle = Bustle(world, seed)
    bustle.start()
    send_sigint_until_told(daemon, 1)
    sent = json.loads(sender.communicate(timeout=900)[0])
    assert daemon.running, daemon.log()[-4000:]
    bustle.stop()
    figure("sent", f"{sum(sent.values())} {sent}")
    figure("events, lines of the log", f"{bustle.sent}, {daemon.log().count(chr(10))}")
    return sent


def check_disks(world, daemon):
    """All disks are there at the end, whatever was removed meanwhile."""
    names = [f"sd{chr(ord('a') + number)}" for number in range(DISKS)]
    world.send(*[f"#add:{name}" for name in names], timeout=60)
    quiet_moment(world, daemon)
    devices = {f"/dev/{name}" for name in names}
    world.wait(lambda: set(world.mounted()) == devices, 180, lambda: f"all, not {world.mounted()}")
    world.wait(lambda: {f"/dev/{name}": part.path for name, part in world.parts().items()}
               == world.mounted(), 60, "the inventory of all")
    assert "mount ERROR" not in daemon.log()
    assert len(world.db_rows()) == DISKS
    assert not world.db_fault()


def check_log(log, sent, syslog, figure):
    """Every kind of signal is told of, every line is whole, and syslog has the same ones."""
    told = reported(log)
    figure("told", f"{sum(told.values())} {told}")
    assert broken_lines(log) == []
    assert all(1 <= told[name] <= sent[name] for name in told)
    assert re.findall(r"get sig = SIGINT, c = (\d+)", log) == ["0", "1"]
    copied, printed = copied_and_printed(syslog, log)
    figure("lines in syslog", len(copied))
    assert len(copied) > 1000 and copied == printed


@pytest.mark.parametrize("number", range(1))
def test_a_storm_of_signals_neither_stops_nor_garbles_anything(
        make_world, request, long_form, figure, number):
    seed = request.config.getoption("--seed") or 30_000 + number
    figure("seed", seed)
    world = make_router(make_world)
    syslog = world.syslog()
    daemon, mask = start_with_blocked_signal(world)
    assert int(mask, 16) >> (BLOCKED - 1) & 1
    wait_handlers(world, daemon)

    sent = storm_over(world, daemon, SIGNALS["long" if long_form else "short"], seed, figure)
    check_disks(world, daemon)
    send_sigint_until_told(daemon, 2)
    assert daemon.wait_exit(60) == 0

    check_log(daemon.log(), sent, syslog, figure)
    masks = Counter(world.read(MASKS).split())
    figure("commands whose mask was looked at", masks.total())
    assert masks.total() > 100 and set(masks) == {mask}
