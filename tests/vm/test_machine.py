"""The machine itself, without the daemon: that plugging is real and the kernel mounts what is plugged.

When these fail, the fault is the machine's and not the daemon's.
"""

from vm.disks import Part

MOUNTS = """
set -e
cd /tmp
mkdir vfat ext4 ntfs exfat
mount -t vfat -o rw,uid=1000,gid=1000,iocharset=utf8 /dev/sda1 vfat
mount -t ext4 -o rw,defaults /dev/sda2 ext4
mount.ntfs-3g -o noatime,big_writes,async,force /dev/sdb1 ntfs
mount -t exfat /dev/sdb2 exfat
for fs in *; do [ ! -d $fs ] || echo hello >$fs/note; done
mount
"""


def test_sticks_are_seen_mounted_and_pulled(bare_vm, box):
    first = box.disk("first", "dos", [Part("vfat", 1100, "STICK"), Part("ext4", 1200, "DATA")])
    second = box.disk("second", "gpt", [Part("ntfs", 1100, "WIN"), Part("exfat", 1300, "MEDIA")])

    bare_vm.plug_usb("first", first)
    bare_vm.wait("[ -b /dev/sda2 ]")
    bare_vm.plug_usb("second", second, driver="usb-uas")
    bare_vm.wait("[ -b /dev/sdb2 ]")

    assert "/usb" in bare_vm.check("readlink /sys/block/sda")
    mounts = bare_vm.check(MOUNTS)

    for line in ("/dev/sda1 on /tmp/vfat type vfat (rw,", "/dev/sda2 on /tmp/ext4 type ext4 (rw,",
                 "/dev/sdb1 on /tmp/ntfs type fuseblk (rw,", "/dev/sdb2 on /tmp/exfat type exfat (rw,"):
        assert line in mounts

    bare_vm.pull_usb("first")
    bare_vm.wait("[ ! -e /sys/block/sda ] && [ ! -e /dev/sda1 ]")
    assert "/tmp/vfat type vfat" in bare_vm.check("mount"), "the mount of a pulled stick stays until it is unmounted"


def test_a_card_in_the_slot_comes_and_goes(bare_vm, box):
    card = box.disk("card", "dos", [Part("vfat", 1900, "CARD")], size_mib=2048)

    assert bare_vm.run("[ -e /sys/block/mmcblk0 ]").status != 0
    bare_vm.insert_card(card)
    bare_vm.wait("[ -b /dev/mmcblk0p1 ]")
    assert "mmc_host" in bare_vm.check("readlink /sys/block/mmcblk0")

    bare_vm.eject_card()
    bare_vm.wait("[ ! -e /sys/block/mmcblk0 ]")


def test_events_name_the_disk_before_its_partitions_and_after_them(bare_vm, box):
    stick = box.disk("stick", "dos", [Part("vfat", 1100, "ONE"), Part("vfat", 1100, "TWO")])

    bare_vm.plug_usb("stick", stick)
    bare_vm.wait("grep -q '^add sda2$' /tmp/uevents")
    bare_vm.pull_usb("stick")
    bare_vm.wait("grep -q '^remove sda$' /tmp/uevents")

    assert bare_vm.check("cat /tmp/uevents").splitlines() == [
        "add sda", "add sda1", "add sda2", "remove sda1", "remove sda2", "remove sda"]
