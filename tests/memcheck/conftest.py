"""Fixtures of the runs under valgrind: the system tests' world, and valgrind's command line."""

import shutil
import sys
from pathlib import Path

import pytest

CHECKOUT = Path(__file__).resolve().parents[2]
DEBUG = CHECKOUT / "build/debug"
sys.path[:0] = [str(CHECKOUT / "tests"), str(CHECKOUT / "tests/system")]

from system.conftest import (  # noqa: F401
    make_world, pytest_configure, pytest_report_header, pytest_runtest_makereport,
    pytest_runtest_setup)

# What is still reachable at the end is static data of libraries, which they never give back.
_OPTIONS = ["--error-exitcode=9", "--leak-check=full", "--vgdb=no",
            "--show-leak-kinds=definite,indirect,possible",
            "--errors-for-leak-kinds=definite,indirect,possible"]


@pytest.fixture
def valgrind():
    """The words in front of a program that let it run under valgrind; no suppressions."""
    if not shutil.which("valgrind"):
        pytest.skip("valgrind is not installed")
    return ["valgrind", *_OPTIONS]


@pytest.fixture
def debug_program():
    """Function that gives the path of a program of the debug preset."""
    def find(name):
        if not (DEBUG / name).exists():
            pytest.skip(f"{DEBUG / name} is not built (cmake --build --preset debug)")
        return DEBUG / name
    return find
