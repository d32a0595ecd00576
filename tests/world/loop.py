"""Loop devices by ioctl: attached without races, given back by the kernel.

Every loop is attached with autoclear, and this process keeps one descriptor of
it open.  The kernel detaches the loop when that descriptor and the last mount
are gone, so a crash of this process leaves nothing behind.
"""

import errno
import fcntl
import os
import stat
import struct
import time

LOOP_CTL_GET_FREE = 0x4C82
LOOP_CONFIGURE = 0x4C0A
LOOP_SET_STATUS64 = 0x4C04
LO_FLAGS_AUTOCLEAR = 4
LOOP_MAJOR = 7
ATTACH_TRIES = 200


def _loop_info(offset, size_limit):
    return struct.pack("=QQQQQIIII64s64s32sQQ", 0, 0, 0, offset, size_limit, 0, 0, 0,
                       LO_FLAGS_AUTOCLEAR, b"", b"", b"", 0, 0)


def _open_loop_node(number, flags):
    path = f"/dev/loop{number}"
    try:
        return os.open(path, flags | os.O_CLOEXEC)
    except FileNotFoundError:
        # A container's /dev is often a plain tmpfs, where nobody makes nodes.
        os.mknod(path, stat.S_IFBLK | 0o600, os.makedev(LOOP_MAJOR, number))
        return os.open(path, flags | os.O_CLOEXEC)


class LoopDevice:
    """One attached loop device over a part of an image.

    `devno` is what mknod needs to make a node of any name for it.
    """

    def __init__(self, image_fd, offset, size):
        self.number, self._fd = _attach(image_fd, offset, size)
        self._offset = offset
        self.path = f"/dev/loop{self.number}"
        self.devno = os.makedev(LOOP_MAJOR, self.number)
        self._backing = self._backing_file()

    def cut_off(self):
        """Make all further input and output fail, as on a device pulled out.

        What had been written before reaches the image; what a filesystem still
        holds in memory is lost, which is what happens to a real stick.
        """
        fcntl.ioctl(self._fd, LOOP_SET_STATUS64, _loop_info(self._offset, 512))

    def release(self):
        """Let go; the kernel detaches at once, or when the last mount is gone."""
        if self._fd >= 0:
            os.close(self._fd)
            self._fd = -1

    def is_attached(self):
        """True while the kernel still holds this image under this number.

        Another world may have been given the number meanwhile.
        """
        return bool(self._backing) and self._backing_file() == self._backing

    def _backing_file(self):
        try:
            with open(f"/sys/block/loop{self.number}/loop/backing_file") as stream:
                return stream.read()
        except OSError:
            return ""


def _attach(image_fd, offset, size):
    """Bind a free loop; returns (number, descriptor that keeps it)."""
    control = os.open("/dev/loop-control", os.O_RDWR | os.O_CLOEXEC)
    try:
        for _ in range(ATTACH_TRIES):
            number = fcntl.ioctl(control, LOOP_CTL_GET_FREE)
            fd = _try_attach(number, image_fd, offset, size)
            if fd is not None:
                return number, fd
            time.sleep(0.01)
    finally:
        os.close(control)
    raise OSError(errno.EBUSY, "no loop device could be had")


def _try_attach(number, image_fd, offset, size):
    """One attempt; None when another process took the same number first."""
    try:
        writer = _open_loop_node(number, os.O_RDWR)
    except OSError as error:
        if error.errno in (errno.ENXIO, errno.EBUSY, errno.ENOENT):
            return None
        raise
    try:
        config = struct.pack("=II", image_fd, 512) + _loop_info(offset, size) + bytes(64)
        fcntl.ioctl(writer, LOOP_CONFIGURE, config)
        # A descriptor open for writing would keep some kernels from mounting.
        return _open_loop_node(number, os.O_RDONLY)
    except OSError as error:
        if error.errno in (errno.EBUSY, errno.ENXIO):
            return None
        raise
    finally:
        os.close(writer)
