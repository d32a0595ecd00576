"""Fixtures of the machine's tests. Whatever cannot be had here is named in the reason of the skip."""

import os
import subprocess
from pathlib import Path

import pytest

from disks import DiskBox
from vm import Vm

HERE = Path(__file__).resolve().parent


def fail_reason(result):
    lines = (result.stderr + result.stdout).strip().splitlines()
    return lines[-1] if lines else f"exit status {result.returncode}"


@pytest.fixture(scope="session")
def machine_files():
    """The kernel and root file system, fetched and packed when they are not there yet."""
    if os.geteuid() != 0:
        pytest.skip("the machine's packages are installed as root")

    result = subprocess.run([HERE / "prepare"], capture_output=True, text=True)

    if result.returncode != 0:
        pytest.skip(f"no machine: qemu, the kernel package or a tool cannot be had ({fail_reason(result)})")


@pytest.fixture
def box(tmp_path):
    """Makes images for one test; they are deleted with the test."""
    made = DiskBox(tmp_path)
    yield made
    made.close()


@pytest.fixture
def bare_vm(machine_files):
    """A machine without the daemon."""
    with Vm() as vm:
        yield vm
