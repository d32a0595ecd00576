"""What an idle daemon costs in a cycle, and what it holds."""

import contextlib
import re
import time
from dataclasses import dataclass

from bench.floor import announced, replay
from bench.pair import Pair, commands_cpu, own_cpu
from shared.footprint import Footprint
from shared.strace import Strace


@dataclass
class Idle:
    """Of one cycle: milliseconds of processor time, and counts."""

    own_ms: float
    commands_ms: float
    commands: float
    processes: float
    calls: float
    cycle_s: float


def settled(program, count):
    """A pair with `count` disks whose daemon has done everything once; one part a disk."""
    pair = Pair(program, count, 1)
    if count:
        pair.plug()
    pair.daemon.wait_rescan() if count else pair.daemon.wait_idle_cycles(1)
    return pair


def idle_cost(pair, cycles):
    """Idle of one daemon over so many cycles, then the calls of a few more."""
    daemon = pair.daemon
    daemon.wait_idle_cycles(1)
    mark, begun = daemon.mark(), time.monotonic()
    own, commands = own_cpu(daemon), commands_cpu(daemon)
    daemon.wait_idle_cycles(cycles)
    own, commands = own_cpu(daemon) - own, commands_cpu(daemon) - commands
    took = time.monotonic() - begun
    run = len(announced(daemon.log_since(mark)))
    # A rescan comes in every third cycle.
    with Strace(daemon) as strace:
        mark = daemon.mark()
        daemon.wait_idle_cycles(3)
        traced = max(1, daemon.log_since(mark).count("no event ..."))
        lines = strace.trace.splitlines()
    started = sum(bool(re.match(r"(clone|vfork|fork)", line)) for line in lines)
    return Idle(1000 * own / cycles, 1000 * commands / cycles, run / cycles, started / traced,
                len(lines) / traced, took / cycles)


def memory(pair):
    """Resident, proportional and private KiB."""
    held = Footprint.of(pair.daemon.outer_pid)
    return held.rss, held.pss, held.private_dirty


BURST = 200
KINDS = {
    "heart_beat": "#heart_beat",
    "add, known": "#add:sda1",
    "remove_dev, unknown": "#remove_dev:sdq9",
    "remove_disk, unknown": "#remove_disk:disk99_part9",
    "safe_remove": "#safe_remove",
}


def burst(pair, kind):
    """(seconds, floor seconds, own processor milliseconds) of so many events at once."""
    daemon, message = pair.daemon, KINDS[kind]
    daemon.wait_idle_cycles(1)
    mark, used, begun = daemon.mark(), own_cpu(daemon), time.monotonic()
    pair.world.send_bytes(f"{message}\n".encode() * BURST)
    done = None
    deadline = begun + 120
    while done is None and time.monotonic() < deadline:
        time.sleep(0.001)
        log = daemon.log_since(mark)
        if log.count("===> get event = ") >= BURST and daemon.waits_for_events():
            done = time.monotonic()
    if done is None:
        raise TimeoutError(f"{BURST} events of {kind} were not taken")
    events, _, _ = log.partition("no event ...")
    used = own_cpu(daemon) - used
    commands = announced(events)
    floor = replay(pair.twin, commands) if commands else 0
    return done - begun, floor, 1000 * used


@contextlib.contextmanager
def pairs(programs, count):
    """A settled pair for each program."""
    with contextlib.ExitStack() as stack:
        yield [stack.enter_context(settled(program, count)) for program in programs]
