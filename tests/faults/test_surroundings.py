"""A full /tmp, an /etc that takes nothing, a /sys/block that cannot be opened."""

import os

import pytest
from shared.preload import HASTE, install
from faults.starting import Starts
from shared.strace import Strace

from world import Partition
from world.state import DISK_DB, DISK_JSON, PID_FILE, STATUS_NEW

pytestmark = pytest.mark.needs_fs("ext4")

CONFIG_DIR = "/etc/config/tarn_nas"
HOOK = "/etc/hotplug.d/block/10-mount"
FILLER = "filler"
PAGE = 4096
# Beside seven other tests everything takes a little longer.
SLACK = 4
# Once nothing has changed for 30 s the files are written in each cycle.
NEXT_PUBLICATION = (30 + 3 + 8) / HASTE + SLACK


def fill(world, folder):
    """Leave no room in a folder's filesystem."""
    def full():
        world.sh(f"cat /dev/zero >> {folder}/{FILLER}", check=False)
        return os.statvfs(world.path(folder)).f_bavail == 0
    world.wait(full, 30, f"a full {folder}")


def failed_publication(daemon):
    daemon.wait_log("publish err, fn = /tmp/tarn_nas//disk.json", NEXT_PUBLICATION, daemon.mark())


def remount(world, options, target):
    world.run("mount", "-o", f"remount,{options}", target)


def own_config_dir(world, size_kib):
    """A filesystem of its own, and small, under the database; what is there is kept."""
    world.sh(f"mkdir -p {CONFIG_DIR} /run/world/kept && cp -a {CONFIG_DIR}/. /run/world/kept &&"
             f"mount -t tmpfs -o size={size_kib}k,mode=755 tmpfs {CONFIG_DIR} &&"
             f"cp -a /run/world/kept/. {CONFIG_DIR}")


@pytest.fixture
def starts(world, start_daemon, libraries):
    return Starts(world, install(world, libraries, "haste"))


def start_without(starts):
    """A hastened start in a world where something is wrong."""
    return starts.world.start_daemon(environ=starts.environ)


def test_a_full_tmp_for_a_cycle_loses_nothing_and_the_next_plug_is_right(rig):
    world, home = rig.world, rig.paths()["/dev/sda1"]
    world.sh(f"echo kept > {home}/note")
    fill(world, "/tmp")
    mark = rig.daemon.mark()
    rig.plug_cycle()
    assert "dev err, dev = /dev/sdb\n" in rig.daemon.log_since(mark)
    assert world.mounted() == {"/dev/sda1": home}
    # The document that was whole before stays so.
    assert world.disk_json() is not None
    # A mount that nobody could look at is neither undone nor made anew.
    assert "mount ERROR" not in rig.daemon.log_since(mark)
    assert world.read(f"{home}/note") == "kept\n"
    rig.safe_removal()
    world.path(f"/tmp/{FILLER}").unlink()
    rig.check()
    assert world.read(f"{home}/note") == "kept\n"


def test_a_tmp_without_a_free_inode_for_a_cycle_is_survived_and_the_next_plug_is_right(rig):
    world = rig.world
    used = int(world.run("df", "--output=iused", "/tmp").stdout.split()[-1])
    remount(world, f"nr_inodes={used}", "/tmp")
    mark = rig.daemon.mark()
    rig.busy_cycle()
    assert "ERROR[mount_table.cpp" in rig.daemon.log_since(mark)
    remount(world, "nr_inodes=10000", "/tmp")
    rig.check()


def test_a_full_tmp_at_start_leaves_the_disks_alone_until_there_is_room(starts):
    world = starts.world
    fill(world, "/tmp")
    daemon = start_without(starts)
    world.wait(lambda: "=== ===> dev err, dev = /dev/sda" in daemon.log(), 30, "the look at sda")
    # Full is full: the pid file is there and empty.
    assert world.read(PID_FILE) == ""
    assert world.mounted() == {}
    world.path(f"/tmp/{FILLER}").unlink()
    starts.bring_back(daemon)
    assert daemon.stop() == 0


def test_a_status_of_more_than_a_page_stays_whole_in_a_full_tmp_and_with_room_for_half_of_it(
        world, start_daemon, libraries):
    for name in ("sda", "sdb", "sdc"):
        parts = [Partition("swap", 1001) for _ in range(8)]
        world.plug(world.partitioned_disk(*parts), name)
    world.start_companion()
    daemon = world.start_daemon(environ=install(world, libraries, "haste"))
    world.wait(lambda: len(world.parts()) == 24, 30, "24 partitions in disk.json")
    whole = world.read(DISK_JSON)
    assert len(whole) > PAGE

    fill(world, "/tmp")
    failed_publication(daemon)
    assert world.read(DISK_JSON) == whole
    # Of the next document a first page could be written.
    filler = world.path(f"/tmp/{FILLER}")
    os.truncate(filler, filler.stat().st_size - PAGE)
    failed_publication(daemon)
    assert world.read(DISK_JSON) == whole
    # One that is not there is not begun.
    world.path(DISK_JSON).unlink()
    fill(world, "/tmp")
    os.truncate(filler, filler.stat().st_size - PAGE)
    failed_publication(daemon)
    assert not world.exists(DISK_JSON)
    assert not world.exists(STATUS_NEW)

    filler.unlink()
    world.wait(lambda: world.exists(DISK_JSON), NEXT_PUBLICATION, "a document")
    assert world.read(DISK_JSON) == whole
    assert daemon.stop() == 0


def test_etc_that_turns_read_only_keeps_every_row_and_takes_new_ones_afterwards(rig):
    world = rig.world
    before = world.db_rows()
    remount(world, "ro", "/etc")
    mark = rig.daemon.mark()
    rig.busy_cycle()
    assert "attempt to write a readonly database" in rig.daemon.log_since(mark)
    assert world.db_rows() == before
    remount(world, "rw", "/etc")
    rig.check()


def test_etc_that_is_read_only_at_start_stops_no_mount_and_is_written_to_afterwards(starts):
    world = starts.world
    assert world.exists(HOOK)
    remount(world, "ro", "/etc")
    daemon = start_without(starts)
    world.wait(starts.is_right, 30, "the disk in disk.json")
    assert "open err, db = /etc/config/tarn_nas/disk.db" in daemon.log()
    assert "sqlite err = unable to open database file" in daemon.log()
    assert world.mounted() == {"/dev/sda1": "/tmp/mountd/disk1_part1"}
    assert not world.exists(DISK_DB)
    assert world.exists(HOOK)

    remount(world, "rw", "/etc")
    world.send("#remove_dev:sda")
    world.announce(starts.disk)
    world.wait(lambda: [row["mountd"] for row in world.db_rows()] == ["yes"], 30, "a row")
    world.wait(starts.is_right, 30, "the disk in disk.json")
    assert daemon.stop() == 0
    # The hook of the system's own is the next start's to delete.
    start_without(starts)
    assert not world.exists(HOOK)


def test_a_read_only_database_is_still_read_and_a_remembered_directory_kept(starts):
    world = starts.world
    daemon = start_without(starts)
    world.wait(starts.is_right, 30, "the disk in disk.json")
    assert daemon.stop() == 0
    world.db_execute("update disk set disk_name='disk7_part2', mountd='no',"
                     " mount_path='/tmp/mountd/disk7_part2'")
    world.plug(world.whole_disk("ext4"), "sdb")
    remount(world, "ro", "/etc")
    daemon = start_without(starts)
    world.wait(lambda: len(world.parts()) == 2, 30, "two disks in disk.json")

    assert "sqlite err = attempt to write a readonly database" in daemon.log()
    paths = world.mounted()
    assert paths["/dev/sda1"] == "/tmp/mountd/disk7_part2"
    assert paths["/dev/sdb"] in ("/tmp/mountd/disk1_part1", "/tmp/mountd/disk2_part1")
    assert [(row["disk_name"], row["mountd"]) for row in world.db_rows()] == [
        ("disk7_part2", "no")]
    world.safe_remove()
    world.wait(lambda: world.mounted() == {}, 30, "the unmount")
    assert daemon.stop() == 0


def test_a_full_filesystem_under_the_database_keeps_every_row_and_takes_changes_afterwards(rig):
    world = rig.world
    own_config_dir(world, 64)
    before = world.db_rows()
    fill(world, CONFIG_DIR)
    mark = rig.daemon.mark()
    rig.busy_cycle()
    assert "sqlite err = database or disk is full" in rig.daemon.log_since(mark)
    assert world.db_rows() == before
    assert not world.db_fault()
    world.path(f"{CONFIG_DIR}/{FILLER}").unlink()
    rig.check()


def test_a_full_filesystem_without_a_database_stops_no_mount_and_a_row_follows(starts):
    world = starts.world
    own_config_dir(world, 64)
    fill(world, CONFIG_DIR)
    daemon = start_without(starts)
    world.wait(starts.is_right, 30, "the disk in disk.json")
    assert "sqlite err = " in daemon.log()
    assert not world.path(DISK_DB).exists() or world.path(DISK_DB).stat().st_size == 0
    world.path(f"{CONFIG_DIR}/{FILLER}").unlink()
    starts.bring_back(daemon)
    world.send("#remove_dev:sda")
    world.announce(starts.disk)
    world.wait(lambda: [row["mountd"] for row in world.db_rows()] == ["yes"], 30, "a row")


def test_sys_block_that_cannot_be_opened_for_a_cycle_takes_no_disk_away(rig):
    mark = rig.daemon.mark()
    with Strace(rig.daemon, ["openat", "open"], "error=EACCES", paths=["/sys/block"]) as strace:
        rig.busy_cycle()
        # Not even the safe removal sees the disk that stayed; the files do not say that it went.
        rig.answer()
        assert rig.world.mounted() == {"/dev/sda1": rig.paths()["/dev/sda1"]}
        assert set(rig.world.parts()) == {"sda1"}
    assert strace.injected > 0
    assert "open dir err, dir = /sys/block" in rig.daemon.log_since(mark)
    rig.check()


def test_sys_block_that_cannot_be_opened_at_start_leaves_the_disks_to_their_announcement(starts):
    world = starts.world
    daemon = world.start_daemon(environ=starts.environ, held=True)
    with Strace(daemon, ["openat", "open"], "error=EIO", paths=["/sys/block"]):
        daemon.release()
        daemon.wait_log("open dir err, dir = /sys/block")
        daemon.wait_idle_cycles(2)
    assert world.mounted() == {}
    # Nothing is looked for before the first disk is known.
    world.announce(starts.disk)
    world.wait(starts.is_right, 30, "the announced disk")
    assert daemon.stop() == 0


def test_a_list_of_disks_that_breaks_off_at_start_is_looked_at_again_without_an_announcement(
        starts):
    world = starts.world
    daemon = world.start_daemon(environ=starts.environ, held=True)
    with Strace(daemon, ["getdents64"], "error=EIO:when=1", paths=["/sys/block"]) as strace:
        daemon.release()
        daemon.wait_log("read dir err")
        daemon.wait_started()
    assert strace.injected == 1
    assert "d_name = sda" not in daemon.log()[:daemon.log().index("have disk = ")]
    world.wait(starts.is_right, 30, "the disk in disk.json")
    assert daemon.stop() == 0


# Two calls read a whole list, and it is read first for the system's own partitions.
@pytest.mark.parametrize("call", (1, 3))
def test_a_list_of_partitions_that_breaks_off_is_read_again(starts, call):
    world = starts.world
    daemon = world.start_daemon(environ=starts.environ, held=True)
    folder = world.run("readlink", "-f", "/sys/block/sda").stdout.strip()
    with Strace(daemon, ["getdents64"], f"error=EIO:when={call}", paths=[folder]) as strace:
        daemon.release()
        daemon.wait_log("read dir err")
        daemon.wait_started()
    assert strace.injected == 1
    world.wait(starts.is_right, 30, "the disk in disk.json")
    # A rescan would have found it in the end, as a disk that was dropped as empty.
    assert "clear dev = sda" not in daemon.log()
    assert daemon.stop() == 0
