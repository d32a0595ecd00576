"""Libraries of the tests' own that the daemon preloads: haste.c and alloc.c."""

import subprocess
from pathlib import Path

HERE = Path(__file__).resolve().parent
NAMES = ("haste", "alloc")
HASTE = 5
CONTROL = "/run/world/alloc-control"


def build(folder):
    """Compile the libraries; returns the folder they are in."""
    for name in NAMES:
        subprocess.run(["gcc", "-Wall", "-Wextra", "-Werror", "-O1", "-fPIC", "-shared",
                        "-o", Path(folder) / f"{name}.so", HERE / f"{name}.c", "-ldl"], check=True)
    return Path(folder)


def install(world, folder, *names, haste=HASTE, haste_waits=None):
    """Put libraries where the world sees them; returns the daemon's environment."""
    places = []
    for name in names:
        places.append(f"/run/world/{name}.so")
        world.path(places[-1]).write_bytes((folder / f"{name}.so").read_bytes())
    return {"LD_PRELOAD": ":".join(places), "HASTE": str(haste),
            "HASTE_WAITS": str(haste_waits or haste), "ALLOC_CONTROL": CONTROL}
