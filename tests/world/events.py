"""Messages to the daemon's pipes, written as a hotplug script writes them."""

import errno
import os

from .waiting import wait_for

PIPES = {
    "add_remove": "/tmp/tarn_nas/pipe_disk_add_remove",
    "safe_remove": "/tmp/tarn_nas/pipe_disk_safe_remove",
    "remove": "/tmp/tarn_nas/pipe_disk_remove",
}


def add_messages(disk):
    """The disk first, then its partitions: the order of the kernel's events."""
    return [f"#add:{name}" for name in disk.device_names()]


def remove_messages(disk):
    """Partitions first, the disk last: the order of the kernel's events."""
    return [f"#remove_dev:{name}" for name in reversed(disk.device_names())]


def write_pipe(path, data, timeout):
    """Write `data` (bytes) whole, waiting until somebody reads the pipe.

    Opened without blocking, so a missing reader is a timeout, never a hang.
    """
    fd = wait_for(lambda: _open_writer(path), timeout, f"a reader of {path}")
    try:
        written = os.write(fd, data)
    finally:
        os.close(fd)
    if written != len(data):
        raise OSError(errno.EAGAIN, f"{path}: {written} of {len(data)} bytes written")


def _open_writer(path):
    try:
        return os.open(path, os.O_WRONLY | os.O_NONBLOCK | os.O_CLOEXEC)
    except OSError as error:
        if error.errno in (errno.ENOENT, errno.ENXIO):
            return None
        raise
