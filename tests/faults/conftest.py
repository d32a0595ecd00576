"""Fixtures of the tests with faults: what they preload, two disks to try them on, and the count."""

from collections import Counter

import pytest
from faults.rig import Rig
from shared import preload

_INJECTED = "injected"
_OUTCOME = "outcome"


def pytest_terminal_summary(terminalreporter):
    """The figures: what failed how often in which stage, and what came of the starts."""
    reports = [report for some in terminalreporter.stats.values() for report in some
               if getattr(report, "when", "") == "call"]
    for property_name, title in ((_INJECTED, "faults injected"), (_OUTCOME, "starts")):
        totals = Counter()
        for report in reports:
            for name, (what, times) in report.user_properties:
                if name == property_name:
                    totals[what] += times
        if totals:
            terminalreporter.section(title)
            for what, times in [*sorted(totals.items()), ("in all", totals.total())]:
                terminalreporter.write_line(f"{what:44} {times:7}")


@pytest.fixture
def count(request):
    """Function that notes for the summary what failed and how often."""
    def note(what, times):
        request.node.user_properties.append((_INJECTED, (what, times)))
    return note


@pytest.fixture
def outcome(request):
    """Function that notes for the summary how many starts ended how."""
    def note(what, times):
        request.node.user_properties.append((_OUTCOME, (what, times)))
    return note


@pytest.fixture(scope="session")
def libraries(tmp_path_factory):
    """The folder of the libraries to preload."""
    return preload.build(tmp_path_factory.mktemp("preload"))


@pytest.fixture
def rig(world, start_daemon, libraries):
    """Two disks mounted, published and remembered, the first rescan over; a hastened daemon."""
    return Rig(world, environ=preload.install(world, libraries, "haste"))
