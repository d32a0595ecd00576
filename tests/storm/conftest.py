"""Fixtures of the storm tests: those of the system tests, a long form, and printed figures."""

import sys
from pathlib import Path

import pytest

HERE = Path(__file__).resolve().parent
sys.path[:0] = [str(HERE.parent), str(HERE.parent / "system")]

from system.conftest import (  # noqa: F401
    make_world, pytest_configure, pytest_report_header, pytest_runtest_makereport,
    pytest_runtest_setup)


def pytest_addoption(parser):
    parser.addoption("--long", action="store_true",
                     help="the long form: hundreds of kills, 100,000 signals, 10,000 events")
    parser.addoption("--seed", type=int, default=None,
                     help="seed of what is random, printed with the figures of each run")


def pytest_terminal_summary(terminalreporter):
    """The figures of every test, passed or not: they are what these tests are for."""
    for outcome in ("passed", "failed"):
        for report in terminalreporter.stats.get(outcome, []):
            for name, value in report.user_properties:
                terminalreporter.write_line(f"{report.nodeid.split('::')[-1]}: {name}: {value}")


@pytest.fixture
def is_long(request):
    """True in the long form."""
    return request.config.getoption("--long")


@pytest.fixture
def figure(record_property):
    """Function that notes a figure for the summary and for the result file."""
    def note(name, value):
        record_property(name, str(value))
        # Beside a failed test too, where the summary has the whole log above it.
        print(f"{name}: {value}")
    return note
