"""Allocations of the daemon made to fail, by a library of the tests' own that it preloads."""

import mmap
import os
import struct
from dataclasses import dataclass

from shared.preload import CONTROL

SQLITE, CJSON, OWN = 1, 2, 3

# As alloc.c has it.
_FIELDS = ("armed", "from_on", "next", "step", "repeat", "every", "own_seen",
           "own_failed", "own_left", "count")
_WORD = struct.Struct("=i")
_OPERATION = struct.Struct("=iiii")
_MAX_OPERATIONS = 20000
_HEAD = _WORD.size * len(_FIELDS)


@dataclass(frozen=True)
class Operation:
    """One operation of a library: which allocation was to fail, how many were made, how
    many of them failed, and how many blocks were not given back."""

    nth: int
    seen: int
    failed: int
    left: int


class Allocations:
    """The switch of one world, which a daemon obeys that has "alloc" preloaded."""

    def __init__(self, world):
        control = world.path(CONTROL)
        control.write_bytes(bytes(_HEAD + _OPERATION.size * _MAX_OPERATIONS))
        with control.open("r+b") as stream:
            self._shared = mmap.mmap(stream.fileno(), os.fstat(stream.fileno()).st_size)

    def arm(self, kind, first=1, step=1, repeat=1, every=1, from_on=False):
        """Let allocations fail from now on, until `disarm`.

        SQLITE, CJSON  the `first` one of the next `repeat` operations fails, then the
                       one `step` further; with `from_on` all behind it too
        OWN            the `first` and each `every` further one fails
        """
        self.disarm()
        for name, value in (("from_on", from_on), ("next", first), ("step", step),
                            ("repeat", repeat), ("every", every), ("own_seen", 0),
                            ("own_failed", 0), ("own_left", 0), ("count", 0), ("armed", kind)):
            self._set(name, int(value))

    def disarm(self):
        self._set("armed", 0)

    @property
    def own_failed(self):
        return self._get("own_failed")

    @property
    def own_left(self):
        """Blocks of the program's own, made since `arm`, that it has not given back."""
        return self._get("own_left")

    def operations(self):
        """What was done since `arm`."""
        return [Operation(*_OPERATION.unpack_from(self._shared, _HEAD + number * _OPERATION.size))
                for number in range(self._get("count"))]

    def _set(self, name, value):
        _WORD.pack_into(self._shared, _FIELDS.index(name) * _WORD.size, value)

    def _get(self, name):
        return _WORD.unpack_from(self._shared, _FIELDS.index(name) * _WORD.size)[0]
