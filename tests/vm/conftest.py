"""Fixtures of the machine's tests. Whatever cannot be had here is named in the reason of the skip."""

import os
import subprocess
from pathlib import Path

import pytest

from vm.daemon import Daemon, pack_daemon
from vm.disks import DiskBox
from vm.vm import Vm, VmError

from world.built import RELEASE

HERE = Path(__file__).resolve().parent
UNAVAILABLE = 69


@pytest.fixture(scope="session")
def machine_files():
    """The kernel and root file system, fetched and packed when they are not there yet."""
    if os.geteuid() != 0:
        pytest.skip("the machine's packages are installed as root")

    result = subprocess.run([HERE / "prepare"], stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True)

    if result.returncode == UNAVAILABLE:
        pytest.skip(f"no machine: {result.stdout.splitlines()[-1]}")
    if result.returncode != 0:
        pytest.fail(f"prepare ended with {result.returncode}:\n{result.stdout}", pytrace=False)


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


@pytest.fixture(scope="session")
def daemon_files(machine_files, tmp_path_factory):
    """What puts the release daemon into a machine."""
    if not RELEASE.exists():
        pytest.skip(f"no daemon: {RELEASE} is not built")

    overlay = tmp_path_factory.mktemp("vm") / "daemon.cpio"
    pack_daemon(overlay)
    return overlay


@pytest.fixture(scope="session")
def daemon_vm(daemon_files):
    """One machine with the release daemon in it for all tests; `daemon` cleans it up between them."""
    with Vm(daemon_files) as vm:
        yield vm


@pytest.fixture
def daemon(daemon_vm, box):
    """The daemon, not yet started, its companion running. What it printed is shown when the test fails."""
    driver = Daemon(daemon_vm)
    driver.start_companion()
    yield driver
    print(driver.log())

    try:
        driver.reset()
    except VmError:
        daemon_vm.stop()
        daemon_vm.start()
