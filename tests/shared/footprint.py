"""What a process holds: descriptors and memory."""

import os
import re
from dataclasses import dataclass, fields
from pathlib import Path

_MAPPING = re.compile(r"[0-9a-f]+-[0-9a-f]+ (\S+) \S+ \S+ \d+ *(.*)")


@dataclass(frozen=True)
class Footprint:
    """Descriptors, and memory in KiB.

    heap    resident part of the heap and of the other writable mappings without a file
    mapped  the size of the same mappings
    """

    descriptors: int
    rss: int
    pss: int
    private_dirty: int
    heap: int
    mapped: int

    @classmethod
    def of(cls, pid):
        rollup = _values(Path(f"/proc/{pid}/smaps_rollup").read_text())
        heap, mapped = _anonymous(Path(f"/proc/{pid}/smaps").read_text())
        return cls(len(os.listdir(f"/proc/{pid}/fd")), rollup["Rss"], rollup["Pss"],
                   rollup["Private_Dirty"], heap, mapped)

    @classmethod
    def largest(cls, several):
        """The largest value of each kind."""
        return cls(*(max(getattr(one, field.name) for one in several) for field in fields(cls)))

    def __str__(self):
        return ", ".join(f"{field.name} {getattr(self, field.name)}" for field in fields(self))


def _values(text):
    return {key: int(value) for key, value in re.findall(r"^(\w+): +(\d+) kB$", text, re.MULTILINE)}


def _anonymous(smaps):
    heap = mapped = 0
    for block in re.split(r"^(?=[0-9a-f]+-[0-9a-f]+ )", smaps, flags=re.MULTILINE)[1:]:
        permissions, name = _MAPPING.match(block).groups()
        if "w" in permissions and name in ("", "[heap]"):
            values = _values(block)
            heap += values["Rss"]
            mapped += values["Size"]
    return heap, mapped
