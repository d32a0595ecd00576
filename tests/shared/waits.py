"""Which table of waits a daemon was built with, where a test counts its looks or its seconds."""

from pathlib import Path

from world.built import CHECKOUT, PROGRAM

PROMPT_PROGRAM = CHECKOUT / "build/prompt/tarn_nas_diskmanager"
BOTH_PROGRAMS = (PROGRAM, PROMPT_PROGRAM)


def is_prompt(program):
    """True for a program in whose build directory CMake was told so."""
    cache = Path(program).parent / "CMakeCache.txt"
    return cache.exists() and "DISKMANAGER_WAITS:STRING=prompt\n" in cache.read_text()


def looks_after_mount(program):
    """How often the daemon looks for a mount that never appears."""
    return 10 if is_prompt(program) else 9
