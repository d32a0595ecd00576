"""The release daemon against a real kernel: sticks and cards that are plugged and pulled by hand, so to speak.

Disks are told apart by their labels: their device names depend on the order of plugging and on what is still mounted.
"""

from vm.daemon import SETTLE_LIMIT, STARTED, STOPPED
from vm.disks import Part

from world.state import DISK_DB, DISK_JSON, DISK_NUM, MOUNT_BASE, PID_FILE

OWNER = 1000


def file_in(place):
    return f"{MOUNT_BASE}/{place}/note"


def write_note(vm, place, text):
    vm.check(f"echo '{text}' >{file_in(place)} && sync")


def note(vm, place):
    return vm.check(f"cat {file_in(place)}").strip()


def test_without_disks_the_empty_document_is_published(daemon_vm, daemon):
    daemon.start()
    assert daemon_vm.wait(f"cat {DISK_JSON}") == '{"disk_number": 0, "disk": []}'


def test_a_stick_with_fat_and_ext4_is_mounted_and_published(daemon_vm, daemon, box):
    stick = box.disk("stick", "dos", [Part("vfat", 1200, "STICK"), Part("ext4", 1100, "DATA"), Part("vfat", 500, "TINY")])

    daemon.start()
    daemon_vm.plug_usb("stick", stick)
    daemon.wait_places({"STICK": "disk1_part1", "DATA": "disk1_part2"})

    assert daemon.mounts() == {"disk1_part1": ("/dev/sda1", "vfat"), "disk1_part2": ("/dev/sda2", "ext4")}

    status = daemon.status()
    assert status["disk_number"] == 1
    assert [(disk["part_num"], disk["sd_card"]) for disk in status["disk"]] == [(2, 0)]
    assert daemon_vm.check(f"cat {DISK_NUM}") == "1"

    for label, device, kind, size in (("STICK", "sda1", "FAT", 1200), ("DATA", "sda2", "EXT4", 1100)):
        part = daemon.parts()[label]
        uuid = daemon_vm.check(f"blkid -s UUID -o value /dev/{device}").strip()
        assert (part["dev_name"], part["fs_type"], part["uid"], part["total_len"]) == (device, kind, uuid, size)
        assert size * 0.8 < part["free_size"] <= size

    write_note(daemon_vm, "disk1_part1", "on the stick")
    owner = daemon_vm.check(f"stat -c '%u %g' {file_in('disk1_part1')}").split()
    assert owner == [str(OWNER), str(OWNER)]


def test_pulled_sticks_return_to_their_directories_in_any_order(daemon_vm, daemon, box):
    first = box.disk("first", "dos", [Part("vfat", 1200, "FIRST"), Part("ext4", 1100, "FIRSTDATA")])
    second = box.disk("second", "dos", [Part("ext4", 1500, "SECOND")])
    everything = {"FIRST": "disk1_part1", "FIRSTDATA": "disk1_part2", "SECOND": "disk2_part1"}

    daemon.start()
    daemon_vm.plug_usb("first", first)
    daemon.wait_places({"FIRST": "disk1_part1", "FIRSTDATA": "disk1_part2"})
    daemon_vm.plug_usb("second", second)
    daemon.wait_places(everything)

    for label, place in everything.items():
        write_note(daemon_vm, place, f"written to {label}")

    daemon.pull_usb("first")
    daemon.wait_places({"SECOND": "disk2_part1"})
    daemon.pull_usb("second")
    daemon.wait_places({})
    assert daemon.services()[:8] == STOPPED + STARTED

    daemon_vm.plug_usb("second", second)
    daemon.wait_places({"SECOND": "disk2_part1"})
    daemon_vm.plug_usb("first", first)
    daemon.wait_places(everything)

    for label, place in everything.items():
        assert note(daemon_vm, place) == f"written to {label}"

    assert daemon.mounts()["disk2_part1"][0] == "/dev/sda1", "the sticks did change their device names"
    assert "tarn_nas_diskmanager restart" not in daemon.services()


def test_sticks_plugged_all_at_once_are_all_mounted(daemon_vm, daemon, box):
    labels = ["ONE", "TWO", "THREE", "FOUR"]
    sticks = [box.disk(label, "dos", [Part("vfat", 1100, label), Part("vfat", 1050, label + "B")]) for label in labels]

    daemon.start()

    for label, stick in zip(labels, sticks):
        daemon_vm.plug_usb(label, stick)

    def all_mounted():
        return len(daemon.parts()) == 8 and len(daemon.mounts()) == 8

    daemon.wait_until(all_mounted)
    places = daemon.places()
    assert set(places.values()) == {f"disk{disk}_part{part}" for disk in range(1, 5) for part in range(1, 3)}

    for label in labels:
        assert places[label + "B"] == places[label].replace("part1", "part2")


def test_a_stick_swapped_for_another_at_once_is_not_taken_for_it(daemon_vm, daemon, box):
    old = box.disk("old", "dos", [Part("vfat", 1200, "OLD")])
    new = box.disk("new", "dos", [Part("vfat", 1100, "NEW")])

    daemon.start()
    daemon_vm.plug_usb("old", old)
    daemon.wait_places({"OLD": "disk1_part1"})
    write_note(daemon_vm, "disk1_part1", "old")

    daemon.pull_usb("old")
    daemon_vm.plug_usb("new", new)
    daemon.wait_until(lambda: set(daemon.places()) == {"NEW"} and len(daemon.mounts()) == 1)
    place = daemon.places()["NEW"]
    write_note(daemon_vm, place, "new")

    daemon_vm.plug_usb("old", old)
    daemon.wait_until(lambda: set(daemon.places()) == {"OLD", "NEW"} and len(daemon.mounts()) == 2)
    assert note(daemon_vm, daemon.places()["OLD"]) == "old"
    assert note(daemon_vm, place) == "new"


def test_a_stick_pulled_and_plugged_at_once_returns_with_its_file(daemon_vm, daemon, box):
    stick = box.disk("stick", "dos", [Part("ext4", 1100, "STICK")])

    daemon.start()
    daemon_vm.plug_usb("stick", stick)
    daemon.wait_places({"STICK": "disk1_part1"})
    write_note(daemon_vm, "disk1_part1", "still here")
    before = daemon.services()

    daemon.pull_usb("stick")
    daemon_vm.plug_usb("stick", stick)
    daemon.wait_until(lambda: daemon.services() != before)
    daemon.wait_places({"STICK": "disk1_part1"})

    assert note(daemon_vm, "disk1_part1") == "still here"


def test_ntfs_and_exfat_of_a_gpt_disk_are_mounted(daemon_vm, daemon, box):
    disk = box.disk("disk", "gpt", [Part("ntfs", 1300, "My Files"), Part("exfat", 1200, "MEDIA")])

    daemon.start()
    daemon_vm.plug_usb("disk", disk, driver="usb-uas")
    daemon.wait_places({"My Files": "disk1_part1", "MEDIA": "disk1_part2"})

    assert daemon.mounts() == {"disk1_part1": ("/dev/sda1", "fuseblk"), "disk1_part2": ("/dev/sda2", "exfat")}
    assert {label: part["fs_type"] for label, part in daemon.parts().items()} == {"My Files": "NTFS", "MEDIA": "EXFAT"}

    write_note(daemon_vm, "disk1_part1", "on NTFS")
    daemon.pull_usb("disk")
    daemon.wait_places({})
    assert daemon_vm.run("pidof mount.ntfs-3g").status != 0

    daemon_vm.plug_usb("disk", disk)
    daemon.wait_places({"My Files": "disk1_part1", "MEDIA": "disk1_part2"})
    assert note(daemon_vm, "disk1_part1") == "on NTFS"


def test_a_filesystem_on_the_whole_device_is_part_one_of_its_disk(daemon_vm, daemon, box):
    stick = box.whole("stick", Part("exfat", 1500, "WHOLE"))

    daemon.start()
    daemon_vm.plug_usb("stick", stick)
    daemon.wait_places({"sda": "disk1_part1"})

    assert daemon.mounts() == {"disk1_part1": ("/dev/sda", "exfat")}
    assert daemon.parts()["sda"]["fs_type"] == "EXFAT"
    write_note(daemon_vm, "disk1_part1", "whole")

    # Only a rescan forgets such a disk once it is pulled, and only one that an earlier rescan has listed.
    daemon.pull_usb("stick")
    daemon.wait_places({})
    daemon_vm.plug_usb("stick", stick)
    daemon.wait_places({"sda": "disk1_part1"})
    assert note(daemon_vm, "disk1_part1") == "whole"


def test_a_card_in_the_slot_is_reported_as_sd_card(daemon_vm, daemon, box):
    card = box.disk("card", "dos", [Part("vfat", 1900, "CARD")], size_mib=2048)
    stick = box.disk("stick", "dos", [Part("vfat", 1100, "STICK")])

    daemon.start()
    daemon_vm.insert_card(card)
    daemon.wait_places({"CARD": "disk1_part1"})
    daemon_vm.plug_usb("stick", stick)
    daemon.wait_places({"CARD": "disk1_part1", "STICK": "disk2_part1"})

    assert daemon.mounts()["disk1_part1"] == ("/dev/mmcblk0p1", "vfat")
    flags = {disk["part"][0]["label"]: disk["sd_card"] for disk in daemon.status()["disk"]}
    assert flags == {"CARD": 1, "STICK": 0}

    write_note(daemon_vm, "disk1_part1", "on the card")
    daemon.eject_card()
    daemon.wait_places({"STICK": "disk2_part1"})
    daemon_vm.insert_card(card)
    daemon.wait_places({"CARD": "disk1_part1", "STICK": "disk2_part1"})
    assert note(daemon_vm, "disk1_part1") == "on the card"


def test_a_usb_card_reader_in_the_slot_is_reported_as_sd_card(daemon_vm, daemon, box):
    reader = box.disk("reader", "dos", [Part("vfat", 1200, "READER")])
    stick = box.disk("stick", "dos", [Part("vfat", 1100, "STICK")])

    daemon_vm.plug_usb("reader", reader)
    daemon_vm.wait("[ -e /sys/block/sda/sda1 ]")
    daemon_vm.plug_usb("stick", stick)
    daemon_vm.wait("[ -e /sys/block/sdb/sdb1 ]")

    # The link reads ".../usb2/2-1/2-1:1.0/host0/...": the slot's text is the USB interface of its reader.
    interface = daemon_vm.check("readlink /sys/block/sda").split("/")[-6]
    daemon_vm.check(f"mkdir -p /etc/tarn_utils && echo {interface} >/etc/tarn_utils/sdcard_point")

    daemon.start()
    daemon.wait_places({"READER": "disk1_part1", "STICK": "disk2_part1"})
    flags = {disk["part"][0]["label"]: disk["sd_card"] for disk in daemon.status()["disk"]}
    assert flags == {"READER": 1, "STICK": 0}


def test_a_restart_keeps_the_directories(daemon_vm, daemon, box):
    small = box.disk("small", "dos", [Part("vfat", 1100, "SMALL")])
    large = box.disk("large", "dos", [Part("ext4", 1500, "LARGE")])
    places = {"SMALL": "disk1_part1", "LARGE": "disk2_part1"}

    daemon.start()
    daemon_vm.plug_usb("small", small)
    daemon.wait_places({"SMALL": "disk1_part1"})
    daemon_vm.plug_usb("large", large)
    daemon.wait_places(places)
    write_note(daemon_vm, "disk2_part1", "large")

    assert daemon.stop() == 0
    assert daemon_vm.run(f"[ -e {PID_FILE} ]").status != 0
    assert set(daemon.mounts()) == set(places.values()), "the mounts outlive the daemon"

    # A fresh start numbers the larger disk first; what is remembered wins.
    daemon_vm.check(f"rm {DISK_JSON}")
    daemon.start()
    daemon.wait_places(places)
    assert note(daemon_vm, "disk2_part1") == "large"


def test_one_interrupt_is_only_noted(daemon_vm, daemon, box):
    stick = box.disk("stick", "dos", [Part("vfat", 1100, "STICK")])

    daemon.start()
    daemon.interrupt()
    daemon_vm.wait("grep -q 'get sig = SIGINT, c = 0' /tmp/daemon.log")
    daemon_vm.plug_usb("stick", stick)
    daemon.wait_places({"STICK": "disk1_part1"})

    daemon.interrupt()
    assert int(daemon_vm.wait("cat /tmp/daemon.status", SETTLE_LIMIT)) == 0


def test_after_a_safe_removal_a_stick_plugged_again_returns(daemon_vm, daemon, box):
    stick = box.disk("stick", "dos", [Part("vfat", 1200, "STICK"), Part("ext4", 1100, "DATA")])
    places = {"STICK": "disk1_part1", "DATA": "disk1_part2"}

    daemon.start()
    daemon_vm.plug_usb("stick", stick)
    daemon.wait_places(places)
    write_note(daemon_vm, "disk1_part1", "kept")

    daemon.send("#safe_remove")
    daemon.wait_places({})
    assert daemon_vm.run("[ -b /dev/sda1 ]").status == 0, "the stick is still plugged"

    daemon.pull_usb("stick")
    daemon_vm.plug_usb("stick", stick)
    daemon.wait_places(places)
    assert note(daemon_vm, "disk1_part1") == "kept"


def test_a_pulled_stick_that_is_kept_busy_restarts_the_daemon_with_a_fresh_database(daemon_vm, daemon, box):
    stick = box.disk("stick", "dos", [Part("ext4", 1100, "STICK")])

    daemon.start()
    daemon_vm.plug_usb("stick", stick)
    daemon.wait_places({"STICK": "disk1_part1"})
    holder = daemon_vm.check(f"cd {MOUNT_BASE}/disk1_part1; sleep 600 >/dev/null 2>&1 & echo $!").strip()

    daemon.pull_usb("stick")
    daemon_vm.wait("grep -q 'tarn_nas_diskmanager restart' /tmp/services", SETTLE_LIMIT)
    daemon_vm.wait(f"pidof tarn_nas_diskmanager && [ -s {PID_FILE} ]")
    assert daemon_vm.run(f"[ -e {DISK_DB} ]").status != 0

    # The old mount keeps its disk number until it goes.
    daemon_vm.plug_usb("stick", stick)
    daemon.wait_until(lambda: daemon.places().get("STICK") == "disk2_part1")
    daemon_vm.check(f"kill {holder}")


def test_ext3_is_mounted_as_ext2_unless_its_journal_holds_something(daemon_vm, daemon, box):
    disk = box.disk("disk", "dos", [Part("ext2", 1200, "SECOND"), Part("ext3", 1100, "THIRD")])
    places = {"SECOND": "disk1_part1", "THIRD": "disk1_part2"}

    # blkid names "ext2" as a second type of a clean ext3 volume before its own, and the first one counts.
    daemon.start()
    daemon_vm.plug_usb("disk", disk)
    daemon.wait_places(places)
    assert daemon.mounts() == {"disk1_part1": ("/dev/sda1", "ext2"), "disk1_part2": ("/dev/sda2", "ext2")}
    write_note(daemon_vm, "disk1_part2", "third")

    daemon.pull_usb("disk")
    daemon.wait_places({})
    daemon_vm.plug_usb("disk", disk)
    daemon.wait_places(places)
    assert daemon.mounts() == {"disk1_part1": ("/dev/sda1", "ext2"), "disk1_part2": ("/dev/sda2", "ext3")}
    assert note(daemon_vm, "disk1_part2") == "third"
