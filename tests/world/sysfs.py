"""The fake /sys/block of a world, laid out as the kernel does.

The entries live under the world's own /sys/devices; /sys/block/NAME,
/sys/class/block/NAME and /sys/dev/block/MAJ:MIN are relative links to them.
"""

import itertools
import os
import shutil
from pathlib import Path

_USB = "platform/1e1c0000.xhci/usb1"
_MMC = "platform/1e130000.mmc"
_host_numbers = itertools.count()


def device_path(name, port=""):
    """Where the kernel would put a disk, relative to /sys/devices.

    `port` replaces the controller and port part; by default an mmcblk sits on
    the MMC host and everything else on the USB host.
    """
    if name.startswith("mmcblk"):
        slot = name.removeprefix("mmcblk")
        return f"{port or _MMC}/mmc_host/mmc{slot}/mmc{slot}:0001/block/{name}"
    host = next(_host_numbers)
    where = port or f"{_USB}/1-{host + 1}/1-{host + 1}:1.0"
    return f"{where}/host{host}/target{host}:0:0/{host}:0:0:0/block/{name}"


class Sysfs:
    """Adds and removes block devices under one world's /sys."""

    def __init__(self, sys_dir):
        self._sys = Path(sys_dir)
        self._devices = {}

    def add_disk(self, name, sectors, devno, sector_size=512, port=""):
        """Add a whole disk of `sectors` units of 512 bytes."""
        directory = self._add_device(name, device_path(name, port), sectors, devno)
        _write_files(directory, {"removable": "1", "ext_range": "256"})
        for sub in ("queue", "slaves", "bdi"):
            (directory / sub).mkdir()
        _write_files(directory / "queue", {
            "hw_sector_size": sector_size, "logical_block_size": sector_size,
            "physical_block_size": sector_size, "rotational": "1"})
        (directory / "device").symlink_to("../..")
        (self._sys / "block" / name).symlink_to(self._link("..", name))

    def add_partition(self, disk, name, number, start, sectors, devno):
        """Add a partition directory under a disk added before."""
        place = f"{self._devices[disk][0]}/{name}"
        directory = self._add_device(name, place, sectors, devno)
        _write_files(directory, {"partition": number, "start": start})

    def add_other(self, name):
        """Add a device that is no disk to the daemon: loop0, mtdblock0, …"""
        self.add_disk(name, 2048, os.makedev(31, len(self._devices)),
                      port=f"virtual-{name}")

    def remove(self, name):
        """Remove a disk or a partition and all that leads to it."""
        place, devno = self._devices.pop(name)
        for link in (self._sys / "block" / name, self._sys / "class/block" / name,
                     self._dev_link(devno)):
            link.unlink(missing_ok=True)
        shutil.rmtree(self._sys / "devices" / place)

    def names(self):
        """All devices added and not removed."""
        return list(self._devices)

    def _add_device(self, name, place, sectors, devno):
        directory = self._sys / "devices" / place
        directory.mkdir(parents=True)
        numbers = f"{os.major(devno)}:{os.minor(devno)}"
        _write_files(directory, {
            "size": sectors, "dev": numbers, "ro": "0", "alignment_offset": "0",
            "uevent": f"MAJOR={os.major(devno)}\nMINOR={os.minor(devno)}\nDEVNAME={name}"})
        for sub in ("power", "holders"):
            (directory / sub).mkdir()
        self._devices[name] = (place, devno)
        (self._sys / "class/block" / name).symlink_to(self._link("../..", name))
        self._dev_link(devno).symlink_to(self._link("../..", name))
        return directory

    def _link(self, up, name):
        return f"{up}/devices/{self._devices[name][0]}"

    def _dev_link(self, devno):
        return self._sys / "dev/block" / f"{os.major(devno)}:{os.minor(devno)}"


def _write_files(directory, values):
    for name, value in values.items():
        (directory / name).write_text(f"{value}\n")
