"""Adds up the result files of the test groups.

    summary.py DIRECTORY SECONDS GROUP...

Prints each group's counts, every failure, every reason for skipping, the times that the
file DIRECTORY/times holds beside the SECONDS of the whole, and as the last line "N passed,
N failed, N skipped". Exit status 1 when a test failed, a group ended badly or no test of
it passed: what was asked for and only skipped was not tested.
"""

import collections
import pathlib
import sys
import xml.etree.ElementTree as xml


def outcome(case):
    """'failed', 'skipped' or 'passed', and the reason for a skip."""
    if case.find("failure") is not None or case.find("error") is not None:
        return "failed", ""
    skipped = case.find("skipped")
    if skipped is not None:
        return "skipped", skipped.get("message") or (skipped.text or "")
    return "passed", ""


def read_group(path):
    """Counter of outcomes, the failed names, and Counter of skip reasons."""
    counts, failed, reasons = collections.Counter(), [], collections.Counter()
    for case in xml.parse(path).iter("testcase"):
        result, reason = outcome(case)
        counts[result] += 1
        if result == "failed":
            failed.append(case.get("name"))
        elif result == "skipped":
            first = reason.splitlines()[0] if reason else "no reason given"
            reasons[f"{case.get('name')}: {first}"] += 1
    return counts, failed, reasons


def read_times(path):
    """{name: (seconds to build, seconds to run, how it ended)} in the order in which they ended."""
    words = (line.split() for line in path.read_text().splitlines())
    return {name: (int(build), int(run), end) for name, build, run, end in words}


def print_outcomes(name, counts, failed, reasons):
    print(f"{name}: {counts['passed']} passed, {counts['failed']} failed, {counts['skipped']} skipped")
    for case in failed:
        print(f"  failed   {case}")
    for reason in sorted(reasons):
        print(f"  skipped  {reason}")


def judge_group(name, path, end):
    """Print what came of a group; returns the counts, in which a group that broke has failed."""
    if not path.exists():
        print(f"{name}: no results, the group did not run")
        return collections.Counter(failed=1)
    counts, failed, reasons = read_group(path)
    print_outcomes(name, counts, failed, reasons)
    if not counts["failed"] and (not counts["passed"] or end != "passed"):
        why = "it ended badly" if counts["passed"] else "no test of it passed"
        print(f"  failed   the group: {why}")
        counts["failed"] += 1
    return counts


def print_times(times, whole):
    """Where the time went; groups that ran beside each other add up to more than the whole."""
    print(f"{'seconds':10} {'build':>6} {'run':>6}")
    for name, (build, run, _) in times.items():
        print(f"{name:10} {build:6} {run:6}")
    print(f"{'whole':10} {'':6} {whole:6}")


def main(directory, whole, groups):
    directory, total = pathlib.Path(directory), collections.Counter()
    times = read_times(directory / "times")
    for group in groups:
        _, _, end = times.get(group, (0, 0, "missing"))
        total += judge_group(group, directory / f"{group}.xml", end)
    print_times(times, int(whole))
    print(f"{total['passed']} passed, {total['failed']} failed, {total['skipped']} skipped")
    return 1 if total["failed"] else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1], sys.argv[2], sys.argv[3:]))
