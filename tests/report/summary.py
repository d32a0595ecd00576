"""Adds up the result files of the test groups.

    summary.py DIRECTORY GROUP...

Prints each group's counts, every failure, every reason for skipping, and as the
last line "N passed, N failed, N skipped". Exit status 1 when a test failed or
no test of a group passed: what was asked for and only skipped was not tested.
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


def main(directory, groups):
    total = collections.Counter()
    for group in groups:
        path = pathlib.Path(directory) / f"{group}.xml"
        if not path.exists():
            print(f"{group}: no results, the group did not run")
            total["failed"] += 1
            continue
        counts, failed, reasons = read_group(path)
        total += counts
        print(f"{group}: {counts['passed']} passed, {counts['failed']} failed, {counts['skipped']} skipped")
        if not counts["passed"] and not counts["failed"]:
            print("  failed   the group: no test of it passed")
            total["failed"] += 1
        for name in failed:
            print(f"  failed   {name}")
        for reason in sorted(reasons):
            print(f"  skipped  {reason}")
    print(f"{total['passed']} passed, {total['failed']} failed, {total['skipped']} skipped")
    return 1 if total["failed"] else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1], sys.argv[2:]))
