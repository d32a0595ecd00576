"""A machine whose root file system lies on a USB disk, as many routers have it, with a user's stick beside it."""

from vm.daemon import STARTED, STOPPED, Daemon
from vm.disks import Part
from vm.vm import Vm

from world import PIPES


def mounts_of_own_disk(vm):
    """[(device, directory)] of all that is mounted from the disk with the root."""
    rows = (line.split()[:2] for line in vm.check("cat /proc/mounts").splitlines())
    return [tuple(row) for row in rows if row[0].startswith("/dev/sda")]


def test_the_disk_that_the_machine_runs_from_is_left_alone_and_a_stick_is_mounted(daemon_files, box):
    own = box.disk("own", "dos", [Part("ext4", 1100, "ROOT"), Part("ext4", 1300, "REST")])
    stick = box.disk("stick", "dos", [Part("vfat", 1200, "STICK")])

    with Vm(daemon_files, boot_disk=own) as vm:
        assert mounts_of_own_disk(vm) == [("/dev/sda1", "/")]
        daemon = Daemon(vm)
        daemon.start_companion()
        daemon.start()
        vm.plug_usb("stick", stick)
        daemon.wait_places({"STICK": "disk1_part1"})
        assert daemon.mounts() == {"disk1_part1": ("/dev/sdb1", "vfat")}
        vm.check(f"echo '#add:sda1' >{PIPES['add_remove']}")
        vm.wait("[ $(grep -c \"router's own disk, dev = sda$\" /tmp/daemon.log) -ge 3 ]")
        assert mounts_of_own_disk(vm) == [("/dev/sda1", "/")]

        vm.check(f"echo '#safe_remove' >{PIPES['safe_remove']}")
        daemon.wait_places({})
        vm.wait("[ $(grep -c start /tmp/services) -ge 4 ]")
        assert daemon.services() == STOPPED + STARTED
        assert mounts_of_own_disk(vm) == [("/dev/sda1", "/")]
        assert "umount /dev/sda" not in daemon.log()
        vm.check("echo kept >/note && sync && grep -q kept /note")
