"""What a desktop's udisks2 takes for one disk, where it is installed.

It runs in mounts of its own with a message bus of its own. udev is not started, since it would
serve the whole machine: its answer for the disk is there already, and is not part of the time.
"""

import os
import shutil
import subprocess
from pathlib import Path

from bench.tables import spread

from world import Partition
from world.disk import partitioned_disk

_DAEMON = "/usr/libexec/udisks2/udisksd"
_POLKIT = "/usr/lib/polkit-1/polkitd"
_NEEDED = ("udisksctl", "dbus-daemon")
_TIMEOUT = 120
# $1 device, $2 its numbers. All that it starts ends with the shell's process namespace. Without udev
# the command itself returns late: it waits for udev to notice. The mount table tells when it is done.
_SCRIPT = r"""
for place in /run /media /var/lib/udisks2; do mount -t tmpfs tmpfs "$place" || exit 1; done
mkdir -p /run/dbus /run/udev/data
printf 'I:1\nE:ID_FS_TYPE=ext4\nE:ID_FS_USAGE=filesystem\n' > "/run/udev/data/b$2"
touch /run/udev/control
dbus-daemon --system --fork
POLKIT --no-debug > /run/polkit.log 2>&1 &
DAEMON > /run/udisksd.log 2>&1 &
for try in $(seq 100); do
    timeout 5 udisksctl info -b "$1" 2>/dev/null | grep -q Filesystem: && break
    sleep 0.1
done
begun=$(date +%s%N)
udisksctl mount -b "$1" > /run/answer 2>&1 &
for try in $(seq 5000); do
    grep -q "^$1 " /proc/self/mounts && break
    sleep 0.001
done
ended=$(date +%s%N)
grep -q "^$1 " /proc/self/mounts || { cat /run/answer >&2; exit 1; }
echo $((ended - begun))
umount "$1"
""".replace("DAEMON", _DAEMON).replace("POLKIT", _POLKIT)


def _run():
    disk = partitioned_disk([Partition("ext4", 1050)])
    disk.name = "sda"
    disk.attach()
    try:
        loop = disk.loops["sda1"]
        numbers = f"{os.major(loop.devno)}:{os.minor(loop.devno)}"
        return subprocess.run(
            ["unshare", "--mount", "--pid", "--fork", "--kill-child=SIGKILL", "--mount-proc", "--propagation",
             "private", "bash", "-c", _SCRIPT, "bash", loop.path, numbers],
            capture_output=True, text=True, timeout=_TIMEOUT, check=False)
    finally:
        for loop in disk.loops.values():
            loop.release()
        disk.close()


def mount_times(rounds):
    """A sentence with the seconds of `udisksctl mount`, or why there are none."""
    if not Path(_DAEMON).exists() or not all(map(shutil.which, _NEEDED)):
        return "udisks2 is not installed here.\n"
    runs = [_run() for _ in range(rounds)]
    failed = [done for done in runs if done.returncode != 0]
    if failed:
        return f"udisks2 could not mount here: {failed[0].stderr.strip() or 'no answer'}\n"
    seconds = [int(done.stdout) / 1e9 for done in runs]
    return (f"`udisksctl mount` of one such disk until it is mounted: {spread(seconds)} s. "
            "udev's work and a desktop's decision to mount come before that and are not counted.\n")
