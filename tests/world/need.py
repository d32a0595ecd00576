"""What a machine must have before a world can be made on it."""

import os
import shutil
import subprocess
from functools import cache
from pathlib import Path

_PROGRAMS = {
    "unshare": "util-linux", "nsenter": "util-linux", "blkid": "util-linux",
    "sfdisk": "fdisk", "mkfs.ext4": "e2fsprogs", "mkntfs": "ntfs-3g",
    "mount.ntfs-3g": "ntfs-3g", "pgrep": "procps", "pidof": "sysvinit-utils",
}
_SEARCH = "/usr/sbin:/usr/bin:/sbin:/bin"


def missing():
    """Texts that say what is missing here; empty when a world can be made."""
    if os.geteuid() != 0:
        return ["not root: namespaces, mounts and loop devices need it"]
    lacks = [f"{program} is not installed (package {package})"
             for program, package in _PROGRAMS.items()
             if not shutil.which(program, path=_SEARCH)]
    if not Path("/dev/loop-control").exists():
        lacks.append("no /dev/loop-control: the kernel has no loop devices")
    if not lacks and not _can_unshare():
        lacks.append("unshare refused mount and pid namespaces")
    return lacks


@cache
def kernel_has(fs):
    """True when the kernel can mount `fs` ("ntfs" asks for FUSE)."""
    wanted = "fuseblk" if fs == "ntfs" else fs
    if wanted not in _kernel_filesystems() and shutil.which("modprobe", path=_SEARCH):
        module = "fuse" if fs == "ntfs" else fs
        subprocess.run(["modprobe", "-q", module], check=False, timeout=30)
    return wanted in _kernel_filesystems()


def _kernel_filesystems():
    return {line.split()[-1] for line in Path("/proc/filesystems").read_text().splitlines()}


def _can_unshare():
    done = subprocess.run(["unshare", "--mount", "--pid", "--fork", "--mount-proc", "true"],
                          capture_output=True, check=False, timeout=30)
    return done.returncode == 0
