"""Fixtures of the package's tests: a router with busybox on which the package is installed."""

import os
import subprocess
import sys
from pathlib import Path

import pytest

HERE = Path(__file__).resolve().parent
sys.path[:0] = [str(HERE), str(HERE.parent)]

from router import PACKAGE, Buildroot, Router
from world import missing
from world.world import PROGRAM


def pytest_runtest_setup():
    lacks = missing()
    if lacks:
        pytest.skip("no private world: " + "; ".join(lacks))


@pytest.fixture(scope="session")
def stand_in(tmp_path_factory):
    """The program that has the daemon's signals, pid file and pipe."""
    program = tmp_path_factory.mktemp("stand_in") / "tarn_nas_diskmanager"
    subprocess.run(["cc", "-O1", "-static", "-Wall", "-Wextra", "-Werror", "-o", program,
                    HERE / "stand_in.c"], check=True)
    return program


@pytest.fixture
def make_router(tmp_path):
    """Function that installs the package around a given daemon on a fresh router."""
    routers = []

    def make(program):
        buildroot = Buildroot(tmp_path / f"buildroot-{len(routers)}", program)
        routers.append(Router(buildroot.install(PACKAGE, f"{PACKAGE}-label")))
        return routers[-1]

    yield make
    for router in routers:
        router.close()


@pytest.fixture
def router(make_router, stand_in):
    """A router on which the stand-in plays the daemon."""
    return make_router(stand_in)


@pytest.fixture
def real_router(make_router):
    """A router with the real daemon."""
    program = Path(os.environ.get("TARN_DAEMON") or PROGRAM)
    if not program.exists():
        pytest.skip(f"{program} is not built")
    return make_router(program)


@pytest.fixture
def buildroot(tmp_path, stand_in):
    """A buildroot that takes the stand-in for the compiled daemon."""
    return Buildroot(tmp_path / "buildroot", stand_in)
