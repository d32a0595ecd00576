"""Fixtures of all groups: a world for each test, the daemon in it, the long form, figures."""

import pytest
from shared.published import StatusWatch

from world import World, kernel_has, missing
from world.world import PROGRAM

_WORLDS = pytest.StashKey[list]()


def pytest_addoption(parser):
    parser.addoption("--long", action="store_true",
                     help="the long form of the faults and storms; takes hours")
    parser.addoption("--seed", type=int, default=None,
                     help="seed of what is random, printed with the figures of each run")


def pytest_report_header():
    lacks = missing()
    if lacks:
        return ["no private world can be made here, every test will be skipped:",
                *(f"  {text}" for text in lacks)]
    absent = [name for name in ("ext2", "ext3", "ext4", "vfat", "exfat", "ntfs")
              if not kernel_has(name)]
    return [f"filesystems that this kernel cannot mount: {', '.join(absent) or 'none'}"]


def pytest_runtest_setup(item):
    for marker in item.iter_markers("needs_fs"):
        absent = [name for name in marker.args if not kernel_has(name)]
        if absent:
            pytest.skip(f"the kernel cannot mount {', '.join(absent)}")


def pytest_collection_modifyitems(items):
    """The longest go first, so that none of them is left alone at the end."""
    items.sort(key=lambda item: item.get_closest_marker("takes_minutes") is None)


@pytest.hookimpl(hookwrapper=True)
def pytest_runtest_makereport(item):
    """Put the worlds' state and the daemon's log beside a failed test."""
    outcome = yield
    report = outcome.get_result()
    if report.failed:
        for number, world in enumerate(item.stash.get(_WORLDS, []), 1):
            report.sections.append((f"world {number}", world.diagnosis()))


def pytest_terminal_summary(terminalreporter):
    """The figures of every test, passed or not."""
    for outcome in ("passed", "failed"):
        for report in terminalreporter.stats.get(outcome, []):
            for name, value in report.user_properties:
                if isinstance(value, str):
                    terminalreporter.write_line(f"{report.nodeid.split('::')[-1]}: {name}: {value}")


@pytest.fixture
def long_form(request):
    """True when everything is wanted."""
    return request.config.getoption("--long")


@pytest.fixture
def figure(record_property):
    """Function that notes a figure for the summary and for the result file."""
    def note(name, value):
        record_property(name, str(value))
        # Beside a failed test too, where the summary has the whole log above it.
        print(f"{name}: {value}")
    return note


@pytest.fixture
def make_world(request):
    """Function that makes a World with given options; all are closed at the end."""
    lacks = missing()
    if lacks:
        pytest.skip("no private world: " + "; ".join(lacks))
    worlds = request.node.stash.setdefault(_WORLDS, [])

    def make(**options):
        world = World(**options)
        worlds.append(world)
        return world

    yield make
    while worlds:
        worlds.pop().close()


@pytest.fixture
def world(make_world):
    """A fresh world with the distribution's tools."""
    return make_world()


@pytest.fixture
def watched_status(world):
    """Holds every status that the daemon publishes in `world` against the schema."""
    watch = StatusWatch(world)
    watch.start()
    yield
    watch.stop()
    assert not watch.faults, "\n".join(watch.faults)


@pytest.fixture
def start_daemon(world):
    """Function that starts the daemon in `world`; skips where it is not built."""
    if not world.program.exists():
        pytest.skip(f"{world.program} is not built (default {PROGRAM})")
    return world.start_daemon


@pytest.fixture
def daemon(start_daemon):
    """The daemon, started in a world without disks, its start-up scan done."""
    return start_daemon()
