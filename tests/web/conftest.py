"""Fixtures of the web interface's tests."""

import pytest
from web.browser import Browser
from web.exchange import CheckedPlugin
from web.router import PLUGIN_PACKAGE, Listener, stage
from web.server import PageServer
from web.test_list import add_disk, mount, part, publish


@pytest.fixture(scope="session")
def plugin_root(tmp_path_factory):
    """What the plugin's package installs."""
    return stage(PLUGIN_PACKAGE, tmp_path_factory.mktemp("plugin"))


@pytest.fixture
def world(make_world):
    """A router's world; the companion keeps its daemon from ending in silence."""
    world = make_world(tools="busybox")
    world.start_companion()
    return world


@pytest.fixture
def plugin(world, plugin_root):
    """The plugin in `world`."""
    return CheckedPlugin(world, plugin_root)


@pytest.fixture
def listener(world):
    """Somebody who takes messages in the daemon's place."""
    listener = Listener(world)
    yield listener
    listener.close()


@pytest.fixture(scope="session")
def _browser():
    browser = Browser()
    yield browser
    browser.close()


@pytest.fixture
def browser(_browser):
    """A browser; the page that it showed must not have complained."""
    _browser.complaints()
    yield _browser
    _browser.driver.get("about:blank")


@pytest.fixture
def server(plugin):
    """The page of `world`."""
    server = PageServer(plugin)
    yield server
    server.close()


@pytest.fixture
def disks(world, listener):
    """A USB disk with two partitions, of which one is mounted and one too small, and an SD card."""
    add_disk(world, "sda", 4000, [1800, 500])
    add_disk(world, "mmcblk0", 2000, [1200])
    publish(world, [part("sda1", "disk1_part1", label="DATA", total=1800, free=450)],
            [part("mmcblk0p1", "disk2_part1", "FAT", label="CARD", total=1200, free=1200)])
    mount(world, "sda1", "/tmp/mountd/disk1_part1")
    mount(world, "mmcblk0p1", "/tmp/mountd/disk2_part1")
    return listener
