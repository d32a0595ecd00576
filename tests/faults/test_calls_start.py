"""Every system call of a starting daemon fails, one at a time."""

from shared import preload
import pytest
from faults.calls import known_names, of_stage, parametrize
from faults.starting import Starts

pytestmark = pytest.mark.needs_fs("ext4")

_PER_TEST = 2


@pytest.fixture
def starts(world, start_daemon, libraries):
    """A world to start a hastened daemon in."""
    return Starts(world, preload.install(world, libraries, "haste"))


def pytest_generate_tests(metafunc):
    parametrize(metafunc, ("start",), _PER_TEST)


def chosen(call, error, how_many, long_form):
    """Which occurrences fail: all, or the middle one, and for the first error the first too."""
    if long_form:
        return range(1, how_many + 1)
    middle = (how_many + 1) // 2
    return sorted({1, middle} if error == call.errors[0] else {middle})


def test_every_call_of_a_start_is_known(starts):
    own = starts.baseline()
    assert set(own) - known_names() == set()
    missed = [call.name for call in of_stage("start") if not set(call.names) & set(own)]
    assert missed == []


def test_a_failing_call_at_start_ends_in_order_or_leads_to_a_right_state(
        starts, count, outcome, long_form, stage, call, errors):
    own = starts.baseline()
    for error in errors:
        injected = 0
        for name, how_many in starts.occurrences(call, own):
            for number in chosen(call, error, how_many, long_form):
                injected += starts.fail(call, name, error, number)
        assert injected > 0
        count(f"{stage:8}{call.name} {error}", injected)
    for what, times in starts.outcomes.items():
        outcome(what, times)
