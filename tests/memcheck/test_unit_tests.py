"""The unit tests under valgrind, those in processes of their own included."""

import re
import subprocess

from world import CHECKOUT

# They take away the right to open files, which valgrind does not allow: it needs that itself.
LEFT_OUT = ["Manager.a_scan_that_cannot_read_the_kernels_list_answers_1",
            "Pulled.a_list_that_cannot_be_read_makes_no_disk_a_pulled_one",
            "Removal.the_safe_removal_fails_when_the_kernels_list_cannot_be_read",
            "Rescan.a_list_that_cannot_be_read_changes_nothing"]


def test_the_unit_tests_leave_nothing_behind_and_touch_nothing_of_others(valgrind, debug_program):
    """A child of the program ends with valgrind's status when there was anything in it, which its
    test takes for a failure.
    """
    done = subprocess.run(
        [CHECKOUT / "tests/unit/run_cases", "--jobs=2", "--limit=300", "--finding", r"==\d+== ",
         *(f"--without={name}" for name in LEFT_OUT),
         *valgrind, "--quiet", debug_program("tests/unit/unit_tests")],
        text=True, errors="replace", check=False,
        stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
    assert done.returncode == 0, done.stdout
    assert int(re.search(r"^(\d+) passed, 0 failed", done.stdout, re.MULTILINE).group(1)) > 400
