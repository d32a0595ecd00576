"""Fixtures of the package's tests: a router with busybox on which the package is installed."""

import os
import subprocess
from pathlib import Path

import pytest
from openwrt.router import HERE, PACKAGE, Buildroot, Router
from shared import preload

from world.world import PROGRAM


@pytest.fixture(scope="session")
def stand_in(tmp_path_factory):
    """The program that has the daemon's signals, pid file and pipe."""
    program = tmp_path_factory.mktemp("stand_in") / "tarn_nas_diskmanager"
    subprocess.run(["cc", "-O1", "-static", "-Wall", "-Wextra", "-Werror", "-o", program,
                    HERE / "stand_in.c"], check=True)
    return program


@pytest.fixture
def make_router(make_world, tmp_path):
    """Function that installs the package around a given daemon on a fresh router."""
    def make(program, full_log=False, environ=None):
        buildroot = Buildroot(tmp_path / "buildroot", program)
        return Router(make_world(tools="busybox", environ=environ),
                      buildroot.install(PACKAGE, f"{PACKAGE}-label"), full_log)
    return make


@pytest.fixture
def router(make_router, stand_in):
    """A router on which the stand-in plays the daemon."""
    return make_router(stand_in)


@pytest.fixture
def real_daemon():
    """The daemon's binary."""
    program = Path(os.environ.get("TARN_DAEMON") or PROGRAM)
    if not program.exists():
        pytest.skip(f"{program} is not built")
    return program


@pytest.fixture
def real_router(make_router, real_daemon):
    """A router with the real daemon, which logs all that it says."""
    return make_router(real_daemon, full_log=True)


@pytest.fixture
def hasty_router(make_router, real_daemon, tmp_path):
    """Function that makes a router whose daemon, and its heart-beat, live some seconds in one."""
    def make(haste, **options):
        libraries = preload.build(tmp_path)
        environ = {"LD_PRELOAD": "/run/world/haste.so", "HASTE": str(haste)}
        router = make_router(real_daemon, environ=environ, **options)
        router.world.path("/run/world/haste.so").write_bytes((libraries / "haste.so").read_bytes())
        router.beat_every(router.beat_interval() // haste)
        return router
    return make


@pytest.fixture
def buildroot(tmp_path, stand_in):
    """A buildroot that takes the stand-in for the compiled daemon."""
    return Buildroot(tmp_path / "buildroot", stand_in)
