"""Disks: sparse images in memory with real partition tables and filesystems.

An image is a memfd: it has no path, costs only the blocks that were written, and
is gone when the last loop device and descriptor on it are.
"""

import itertools
import json
import os
import re
import subprocess
from dataclasses import dataclass, field

from .loop import LoopDevice

MIB = 1 << 20
SECTOR = 512
TABLE_MIB = 2
EXTENDED_TYPES = {"5", "f", "85"}
TOOL_TIMEOUT = 120
# Each image has a name of its own, by which its loop devices are known.
_image_numbers = itertools.count()

# Few inodes and a lazy journal keep a fresh filesystem to some hundred kilobytes
# of memory; many worlds run side by side.
_EXT = ["-q", "-F", "-N", "2048", "-E", "lazy_itable_init=1,lazy_journal_init=1,nodiscard"]

_MKFS = {
    "ext2": (["mkfs.ext2", *_EXT], "-L"),
    "ext3": (["mkfs.ext3", *_EXT], "-L"),
    "ext4": (["mkfs.ext4", *_EXT], "-L"),
    "ntfs": (["mkntfs", "-q", "-Q", "-F"], "-L"),
    "vfat": (["mkfs.vfat", "-I"], "-n"),
    "exfat": (["mkfs.exfat"], "-L"),
    "swap": (["mkswap", "-q"], "-L"),
}


@dataclass
class Partition:
    """One partition as wished for; `number`, `start` and `sectors` come true
    when the disk is made.

    fs      a name of mkfs ("ext4", "ntfs", "vfat", "exfat", "swap" …) or None
    type    what sfdisk takes as type; "5" makes a DOS extended partition, and
            the partitions after it lie inside it
    name    the partition's own name, GPT only
    options further words for the mkfs command
    """

    fs: str | None = None
    size_mib: int = 1200
    label: str = ""
    type: str = ""
    name: str = ""
    options: tuple = ()
    number: int = 0
    start: int = 0
    sectors: int = 0

    @property
    def is_extended(self):
        return self.type in EXTENDED_TYPES

    @property
    def device_bytes(self):
        """Size of its block device: the kernel shows two sectors of a container."""
        return 2 * SECTOR if self.is_extended else self.sectors * SECTOR


@dataclass
class Disk:
    """One disk; plugged while `name` is set.

    `root_fs` is the filesystem on the whole device, or None for a disk with a
    partition table or a blank one.
    """

    image: int
    size_mib: int
    root_fs: str | None = None
    partitions: list = field(default_factory=list)
    sector_size: int = SECTOR
    name: str = ""
    port: str = ""
    loops: dict = field(default_factory=dict)

    @property
    def sectors(self):
        return self.size_mib * MIB // SECTOR

    def part_name(self, partition):
        """The kernel's name of a partition: sda1, but mmcblk0p1."""
        separator = "p" if self.name[-1].isdigit() else ""
        return f"{self.name}{separator}{partition.number}"

    def device_names(self):
        """The disk's name and its partitions', as the kernel announces them."""
        return [self.name, *(self.part_name(part) for part in self.partitions)]

    def attach(self):
        """Attach one loop for the whole and one for each partition."""
        self.loops[self.name] = LoopDevice(self.image, 0, self.size_mib * MIB)
        for part in self.partitions:
            self.loops[self.part_name(part)] = LoopDevice(
                self.image, part.start * SECTOR, part.device_bytes)

    def close(self):
        """Give the image back; attached loops keep it until they end."""
        if self.image >= 0:
            os.close(self.image)
            self.image = -1

    def read(self, offset, length):
        """Bytes of the image, around every filesystem."""
        return os.pread(self.image, length, offset)

    def write(self, offset, data):
        """Overwrite bytes of the image, around every filesystem."""
        os.pwrite(self.image, data, offset)


def blank_disk(size_mib, sector_size=SECTOR):
    """A disk of zeros: no table, no filesystem."""
    image = os.memfd_create(f"disk-{os.getpid()}-{next(_image_numbers)}")
    os.ftruncate(image, size_mib * MIB)
    return Disk(image, size_mib, sector_size=sector_size)


def whole_disk(fs, size_mib, label="", options=(), sector_size=SECTOR):
    """A disk with a filesystem on the whole device and no partition table."""
    disk = blank_disk(size_mib, sector_size)
    disk.root_fs = fs
    _make_fs(disk.image, 0, size_mib * MIB, fs, label, options)
    return disk


def partitioned_disk(partitions, table="gpt", size_mib=0, sector_size=SECTOR):
    """A disk with a real table ("gpt" or "dos") and filesystems in it."""
    needed = sum(part.size_mib + TABLE_MIB for part in partitions if not part.is_extended)
    disk = blank_disk(size_mib or needed + 2 * TABLE_MIB, sector_size)
    _write_table(disk.image, table, partitions)
    disk.partitions = partitions
    for part in partitions:
        if part.fs:
            _make_fs(disk.image, part.start * SECTOR, part.sectors * SECTOR,
                     part.fs, part.label, part.options)
    return disk


def _make_fs(image, offset, size, fs, label, options):
    command, label_option = _MKFS[fs]
    words = [*command, *options]
    if label:
        words += [label_option, label]
    if fs == "vfat" and "-i" not in options:
        words += ["-i", os.urandom(4).hex()]
    loop = LoopDevice(image, offset, size)
    try:
        _run([*words, loop.path])
    finally:
        loop.release()
    if fs == "ntfs":
        _renew_ntfs_serial(image, offset, size)


def _renew_ntfs_serial(image, offset, size):
    """Give a volume its own UUID, in the boot sector and in its copy at the end.

    mkntfs makes it from the time in seconds, so two volumes made in one second
    would be the same volume to the daemon.
    """
    serial = os.urandom(8)
    for sector in (offset, offset + size - SECTOR):
        if os.pread(image, 8, sector + 3) == b"NTFS    ":
            os.pwrite(image, serial, sector + 0x48)


def _write_table(image, table, partitions):
    """Write the table with sfdisk and read back where things came to lie."""
    path = f"/proc/self/fd/{image}"
    lines = [f"label: {table}", *(_sfdisk_line(part) for part in partitions)]
    _run(["sfdisk", "-q", "--no-tell-kernel", path], "\n".join(lines) + "\n", image)
    layout = json.loads(_run(["sfdisk", "-J", path], "", image))["partitiontable"]
    for part, entry in zip(partitions, layout["partitions"], strict=True):
        part.number = int(re.search(r"(\d+)$", entry["node"]).group(1))
        part.start = entry["start"]
        part.sectors = entry["size"]


def _sfdisk_line(part):
    fields = [] if part.is_extended else [f"size={part.size_mib}MiB"]
    if part.type:
        fields.append(f"type={part.type}")
    if part.name:
        fields.append(f'name="{part.name}"')
    return ", ".join(fields)


def _run(words, text="", *fds):
    done = subprocess.run(words, input=text, text=True, capture_output=True,
                          pass_fds=fds, timeout=TOOL_TIMEOUT, check=False)
    if done.returncode != 0:
        raise RuntimeError(f"{' '.join(words)}: {done.stderr.strip() or done.stdout.strip()}")
    return done.stdout
