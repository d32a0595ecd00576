"""A damaged or locked database, and rows that the daemon would not have written."""

import subprocess
import sys

import pytest
from shared.moments import quiet_moment

from world import Partition
from world.state import DISK_DB

CONFIG_DIR = "/etc/config/tarn_nas"
TABLE = ("CREATE TABLE disk (uid TEXT,dev_name TEXT,disk_name TEXT,mount_path TEXT,"
         "mountd TEXT)")
INSERT = "insert into disk values(?,?,?,?,?)"

# Holds the database as another program would that writes to it and does not finish.
LOCKER = f"""
import sqlite3, sys
database = sqlite3.connect({DISK_DB!r}, isolation_level=None)
database.execute("begin exclusive")
print("locked", flush=True)
sys.stdin.read()
database.execute("rollback")
"""


def uid_of(world, device):
    return world.run("blkid", "-s", "UUID", "-o", "value", device).stdout.strip()


def remember(world, uid, disk_name, dev_name="sdz", mountd="no"):
    """Write a row as the daemon would have."""
    world.db_execute(INSERT, (uid, dev_name, disk_name, f"/tmp/mountd/{disk_name}", mountd))


def garbage(world):
    world.path(DISK_DB).write_bytes(bytes(range(256)) * 32)
    return "sqlite err = file is not a database"


def truncated(world):
    world.db_execute(TABLE)
    for number in range(200):
        remember(world, f"uid-{number}", f"disk{number}_part1")
    whole = world.path(DISK_DB).read_bytes()
    world.path(DISK_DB).write_bytes(whole[:len(whole) // 2 + 100])
    return "sqlite err = database disk image is malformed"


def directory(world):
    world.path(DISK_DB).mkdir()
    return "open err, db = /etc/config/tarn_nas/disk.db"


def binary_rows(world):
    """A table of the right name with too few columns."""
    world.db_execute("CREATE TABLE disk (uid TEXT)")
    return "ERROR[db_sqlite.cpp:"


@pytest.mark.needs_fs("ext4")
@pytest.mark.parametrize("damage", [garbage, truncated, directory, binary_rows])
def test_a_damaged_database_stops_no_mount_and_no_removal(world, start_daemon, damage):
    world.path(CONFIG_DIR).mkdir(parents=True)
    message = damage(world)
    cold, hot = world.whole_disk("ext4"), world.partitioned_disk(Partition("ext4", 1100))
    world.plug(cold, "sda")
    daemon = start_daemon()
    daemon.wait_log(message)
    world.hotplug(hot, "sdb")
    world.wait(lambda: set(world.parts()) == {"sda", "sdb1"}, 40, "both disks in disk.json")
    assert world.mounted() == {"/dev/sda": "/tmp/mountd/disk1_part1",
                               "/dev/sdb1": "/tmp/mountd/disk2_part1"}
    daemon.wait_rescan()
    quiet_moment(world, daemon)
    world.hotunplug(hot)
    world.wait(lambda: set(world.parts()) == {"sda"}, 30, "sdb1 gone from disk.json")
    assert world.mounted() == {"/dev/sda": "/tmp/mountd/disk1_part1"}

    # Once the bad file is gone, the next mount is remembered.
    world.sh(f"rm -rf {DISK_DB}")
    world.hotplug(hot, "sdb")
    world.wait(lambda: [row["dev_name"] for row in world.db_rows()] == ["sdb1"], 30,
               "a fresh database")
    assert daemon.running


@pytest.mark.needs_fs("ext4")
def test_a_damaged_database_is_left_as_it_is(world, start_daemon):
    world.path(CONFIG_DIR).mkdir(parents=True)
    garbage(world)
    before = world.path(DISK_DB).read_bytes()
    world.plug(world.whole_disk("ext4"), "sda")
    daemon = start_daemon()
    daemon.wait_log("mount OK, /dev/sda")
    daemon.wait_rescan()
    assert world.path(DISK_DB).read_bytes() == before


@pytest.mark.needs_fs("ext4")
def test_a_missing_directory_is_made_again_by_the_next_mount(world, daemon):
    world.path(CONFIG_DIR).rmdir()
    world.hotplug(world.whole_disk("ext4"), "sda")
    daemon.wait_log("mount OK, /dev/sda")
    assert [(row["dev_name"], row["mountd"]) for row in world.db_rows()] == [("sda", "yes")]


@pytest.mark.needs_fs("ext4")
def test_a_locked_database_stops_no_mount_and_is_used_again_once_it_is_free(world, start_daemon):
    disk, late = world.whole_disk("ext4"), world.partitioned_disk(Partition("ext4", 1100))
    world.plug(disk, "sda")
    world.db_execute(TABLE)
    remember(world, uid_of(world, "/dev/sda"), "disk7_part2")
    before = world.db_rows()
    locker = world.popen(sys.executable, "-c", LOCKER, stdin=subprocess.PIPE,
                         stdout=subprocess.PIPE)
    assert locker.stdout.readline() == b"locked\n"
    daemon = start_daemon()
    world.wait(lambda: "sda" in world.parts(), 30, "sda in disk.json")

    assert "sqlite err = database is locked" in daemon.log()
    assert "err code = 5" in daemon.log()
    assert world.mounted() == {"/dev/sda": "/tmp/mountd/disk1_part1"}
    locker.communicate(timeout=10)
    assert world.db_rows() == before

    world.hotplug(late, "sdb")
    world.wait(lambda: len(world.db_rows()) == 2, 30, "the late disk's row")
    daemon.wait_rescan()
    # A directory that was only proposed while the memory could not be asked is not remembered.
    world.send("#remove_dev:sda", "#add:sda")
    daemon.wait_log("mount OK, /dev/sda ==> /tmp/mountd/disk7_part2")
    assert world.db_rows()[0]["mountd"] == "yes"


@pytest.mark.needs_fs("ext4")
def test_a_uid_in_two_rows_uses_the_first_and_changes_neither(world, start_daemon):
    world.plug(world.whole_disk("ext4"), "sda")
    uid = uid_of(world, "/dev/sda")
    world.db_execute(TABLE)
    remember(world, uid, "disk5_part5")
    remember(world, uid, "disk6_part6")
    before = world.db_rows()
    daemon = start_daemon()
    daemon.wait_log("mount OK, /dev/sda ==> /tmp/mountd/disk5_part5")
    assert "uid not exist" in daemon.log()
    assert world.db_rows() == before

    world.wait(lambda: "sda" in world.parts(), 30, "sda in disk.json")
    assert world.parts()["sda"].disk_name == "disk5_part5"
    world.safe_remove()
    world.wait(lambda: world.mounted() == {}, 30, "the unmount")
    assert world.db_rows() == before


@pytest.mark.needs_fs("ext4")
@pytest.mark.parametrize("uid", ["it's", "x');drop/**/table/**/disk;--", "%s%n''"])
def test_quotes_in_a_uid_harm_nothing_and_the_directory_is_remembered(world, start_daemon, uid):
    world.plug(world.whole_disk("ext4"), "sda")
    world.db_execute(TABLE)
    remember(world, "another", "disk9_part9")
    world.write("/run/world/uid", uid)
    world.tools.stub("blkid", 'read -r uid < /run/world/uid\n'
                     'case "$*" in *sda) printf \'%s\\n\' "/dev/sda: UUID=\\"$uid\\" '
                     'TYPE=\\"ext4\\"" ;; esac\n')
    daemon = start_daemon()
    daemon.wait_log("mount OK, /dev/sda ==> /tmp/mountd/disk1_part1")
    rows = world.db_rows()
    assert [row["uid"] for row in rows] == ["another", uid]
    assert (rows[1]["disk_name"], rows[1]["mountd"]) == ("disk1_part1", "yes")
    assert f"insert into disk values('{uid}','sda','disk1_part1'," in daemon.log()

    world.safe_remove()
    world.wait(lambda: world.mounted() == {}, 30, "the unmount")
    world.wait(lambda: world.db_rows()[1]["mountd"] == "no", 30, "the note of the unmount")
    assert len(world.db_rows()) == 2


@pytest.mark.needs_fs("ext4")
@pytest.mark.parametrize("values", [
    ("disk5_part5", None), (None, "/tmp/mountd/disk5_part5")])
def test_a_row_with_an_empty_column_counts_as_none_and_is_not_doubled(world, start_daemon, values):
    world.plug(world.whole_disk("ext4"), "sda")
    world.db_execute(TABLE)
    world.db_execute(INSERT, (uid_of(world, "/dev/sda"), "sdz", *values, "no"))
    daemon = start_daemon()
    daemon.wait_log("mount OK, /dev/sda ==> /tmp/mountd/disk1_part1")
    assert len(world.db_rows()) == 1


@pytest.mark.needs_fs("ext4")
def test_a_mountd_text_that_is_neither_yes_nor_no_becomes_yes_with_the_mount(world, start_daemon):
    world.plug(world.whole_disk("ext4"), "sda")
    world.db_execute(TABLE)
    remember(world, uid_of(world, "/dev/sda"), "disk5_part5", mountd="perhaps")
    daemon = start_daemon()
    daemon.wait_log("mount OK, /dev/sda ==> /tmp/mountd/disk5_part5")
    assert "mountd = 0" in daemon.log()
    rows = world.db_rows()
    assert (rows[0]["mountd"], rows[0]["dev_name"]) == ("yes", "sdz")
