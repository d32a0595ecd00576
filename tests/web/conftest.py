"""Fixtures of the web interface's tests."""

import pytest
from web.router import PLUGIN_PACKAGE, Listener, Plugin, stage


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
    return Plugin(world, plugin_root)


@pytest.fixture
def listener(world):
    """Somebody who takes messages in the daemon's place."""
    listener = Listener(world)
    yield listener
    listener.close()
