"""Images of sticks and cards: sparse files with a partition table and real filesystems, made without loop devices."""

import os
import subprocess
from dataclasses import dataclass

MIB = 1 << 20


@dataclass
class Part:
    """One partition, or the one filesystem of a whole device. mkfs chooses its UUID."""
    fs: str
    size_mib: int
    label: str


MKFS = {
    "vfat": ["mkfs.vfat", "-F", "32", "-n"],
    "exfat": ["mkfs.exfat", "-L"],
    "ext2": ["mkfs.ext2", "-q", "-F", "-L"],
    "ext3": ["mkfs.ext3", "-q", "-F", "-L"],
    "ext4": ["mkfs.ext4", "-q", "-F", "-L"],
    "ntfs": ["mkfs.ntfs", "-q", "-F", "-Q", "-L"],
}


def make_sparse(path, size_mib):
    with open(path, "wb") as image:
        image.truncate(size_mib * MIB)


def copy_data(source, target, offset):
    """Copies what is not a hole, so that an image of gigabytes costs a few megabytes."""
    with open(source, "rb") as data, open(target, "r+b") as image:
        end = os.fstat(data.fileno()).st_size
        position = 0

        while position < end:
            try:
                begin = os.lseek(data.fileno(), position, os.SEEK_DATA)
            except OSError:
                return

            position = os.lseek(data.fileno(), begin, os.SEEK_HOLE)
            image.seek(offset + begin)
            data.seek(begin)
            left = position - begin

            while left > 0:
                chunk = data.read(min(left, MIB))
                image.write(chunk)
                left -= len(chunk)


def make_filesystem(path, part):
    make_sparse(path, part.size_mib)
    subprocess.run(MKFS[part.fs] + [part.label, str(path)], check=True, capture_output=True)


def table_script(table, parts):
    mbr = {"vfat": "c", "exfat": "7", "ntfs": "7"}
    gpt = dict.fromkeys(mbr, "EBD0A0A2-B9E5-4433-87C0-68B6B72699C7")
    kinds, linux = (gpt, "0FC63DAF-8483-4772-8E79-3D69D8477DE4") if table == "gpt" else (mbr, "83")
    lines = [f"label: {table}"]
    start = 1

    for part in parts:
        lines.append(f"start={start * 2048}, size={part.size_mib * 2048}, type={kinds.get(part.fs, linux)}")
        start += part.size_mib

    return "\n".join(lines) + "\n"


def make_disk(path, table, parts, size_mib=None):
    """An image with the partition table ("dos" or "gpt") and the parts one behind the other from 1 MiB on."""
    make_sparse(path, size_mib or sum(part.size_mib for part in parts) + 2)
    subprocess.run(["sfdisk", "-q", str(path)], input=table_script(table, parts), text=True, check=True,
                   stdout=subprocess.DEVNULL)
    start = 1

    for part in parts:
        single = f"{path}.part"
        make_filesystem(single, part)
        copy_data(single, path, start * MIB)
        os.unlink(single)
        start += part.size_mib

    return path


def make_whole(path, part):
    """An image whose filesystem begins at its first byte, without a partition table."""
    make_filesystem(path, part)
    return path


class DiskBox:
    """A folder of images that a test plugs in."""

    def __init__(self, folder):
        self.folder = folder
        self.made = []

    def disk(self, name, table, parts, size_mib=None):
        return self._keep(make_disk(self.folder / f"{name}.img", table, parts, size_mib))

    def whole(self, name, part):
        return self._keep(make_whole(self.folder / f"{name}.img", part))

    def close(self):
        for path in self.made:
            path.unlink()

    def _keep(self, path):
        self.made.append(path)
        return path
