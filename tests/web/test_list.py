"""What "list" tells of disks that are laid out for it: a status file, a mount list, a /sys/block."""

import json
import os
import time
from subprocess import DEVNULL, PIPE

import pytest
from shared.own_disk import run_from
from web.exchange import words
from web.router import PLUGIN

SECTORS = 2048
LABELS = ['<script>alert("x")</script>', "O'Brien \"the\\ disk\"", "Größe 容量", "$(id) `id` ${HOME} %s",
          "a\tb\u0001c", "x" * 127, "'; reboot; '", "&amp; <b>"]


def part(dev_name, disk_name, fs_type="EXT4", label="", total=1200, free=1000):
    return {"dev_name": dev_name, "disk_name": disk_name, "fs_type": fs_type, "uid": "1234-ABCD",
            "label": label or dev_name, "total_len": total, "free_size": free}


def publish(world, *disks, sd_card=0):
    """Write the status file; each disk is a list of partitions."""
    document = {"disk_number": len(disks), "disk": [
        {"part_num": len(parts), "sd_card": sd_card, "part": parts} for parts in disks]}
    world.write("/tmp/tarn_nas/disk.json", json.dumps(document, ensure_ascii=False, indent=1))


def add_disk(world, name, mib, parts=(), devno=None, **options):
    """A disk of the kernel's with partitions of so many MiB each."""
    numbers = len(world.sysfs.names()) + 1
    world.sysfs.add_disk(name, mib * SECTORS, devno or os.makedev(8, numbers), **options)
    separator = "p" if name[-1].isdigit() else ""
    for number, size in enumerate(parts, 1):
        world.sysfs.add_partition(name, f"{name}{separator}{number}", number, 2048, int(size * SECTORS),
                                  os.makedev(259, 32 * numbers + number))


def mount(world, device, directory):
    world.sh(f"mkdir -p {directory} && mount -t tmpfs /dev/{device} {directory}")


def test_a_router_without_disks_and_daemon(plugin):
    assert plugin.list() == {"running": False, "published": False, "disk": [], "unused": []}


def test_fields_of_the_status_file_come_with_the_kernels_word_on_mounts(world, plugin, listener):
    add_disk(world, "sda", 4000, [1200, 1200])
    publish(world, [part("sda1", "disk1_part1", label="DATA"), part("sda2", "disk1_part2", free=17)])
    mount(world, "sda1", "/tmp/mountd/disk1_part1")
    assert plugin.list() == {
        "running": True, "published": True, "unused": [], "disk": [
            {"dev_name": "sda", "sd_card": False, "part": [
                {**part("sda1", "disk1_part1", label="DATA"), "mounted": True},
                {**part("sda2", "disk1_part2", free=0), "mounted": False, "reason": "not_mounted"}]}]}


def test_a_mount_counts_on_its_own_directory_and_device_alone(world, plugin, listener):
    add_disk(world, "sda", 4000, [1200, 1200, 1200])
    add_disk(world, "sdaa", 2000, [1200])
    publish(world, [part("sda1", "disk1_part1"), part("sda2", "disk1_part2"), part("sda3", "disk1_part3")])
    mount(world, "sda1", "/tmp/mountd/disk1_part11")
    mount(world, "sda2", "/mnt/elsewhere")
    mount(world, "sdaa1", "/tmp/mountd/disk1_part3")
    reasons = {name: entry.get("reason") for name, entry in plugin.parts().items()}
    assert reasons == {"sda1": "elsewhere", "sda2": "elsewhere", "sda3": "not_mounted"}


def test_the_sd_card_has_its_flag_and_its_disk_name(world, plugin):
    add_disk(world, "mmcblk0", 2000, [1200])
    publish(world, [part("mmcblk0p1", "disk1_part1", "FAT")], sd_card=1)
    disk, = plugin.list()["disk"]
    assert (disk["dev_name"], disk["sd_card"]) == ("mmcblk0", True)


@pytest.mark.parametrize("fs_type, reason", [
    ("ERR FS", "no_filesystem"), ("MBR", "type"), ("EFI", "type"), ("EXTENDED", "type"), ("NTFS", "not_mounted")])
def test_a_listed_partition_that_is_not_mounted_has_its_reason(world, plugin, listener, fs_type, reason):
    add_disk(world, "sda", 4000, [1200])
    publish(world, [part("sda1", "disk1_part1", fs_type)])
    assert plugin.parts()["sda1"]["reason"] == reason


def test_a_listed_partition_that_the_kernel_has_no_more_is_gone(world, plugin, listener):
    publish(world, [part("sda1", "disk1_part1")])
    assert plugin.parts()["sda1"]["reason"] == "gone"


def test_without_a_daemon_it_is_the_reason(world, plugin):
    add_disk(world, "sda", 4000, [1200, 1200])
    publish(world, [part("sda1", "disk1_part1")])
    assert plugin.parts()["sda1"]["reason"] == "not_running"
    assert plugin.unused() == {"sda2": "not_running"}


def test_what_the_daemon_does_not_use_has_its_reason(world, plugin, listener):
    add_disk(world, "sda", 9000, [1200, 999.5, 1000, 0.0009765625])
    add_disk(world, "sdb", 900)
    add_disk(world, "sdc", 0)
    add_disk(world, "nvme0n1", 9000, [1200])
    add_disk(world, "sdd", 4000, [1200])
    add_disk(world, "sde", 4000, [1200])
    add_disk(world, "mmcblk1", 4000, [500, 1200], devno=os.stat(world.root).st_dev)
    add_disk(world, "mmcblk1boot0", 4)
    mount(world, "sdd1", "/mnt/by-hand")
    mount(world, "sde1", "/tmp/mountd/disk9_part1")
    publish(world, [part("sda1", "disk1_part1")])
    assert plugin.unused() == {"sda2": "small", "sda3": "removed", "sdb": "no_filesystem",
                               "nvme0n1": "name", "sdd1": "elsewhere", "sde1": "busy", "mmcblk1": "system"}


@pytest.mark.parametrize("directory", ["/", "/rom", "/overlay", "/boot"])
def test_a_disk_with_a_part_of_the_router_on_a_partition_is_its_own(world, plugin, listener, directory):
    run_from(world, "-t", "tmpfs", "router")
    add_disk(world, "sda", 4000, [1200])
    world.sh("mkdir /run/beside && mount -t tmpfs beside /run/beside")
    if directory != "/":
        world.run("mount", "-t", "tmpfs", "own", directory)
    add_disk(world, "mmcblk0", 4000, [500])
    for disk, name, place in (("mmcblk0", "mmcblk0p2", directory), ("sda", "sda2", "/run/beside")):
        world.sysfs.add_partition(disk, name, 2, 2048, 1200 * SECTORS, os.stat(world.path(place)).st_dev)
    assert plugin.unused() == {"sda1": "removed", "sda2": "removed", "mmcblk0": "system"}


def test_sizes_of_what_is_not_used_are_the_kernels(world, plugin, listener):
    add_disk(world, "sda", 9000, [500])
    assert plugin.list()["unused"] == [{"dev_name": "sda1", "disk": "sda", "total_len": 500, "reason": "small"}]


def test_a_ninth_partition_and_a_seventeenth_disk_find_the_table_full(world, plugin, listener):
    add_disk(world, "sda", 90000, [1200] * 9)
    letters = "bcdefghijklmnop"
    for letter in letters:
        add_disk(world, f"sd{letter}", 2000, [1200])
    add_disk(world, "sdz", 2000, [1200])
    add_disk(world, "sdy", 2000)
    publish(world, [part(f"sda{number}", f"disk1_part{number}") for number in range(1, 9)],
            *([part(f"sd{letter}1", f"disk{letter}_part1")] for letter in letters))
    assert plugin.unused() == {"sda9": "full", "sdy": "full", "sdz1": "full"}


def test_sizes_are_right_on_a_disk_with_larger_sectors_and_smallness_is_the_daemons(world, plugin, listener):
    add_disk(world, "sda", 9000, [1200, 125, 124], sector_size=4096)
    publish(world, [part("sda1", "disk1_part1", total=9600), part("sda2", "disk1_part2", total=1000)])
    parts = plugin.parts()
    assert [parts[name]["total_len"] for name in ("sda1", "sda2")] == [1200, 125]
    assert plugin.unused() == {"sda3": "small"}


@pytest.mark.parametrize("label", LABELS)
def test_a_label_comes_through_as_it_is(world, plugin, label):
    publish(world, [part("sda1", "disk1_part1", label=label)])
    assert plugin.parts()["sda1"]["label"] == label


def test_bytes_that_are_no_text_come_through_as_they_are(world, plugin):
    publish(world, [part("sda1", "disk1_part1", label="LABEL")])
    path = world.path("/tmp/tarn_nas/disk.json")
    path.write_bytes(path.read_bytes().replace(b"LABEL", b"\xff\xfe\xe4"))
    done = world.popen(PLUGIN, "call", "list", stdin=DEVNULL, stdout=PIPE)
    answer = done.communicate(timeout=20)[0]
    assert b'"label":"\xff\xfe\xe4"' in answer
    assert json.loads(answer.decode(errors="replace"))["disk"][0]["part"][0]["label"] == "���"


@pytest.mark.parametrize("text", ["", "{", '{"disk_number": 1, "disk": [{"part_num": 1, "sd_', "[]", "null", "x"])
def test_half_a_document_is_none(world, plugin, text):
    add_disk(world, "sda", 4000, [1200])
    world.write("/tmp/tarn_nas/disk.json", text)
    began = time.monotonic()
    answer = plugin.list()
    assert time.monotonic() - began < 5
    assert (answer["published"], answer["disk"]) == (False, [])
    assert [entry["dev_name"] for entry in answer["unused"]] == ["sda1"]


def test_a_document_that_is_being_replaced_is_read_again(world, plugin):
    world.write("/tmp/tarn_nas/disk.json", "{")
    call = world.popen(PLUGIN, "call", "list", stdin=DEVNULL, stdout=PIPE)
    time.sleep(0.15)
    publish(world, [part("sda1", "disk1_part1")])
    answer = json.loads(call.communicate(timeout=20)[0])
    assert answer["published"] and answer["disk"][0]["dev_name"] == "sda"


def test_a_document_without_memory_for_a_disk_is_read(world, plugin):
    world.write("/tmp/tarn_nas/disk.json", '{"disk_number": 2, "disk": [{}, {"part_num": 0, "sd_card": 0, "part": []}]}')
    assert plugin.list()["disk"] == []


def test_each_reason_of_the_schema_is_met_here():
    met = {"not_mounted", "elsewhere", "no_filesystem", "type", "gone", "not_running",
           "small", "removed", "busy", "full", "name", "system"}
    assert met == {*words("part"), *words("unused")}
