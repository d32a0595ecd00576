"""Directories of the machine that a world may change for itself."""


def overlay(world, directory):
    """Make a directory of the machine's the world's own to change."""
    upper = "/run/world/overlay" + directory
    world.run("mkdir", "-p", f"{upper}/upper", f"{upper}/work")
    world.run("mount", "-t", "overlay", "overlay", directory, "-o",
              f"lowerdir={directory},upperdir={upper}/upper,workdir={upper}/work")
