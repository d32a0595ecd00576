"""The unit tests under valgrind, those in processes of their own included."""

import os
import re
import subprocess

import pytest

from world import CHECKOUT

SHARDS = 4
# They take away the right to open files, which valgrind does not allow: it needs that itself.
LEFT_OUT = ["Manager.a_scan_that_cannot_read_the_kernels_list_answers_1",
            "Removal.the_safe_removal_fails_when_the_kernels_list_cannot_be_read",
            "Rescan.a_list_that_cannot_be_read_changes_nothing"]


@pytest.mark.parametrize("shard", range(SHARDS))
def test_the_unit_tests_leave_nothing_behind_and_touch_nothing_of_others(
        valgrind, debug_program, shard):
    """A child of the program ends with valgrind's status when there was anything in it, which its
    test takes for a failure.
    """
    done = subprocess.run(
        [CHECKOUT / "tests/unit/run_private", *valgrind, "--quiet",
         debug_program("tests/unit/unit_tests"), f"--gtest_filter=-{':'.join(LEFT_OUT)}"],
        text=True, errors="replace", check=False, timeout=900,
        stdout=subprocess.PIPE, stderr=subprocess.STDOUT,
        env={**os.environ, "GTEST_TOTAL_SHARDS": str(SHARDS), "GTEST_SHARD_INDEX": str(shard)})
    found = re.findall(r"==\d+== .*", done.stdout)
    assert found == []
    assert re.findall(r"\[  FAILED  \] .*", done.stdout) == []
    assert done.returncode == 0
    assert int(re.search(r"\[  PASSED  \] (\d+) tests", done.stdout).group(1)) > 100
