"""Every system call of a running daemon fails: in removal, addition, mount, idle work, rescan
and safe removal."""

import signal
import time
from contextlib import suppress

import pytest
from faults.calls import known_names, names_in, of_stage, parametrize
from shared.preload import HASTE
from shared.strace import Strace

from world import WaitTimeout
from world.state import SCRATCH

pytestmark = pytest.mark.needs_fs("ext4")

# Which occurrences of a call fail, as first and step.  Code that repeats a call after
# EINTR must meet one that is not interrupted, so that error never takes them all.
SHORT = ("1+2", "1+1", "2+3", "1+3")
LONG = tuple(f"{first}+{step}" for step in (1, 2, 3, 5, 7) for first in range(1, step + 1))
_PER_TEST = 3
SHORTAGE = 3
STOPPED = 5


def pytest_generate_tests(metafunc):
    parametrize(metafunc, ("cycle", "files", "syslog", "planted"), _PER_TEST)


def patterns(call, error, long_form):
    """The occurrences to let fail; the short form takes one pattern, not always the same."""
    if long_form:
        return [when for when in LONG if not (error == "EINTR" and when == "1+1")]
    if error == "EINTR" or call.rare:
        return ["1+2"]
    return [SHORT[call.errors.index(error) % len(SHORT)]]


def test_every_call_of_a_cycle_is_known(rig):
    with Strace(rig.daemon) as strace:
        rig.busy_cycle()
        rig.replug()
        rig.wait_right()
    seen = names_in(strace.trace)
    assert set(seen) - known_names() == set()
    missed = [call.name for call in of_stage("cycle") if not set(call.names) & set(seen)]
    assert missed == []


def prepare(rig, stage):
    """What makes the daemon do the calls of a stage."""
    if stage == "syslog" and not rig.world.exists("/dev/log"):
        rig.world.syslog()
        rig.daemon.signal(signal.SIGUSR2)
    elif stage == "planted":
        rig.world.sh(f"for name in {' '.join(SCRATCH)}; do mkdir -p $name/full; done")


def fail(rig, stage, call, fault):
    """Let a call fail while the daemon is busy; returns how often it did.

    What can hide no data leaves a right state by itself, with no disk plugged again.
    """
    paths = SCRATCH if stage == "files" else ()
    with Strace(rig.daemon, call.names, fault, paths) as plugged:
        rig.plug_cycle(lambda: plugged.injected > 0)
    if not call.hides:
        rig.wait_right(rows=not call.stores)
    failed = plugged.injected
    # Where the command does not get through, it comes once the tracer is gone.
    with Strace(rig.daemon, call.names, fault, paths) as removed, suppress(WaitTimeout):
        rig.safe_removal(STOPPED)
    return failed + removed.injected


def test_a_failing_call_in_a_cycle_is_survived_and_the_next_plug_is_right(
        rig, count, long_form, stage, call, errors):
    kept_open = 0
    for error in errors:
        injected = 0
        for when in patterns(call, error, long_form):
            prepare(rig, stage)
            failed = fail(rig, stage, call, f"error={error}:when={when}")
            injected += failed
            if call.name == "close":
                # The tracer keeps the call from being made, so these stay open.
                kept_open += failed
            rig.check(kept_open, by_hand=call.hides)
        assert injected > 0
        count(f"{stage:8}{call.name} {error}", injected)
    assert rig.daemon.stop() == 0


def test_a_wait_that_keeps_failing_makes_no_busy_loop(rig, count):
    begun = time.monotonic()
    with Strace(rig.daemon, ["pselect6", "select"], "error=ENOMEM") as strace:
        time.sleep(SHORTAGE)
    # A cycle a second, and the one that had begun.
    assert 0 < strace.injected <= (time.monotonic() - begun) * HASTE + 1
    count("cycle   pselect6 ENOMEM", strace.injected)
    rig.check()
