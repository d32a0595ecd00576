"""The daemon's binaries, and whether one that nothing rebuilds is still that of the sources."""

import os
from pathlib import Path

CHECKOUT = Path(__file__).resolve().parents[2]
PROGRAM = CHECKOUT / "build/release/tarn_nas_diskmanager"
RELEASE = Path(os.environ.get("TARN_DAEMON") or PROGRAM)
_BUILT_STATIC = CHECKOUT / "build/cross/x86_64/tarn_nas_diskmanager"
STATIC = Path(os.environ.get("TARN_DAEMON_STATIC") or _BUILT_STATIC)


def why_not(program):
    """Why one of the two is not to be tested, as a text; empty when it is."""
    if program == _BUILT_STATIC and os.environ.get("TARN_DAEMON"):
        return "TARN_DAEMON names the only program to test (TARN_DAEMON_STATIC adds a static one)"
    if not program.exists():
        return f"{program} is not built (scripts/cross x86_64 makes the static one)"
    # scripts/test does not build it; elsewhere its age says nothing.
    if program == _BUILT_STATIC and (source := outdated(program)):
        return f"{program} is older than {source} (scripts/cross x86_64 makes it anew)"
    return ""


def outdated(program, checkout=CHECKOUT):
    """The newest of the daemon's source files when `program` is older than it, else None."""
    sources = [path for place in ("src", "platform") for path in (checkout / place).rglob("*")
               if path.is_file()]
    newest = max(sources, key=lambda path: path.stat().st_mtime_ns)
    if Path(program).stat().st_mtime_ns < newest.stat().st_mtime_ns:
        return newest.relative_to(checkout)
    return None
