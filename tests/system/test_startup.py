"""Start-up, options, the single-instance guard and what a start finds of an earlier run."""

import re

import pytest

from world.state import PID_FILE

HOOK = "/etc/hotplug.d/block/10-mount"
EMPTY_DOCUMENT = '{"disk_number": 0, "disk": []}'


def run_program(world, *options, **keywords):
    return world.run(world.program, *options, check=False, **keywords)


def test_the_version_option_prints_two_lines_after_the_option_and_ends_with_1(world):
    done = run_program(world, "-v")
    lines = done.stdout.splitlines()

    assert re.fullmatch(r"options\.cpp\(\d+\)opt = v", lines[0])
    assert lines[1:] == ["version:1.05", "date:Feb 16 2022 20:29:10"]
    assert done.returncode == 1
    assert not world.exists("/tmp/tarn_nas")


def test_a_wrong_option_prints_the_usage_on_standard_error_and_ends_with_1(world):
    done = run_program(world, "-x")

    assert done.returncode == 1
    usage = (f"Usage: {world.program} [option]\n"
             "          -d             # debug\n"
             "          -v             # version\n")
    assert done.stderr.endswith(usage)
    assert "Usage" not in done.stdout


def test_the_debug_option_changes_nothing_but_its_own_log_line(make_world):
    def lines_of(*options):
        world = make_world()
        daemon = world.start_daemon(*options)
        daemon.wait_log("no event ...")
        daemon.stop()
        text = re.sub(r"\d{4}-\d+-\d+-\d+-\d+-\d+", "DATE", daemon.log())
        return [line for line in text.splitlines() if "SIGINT" not in line]

    plain, debug = lines_of(), lines_of("-d")
    assert "opt = d" in debug[0]
    first_cycle = plain.index(next(line for line in plain if "no event" in line))
    assert debug[1:first_cycle + 2] == plain[:first_cycle + 1]


def test_a_clean_start_without_disks_prepares_everything_and_publishes_the_empty_document(
        world, daemon):
    assert world.read(PID_FILE) == str(daemon.pid)
    for pipe in ("add_remove", "safe_remove", "remove"):
        path = world.path(f"/tmp/tarn_nas/pipe_disk_{pipe}")
        assert path.is_fifo()
        assert path.stat().st_mode & 0o777 == 0o600
    assert world.path("/tmp/mountd").is_dir()
    assert world.path("/etc/config/tarn_nas").is_dir()
    assert not world.exists(HOOK)
    world.wait(lambda: world.exists("/tmp/tarn_nas/disk.json"), 30, "disk.json")
    assert world.read("/tmp/tarn_nas/disk.json") == EMPTY_DOCUMENT
    assert not world.exists("/tmp/tarn_nas/disk_num.txt")


def test_each_start_makes_one_empty_dated_log_file(world, daemon):
    daemon.wait_idle_cycles(1)
    logs = list(world.path("/tmp/log").iterdir())
    assert len(logs) == 1
    assert re.fullmatch(r"disk_log-20\d\d-\d{1,2}-\d{1,2}-\d{1,2}-\d{1,2}-\d{1,2}\.txt",
                        logs[0].name)
    assert logs[0].stat().st_size == 0


def test_without_a_log_directory_the_start_goes_on(world, start_daemon):
    world.path("/tmp/log").rmdir()
    daemon = start_daemon()
    assert "err, file = /tmp/log/disk_log-" in daemon.log()
    assert daemon.stop() == 0


def test_without_disks_no_rescan_runs_until_an_add_event(world, daemon):
    disk = world.whole_disk("ext4")
    world.plug(disk, "sda")
    daemon.wait_idle_cycles(4)
    assert world.read("/tmp/tarn_nas/disk.json") == EMPTY_DOCUMENT

    world.send("#add:sda")
    world.wait(lambda: "sda" in world.parts(), 30, "sda in disk.json")


def test_a_second_instance_ends_with_1_and_leaves_the_first_alone(world, daemon):
    before = world.read(PID_FILE)
    second = run_program(world, timeout=20)

    assert second.returncode == 1
    assert "===> pid exist, file = /tmp/tarn_nas//disk_manager_pid" in second.stdout
    assert world.read(PID_FILE) == before
    world.send("#heart_beat")
    daemon.wait_log("===> get event = EVENT_DISK_HEART_BEAT")


def test_a_stale_pid_file_is_deleted_and_the_start_goes_on(world, start_daemon):
    world.write(PID_FILE, "99999")
    daemon = start_daemon()
    log = daemon.log()
    assert "cur pid = 99999" in log
    assert "===> pid Not exist, file = /tmp/tarn_nas//disk_manager_pid" in log
    assert world.read(PID_FILE) == str(daemon.pid)


def test_a_pid_file_with_a_single_digit_counts_as_live_when_a_listed_pid_holds_the_digit(world):
    # Pids are small in a world of its own: twenty in a row hold one with a 1.
    bystanders = [world.popen("/bin/sh", "-c", "sleep 30; : tarn_nas_diskmanager")
                  for _ in range(20)]
    world.wait(lambda: "1" in world.run("pgrep", "-f", "tarn_nas_diskmanager").stdout, 30,
               "a pid with a 1 in it")
    world.write(PID_FILE, "1")
    done = run_program(world, timeout=20)
    for bystander in bystanders:
        bystander.kill()

    assert done.returncode == 1
    assert "===> pid exist" in done.stdout
    assert world.read(PID_FILE) == "1"


def test_an_empty_pid_file_names_no_process(world, start_daemon):
    world.write(PID_FILE, "")
    daemon = start_daemon()
    assert world.read(PID_FILE) == str(daemon.pid)


def test_a_killed_daemon_is_followed_by_one_that_takes_the_stale_pid_file_away(world, start_daemon):
    first = start_daemon()
    first.kill()
    assert world.exists(PID_FILE)
    # Its pid text must not stand inside another pid of the list.
    world.write(PID_FILE, "4000000")
    second = start_daemon()
    assert world.read(PID_FILE) == str(second.pid)


@pytest.mark.needs_fs("ext4")
def test_mounts_left_by_an_earlier_run_are_forced_off_by_device_and_by_path(world, start_daemon):
    disk = world.whole_disk("ext4")
    world.plug(disk, "sda")
    world.run("mkdir", "-p", "/tmp/mountd/disk7_part3")
    world.run("mount", "/dev/sda", "/tmp/mountd/disk7_part3")
    daemon = start_daemon()
    log = daemon.log()
    by_device = log.index("exec cmd = umount -f /dev/sda\n")
    assert by_device < log.index("exec cmd = umount -f /tmp/mountd/disk7_part3\n")
    daemon.wait_log("mount OK, /dev/sda ==> /tmp/mountd/disk1_part1")
    assert world.mounted() == {"/dev/sda": "/tmp/mountd/disk1_part1"}


@pytest.mark.needs_fs("ext4")
def test_a_block_input_run_takes_over_what_is_mounted_already(world, start_daemon):
    disk = world.whole_disk("ext4")
    world.plug(disk, "sda")
    world.run("mkdir", "-p", "/tmp/mountd/disk7_part3")
    world.run("mount", "/dev/sda", "/tmp/mountd/disk7_part3")
    daemon = start_daemon("-e")
    daemon.wait_log("already mounted, dev = /dev/sda")
    world.wait(lambda: "sda" in world.parts(), 30, "sda in disk.json")

    assert "disk manage run block input" in daemon.log()
    assert world.parts()["sda"].disk_name == "disk7_part3"
    assert world.mounted() == {"/dev/sda": "/tmp/mountd/disk7_part3"}
    assert world.exists(HOOK)
    assert not world.exists("/etc/config/tarn_nas")
    assert not list(world.path("/tmp/log").iterdir())
    assert world.read(PID_FILE) == str(daemon.pid)
    assert daemon.stop() == 0
    assert not world.exists(PID_FILE)
    assert "manager work again!" not in daemon.log()


def test_pipes_that_cannot_be_made_end_the_daemon_with_0_and_without_a_pid_file(world):
    world.run("mkdir", "-p", "/tmp/tarn_nas/pipe_disk_remove/in_the_way")
    done = run_program(world, timeout=20)
    assert done.returncode == 0
    assert re.search(r"ERROR\[file\.cpp:\d+\]\(.+\)fopen err:", done.stdout)
    assert not world.exists(PID_FILE)


def test_the_output_comes_line_by_line_in_order_with_that_of_the_commands(world, start_daemon):
    world.tools.stub("blkid", 'echo "blkid says something" >&2\n')
    world.plug(world.blank_disk(), "sda")
    daemon = start_daemon()
    log = daemon.wait_log("=== ===> dev err, dev = /dev/sda") and daemon.log()
    order = ["add dev name = sda", "exec cmd = blkid /dev/sda > /tmp/tmp_blkid",
             "blkid says something", "dev = /dev/sda", "=== ===> dev err, dev = /dev/sda"]
    places = [log.index(text) for text in order]
    assert places == sorted(places)
