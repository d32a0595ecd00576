"""The label script: the whole volume label as the first line of its output."""

import json

import pytest

from world import Partition, wait_for
from world.tools import LABEL_SCRIPT


@pytest.fixture
def label(router):
    """Function that asks the script for the label of a device."""
    def ask(name):
        return router.world.run(LABEL_SCRIPT, name, check=False).stdout
    return ask


@pytest.mark.parametrize("fs, text", [
    ("ext4", "My Disk"),
    ("ext4", "Größe 你好"),
    ("ext4", 'a "b" \\c'),
    ("ext2", "  two  "),
    ("vfat", "MY STICK"),
    ("ntfs", "Lesezeichen für später, mit – Strich"),
    ("exfat", "Été 2021"),
    ("ext4", "it's $(x) `y`"),
])
def test_a_label_comes_out_whole(router, label, fs, text):
    disk = router.world.whole_disk(fs, 64, label=text)
    router.world.plug(disk, "sda")
    assert label("sda") == text.rstrip() + "\n"


def test_a_volume_without_a_label_prints_nothing(router, label):
    disk = router.world.whole_disk("ext4", 64)
    router.world.plug(disk, "sda")
    assert label("sda") == ""


def test_a_partitions_own_name_is_not_its_label(router, label):
    disk = router.world.partitioned_disk(Partition(fs="ext4", size_mib=64, name="table name"),
                                         table="gpt")
    router.world.plug(disk, "sda")
    assert label("sda1") == ""


@pytest.mark.parametrize("line, text", [
    ('LABEL="My Disk" UUID="1234-ABCD" TYPE="vfat"', "My Disk"),
    ('UUID="1" LABEL="Größe 你好" TYPE="ext4"', "Größe 你好"),
    ('UUID="1" TYPE="ext4" LABEL="last"', "last"),
    ('PARTLABEL="no" LABEL_FATBOOT="no" UUID="1" LABEL="yes" TYPE="vfat"', "yes"),
    ('PARTLABEL="no" UUID="1" TYPE="vfat"', ""),
    ('LABEL_FATBOOT="no" UUID="1" TYPE="vfat"', ""),
    (r'LABEL="a \"b\" c\\d" UUID="1"', r'a "b" c\d'),
    ('LABEL="a "b" c" UUID="1"', 'a "b" c'),
    ('LABEL="" UUID="1"', ""),
    ('LABEL="a=b" UUID="1"', "a=b"),
])
def test_a_blkid_that_knows_no_options_is_understood(router, label, line, text):
    router.world.tools.stub("blkid", f"cat <<'END'\n/dev/sda: {line}\nEND\n")
    router.world.plug(router.world.blank_disk(8), "sda")
    assert label("sda") == (text + "\n" if text else "")


@pytest.mark.parametrize("name", ["", "sda;id", "../sda", "sda 1", "$(id)", "-h", "nosuch1"])
def test_a_name_that_is_no_device_is_refused_before_blkid_runs(router, name):
    router.world.tools.stub("blkid", "echo called >/tmp/called\n")
    done = router.world.run(LABEL_SCRIPT, name, check=False)
    assert done.returncode != 0
    assert done.stdout == ""
    assert not router.world.exists("/tmp/called")


def test_a_path_to_a_device_is_refused(router, label):
    router.world.plug(router.world.whole_disk("ext4", 64, label="STICK"), "sda")
    assert label("../dev/sda") == ""
    assert label("sda") == "STICK\n"


def test_the_real_daemon_publishes_the_whole_label(real_router):
    world = real_router.world
    disk = world.partitioned_disk(Partition(fs="ext4", label="My Größe"))
    world.plug(disk, "sda")
    real_router.start()
    wait_for(lambda: "sda1" in world.parts(), 60, "the published partition")
    assert "My Größe" in json.dumps(world.disk_json(), ensure_ascii=False)
