"""Reads a file again and again, as fast as it can, until its standard input ends.

A program of its own, so that nothing of a test holds it up.  Prints what it saw as JSON: how
often it read, how often the file was missing after its first sight, each text that it met, and
how often the text was another than the time before.
"""

import json
import os
import select
import sys

READS_BETWEEN_LOOKS = 1000


def read(path):
    """The file's text as one look at it gives it, None when it is not there."""
    try:
        fd = os.open(path, os.O_RDONLY)
    except FileNotFoundError:
        return None
    try:
        return os.read(fd, 1 << 20)
    finally:
        os.close(fd)


def watch(path):
    seen = {"reads": 0, "missing": 0, "changes": 0}
    texts, last = set(), None
    while not select.select([sys.stdin], [], [], 0)[0]:
        for _ in range(READS_BETWEEN_LOOKS):
            text = read(path)
            if text is None:
                seen["missing"] += last is not None
                continue
            seen["reads"] += 1
            if text != last:
                seen["changes"] += 1
                texts.add(text)
                last = text
    return {**seen, "texts": [text.decode(errors="replace") for text in texts]}


if __name__ == "__main__":
    print(json.dumps(watch(sys.argv[1])))
