"""Fixtures of the runs under valgrind: its command line, and the programs of the debug preset."""

import shutil

import pytest

from world import CHECKOUT

DEBUG = CHECKOUT / "build/debug"
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
