"""A private world for the daemon: namespaces, loop disks and a fake /sys/block.

    with World() as world:
        stick = world.whole_disk("ext4", 1200, label="STICK")
        daemon = world.start_daemon()
        world.plug(stick, "sda")
        world.announce(stick)
        daemon.wait_log("mount OK, /dev/sda ==> ")

A world owns everything it makes.  When its process ends, however it ends, the
kernel takes the namespaces, the mounts and the loop devices back.
"""

from .built import CHECKOUT
from .daemon import Daemon, DaemonGone
from .disk import Disk, Partition
from .events import PIPES, add_messages, remove_messages
from .need import kernel_has, missing
from .state import Mount, StatusPart
from .waiting import WaitTimeout, wait_for
from .world import World

__all__ = [
    "CHECKOUT", "Daemon", "DaemonGone", "Disk", "Mount", "PIPES", "Partition",
    "StatusPart", "WaitTimeout", "World", "add_messages", "kernel_has",
    "missing", "remove_messages", "wait_for",
]
