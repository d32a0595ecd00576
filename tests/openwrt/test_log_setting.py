"""What of the daemon's output reaches the router's log: little, or by the package's setting all of it."""

import subprocess
import time

import pytest
from openwrt.router import CONFIG, HELPERS, INIT

from world import CHECKOUT, Partition, wait_for
from world.state import MOUNT_BASE

SCRIPT = f"{HELPERS}/tarn_nas_disk_log"
LOG_PIPE = "/var/run/tarn_nas_disk_log"
# The same; its directory is a link, which leads out of the world from outside.
LOG_PIPE_FILE = "/run/tarn_nas_disk_log"
HASTE = 5

OK = "mount.cpp(198)mount OK, /dev/{0} ==> /tmp/mountd/disk1_part1"
FAILED = "Warning[mount.cpp:195]=== === === mount ERROR, /dev/{0} ==> /tmp/mountd/disk1_part1"
UMOUNT = "Warning[removal.cpp:55]==> umount dev = {0}"
OWN = "Warning[discovery.cpp:72]router's own disk, dev = {0}"
PART = "mount.cpp(159)=== ===> mount sub part, i = 0, name = {0}"
ROOT = "mount.cpp(146)=== ===> mount root part, dev name = {0}"
UNKNOWN = "ERROR[mount.cpp:188]err fs type = ERR FS"
TIMEOUT = "Warning[manager.cpp:74]sys timeout, 61 > 60"
AGAIN = "manager.cpp(243)manager work again!"
IDLE = "Warning[manager.cpp:262]no event ..."
SCAN = "manager.cpp(52)scan path = /sys/block"

TOLD = [
    OK.format("sda1"),
    OK.format("mmcblk0p1"),
    FAILED.format("sda1"),
    UMOUNT.format("sda1"),
    OWN.format("mmcblk0"),
    "Warning[pulled.cpp:100]disk was pulled, dev = sda",
    "Warning[pulled.cpp:186]disk was replaced, dev = sda",
    "Warning[pulled.cpp:228]removal of a former disk, dev = sda1",
    "manager.cpp(114)===> safe remove disk",
    "mount_point.cpp(202)mount path err:",
    "mount_point.cpp(81)/dev/sda1 ===> /tmp/mountd/disk1_part1",
    "Warning[mount_point.cpp:221]dev not find, dev = /dev/sda1",
    "run.cpp(108)===> pid exist, file = /tmp/tarn_nas//disk_manager_pid",
]

NOT_TOLD = [
    "",
    IDLE,
    SCAN,
    AGAIN,
    TIMEOUT,
    UMOUNT.format(""),
    PART.format("sda1"),
    "mount.cpp(171)*** *** *** mount part, status = 1",
    "Warning[mount.cpp:173]already mount sda1 ==> /tmp/mountd/disk1_part1",
    "mount_table.cpp(79)get dev mount[0] /dev/sda1 ==> /tmp/mountd/disk1_part1",
    "mount_point.cpp(219)check mount dev err, dev[0] = /dev/sda1",
    "../../src/disk/mount.cpp(44)exec cmd = mount -t ext4 /dev/sda1 /tmp/mountd/disk1_part1",
    "event_pipes.cpp(72)get event = #heart_beat",
    "manager.cpp(277)===> get event = EVENT_DISK_HEART_BEAT",
    "ERROR[part_info.cpp:59]dev = /dev/sda2, get err fs type = EXTENDED",
    # Of the commands, and of labels that look like it.
    "mount OK, /dev/sda1 ==> /tmp/mountd/disk1_part1",
    "mount: mounting /dev/sda1 on /tmp/mountd/disk1_part1 failed: Invalid argument",
    "part_info.cpp(120)label name = mount OK, /dev/sda1 ==> /tmp/mountd/disk1_part1",
    "part_info.cpp(120)label name = x.cpp(1)mount OK, /dev/sda1 ==> /tmp/mountd/disk1_part1",
]


@pytest.fixture
def logged(router):
    """Function that lets the script read lines; returns what it hands on."""
    def read(*lines, mode="quiet"):
        router.world.sh("rm -f /tmp/pipe /tmp/out; mkfifo /tmp/pipe")
        script = router.world.popen("/bin/sh", "-c", f"echo $$ >/tmp/pid; exec {SCRIPT} {mode} /tmp/pipe >/tmp/out")
        router.world.run("tee", "/tmp/pipe", input_text="".join(f"{line}\n" for line in lines))
        end = "mount.cpp(198)mount OK, /dev/end ==> /tmp/mountd/disk9_part9"
        router.world.run("tee", "/tmp/pipe", input_text=end + "\n")
        wait_for(lambda: end in router.world.read("/tmp/out"), 10, "the last line")
        router.world.sh("kill $(cat /tmp/pid)")
        script.wait(10)
        return router.world.read("/tmp/out").splitlines()[:-1]
    return read


def test_each_line_of_interest_is_told(logged):
    assert logged(*TOLD) == TOLD


def test_nothing_else_is_told(logged):
    assert logged(*NOT_TOLD) == []


def test_with_the_setting_every_line_is_told(logged):
    assert logged(*TOLD, *NOT_TOLD, mode="full") == TOLD + NOT_TOLD


def test_a_line_keeps_its_blanks_and_backslashes(logged):
    line = OK.format("sda1") + r"  \n \040 "
    assert logged(line) == [line]


@pytest.mark.parametrize("text", [
    "mount OK, %s ==> %s", "=== === === mount ERROR, %s ==> %s", "==> umount dev = %s", "clear dev = %s",
    "=== ===> mount root part, dev name = %s", "=== ===> mount sub part, i = %d, name = %s",
    "err fs type = %s", "disk was pulled, dev = %s", "disk was replaced, dev = %s",
    "removal of a former disk, dev = %s", "router's own disk, dev = %s", "===> safe remove disk", "mount path err:", "%s ===> %s",
    "dev not find, dev = %s", "===> pid exist, file = %s", "sys timeout, %d > %d", "no event ...",
    "get event = %s", "manager work again!", "scan path = %s"])
def test_the_daemon_says_what_is_looked_for(text):
    found = subprocess.run(["grep", "-rqF", f'"{text}\\n"', CHECKOUT / "src"], check=False)
    assert found.returncode == 0


@pytest.mark.parametrize("line", [FAILED.format("sda1"), OWN.format("sda")])
def test_what_comes_in_every_pass_is_told_once(logged, line):
    assert logged(SCAN, line, IDLE, line, line) == [line]


@pytest.mark.parametrize("between", [
    OK.format("sda1"), UMOUNT.format("sda1"), UMOUNT.format("sda"), SCAN, "disk_sets.cpp(169)clear dev = sda"])
def test_a_partition_that_has_been_mounted_removed_or_tried_afresh_is_told_again(logged, between):
    lines = logged(FAILED.format("sda1"), between, FAILED.format("sda1"))
    assert lines.count(FAILED.format("sda1")) == 2


@pytest.mark.parametrize("part", [PART.format("sda1"), ROOT.format("sda")])
def test_a_filesystem_that_is_never_mounted_is_told_once_with_its_partition(logged, part):
    assert logged(SCAN, part, UNKNOWN, IDLE, part, UNKNOWN) == [part, UNKNOWN]
    other = PART.format("sdb1")
    assert logged(SCAN, part, UNKNOWN, other, UNKNOWN, part, UNKNOWN) == [part, UNKNOWN, other, UNKNOWN]


def test_what_becomes_of_one_disk_says_nothing_of_another(logged):
    failures = [FAILED.format(name) for name in ("sda1", "sdb1")]
    lines = logged(*failures, UMOUNT.format("sdb1"), *failures)
    assert [lines.count(line) for line in failures] == [1, 2]


def test_a_missing_companion_is_told_when_it_was_the_end(logged):
    assert logged(TIMEOUT, "Warning[process.cpp:44]===> proc not exist, name = tarn_nas_sys", AGAIN) == [TIMEOUT]


@pytest.mark.parametrize("between", [IDLE, "event_pipes.cpp(72)get event = #heart_beat", SCAN])
def test_an_end_for_another_reason_is_not_told_as_a_missing_companion(logged, between):
    assert logged(TIMEOUT, between, AGAIN) == []


# In the service.


def test_a_changed_setting_is_heard_of(router):
    router.start()
    assert "add_reload_trigger tarn_nas_diskmanager" in router.procd_calls()


@pytest.mark.parametrize(("value", "mode"), [
    ("1", "full"), ("on", "full"), ("0", "quiet"), ("", "quiet"), ("nonsense", "quiet")])
def test_the_setting_decides(router, value, mode):
    router.set_full_log(value)
    router.start()
    assert f"set_param log command {SCRIPT} {mode} {LOG_PIPE}" in router.procd_calls()


def test_without_the_setting_the_log_is_quiet(router):
    router.world.path(CONFIG).unlink()
    router.start()
    assert f"set_param log command {SCRIPT} quiet {LOG_PIPE}" in router.procd_calls()


@pytest.fixture
def quick_router(hasty_router):
    """A router with the real daemon, its clock faster, and the log as installed."""
    return hasty_router(HASTE)


def plug(router, name="sda", **options):
    """Plug a disk of one partition and tell of it; returns the disk."""
    disk = router.world.partitioned_disk(Partition(fs="ext4", **options))
    router.world.plug(disk, name)
    router.uevent("add", name, "disk")
    router.uevent("add", f"{name}1")
    return disk


def texts(router):
    """What was told, without the places in the source."""
    lines = router.output().splitlines()
    return [line.split(")" if ".cpp(" in line else "]", 1)[1] for line in lines]


def cycles(router, count):
    """As long as so many idle cycles take."""
    time.sleep(count * 3.5 / HASTE)


def test_a_plug_and_a_pull_leave_a_line_each_and_an_idle_daemon_none(quick_router):
    quick_router.start()
    disk = plug(quick_router)
    mounted = f"mount OK, /dev/sda1 ==> {MOUNT_BASE}/disk1_part1"
    wait_for(lambda: texts(quick_router) == [mounted], 20, "the mount's line")
    cycles(quick_router, 20)
    assert texts(quick_router) == [mounted]
    quick_router.world.pull(disk)
    quick_router.uevent("remove", "sda1")
    quick_router.uevent("remove", "sda", "disk")
    wait_for(lambda: not quick_router.world.mounted(), 20, "the unmount")
    cycles(quick_router, 20)
    assert texts(quick_router) == [mounted, "==> umount dev = sda1"]


def test_a_partition_that_never_mounts_leaves_one_line(quick_router):
    quick_router.world.tools.stub("mount", 'case "$1" in -t) exit 1 ;; *) exec ' +
                                  quick_router.world.tools.real("mount") + ' "$@" ;; esac')
    quick_router.world.tools.record("chmod")
    quick_router.start()
    plug(quick_router)
    # One chmod precedes each attempt.
    wait_for(lambda: len(quick_router.world.tools.commands()) >= 3, 60, "the third attempt")
    assert texts(quick_router) == [f"=== === === mount ERROR, /dev/sda1 ==> {MOUNT_BASE}/disk1_part1"]


def test_a_restart_by_the_self_check_is_told_with_its_reason(quick_router):
    old = quick_router.start()
    quick_router.world.sh(f"mkdir -p {MOUNT_BASE}/disk1_part1 &&"
                          f" mount -t tmpfs /dev/sdz1 {MOUNT_BASE}/disk1_part1")
    quick_router.uevent("add", "sda", "disk")
    quick_router.wait_ready(but=[old])
    assert texts(quick_router)[0] == "dev not find, dev = /dev/sdz1"


def test_a_restart_gives_a_log_that_lags_behind_a_second_to_read_why(quick_router):
    old = quick_router.start()
    log = quick_router.instance_pid("log")
    sleep = quick_router.world.tools.real("sleep")
    # On a busy router the log comes to read again only while the init script waits.
    quick_router.world.tools.stub("sleep", f"! grep -q {INIT} /proc/$PPID/cmdline || kill -CONT {log} 2>/dev/null\n"
                                           f'exec {sleep} "$@"')
    quick_router.world.sh(f"kill -STOP {log}; mkdir -p {MOUNT_BASE}/disk1_part1 &&"
                          f" mount -t tmpfs /dev/sdz1 {MOUNT_BASE}/disk1_part1")
    quick_router.uevent("add", "sda", "disk")
    quick_router.wait_ready(but=[old])
    assert texts(quick_router)[0] == "dev not find, dev = /dev/sdz1"


def test_another_setting_reloads_the_log_alone(quick_router):
    pid = quick_router.start()
    plug(quick_router)
    wait_for(quick_router.world.mounted, 20, "the mount")
    quick_router.world.tools.record("umount")
    quick_router.set_full_log("1")
    quick_router.service("reload")
    wait_for(lambda: "no event ..." in quick_router.output(), 20, "the whole log")
    quick_router.set_full_log("0")
    quick_router.service("reload")
    wait_for(lambda: quick_router.instance_pid("log"), 10, "what logs")
    cycles(quick_router, 3)
    told = quick_router.output()
    cycles(quick_router, 10)
    assert quick_router.output() == told
    assert quick_router.pids() == [pid]
    assert quick_router.world.tools.commands() == []


def test_a_reload_without_a_change_restarts_nothing(router):
    router.start()
    router.service("reload")
    assert [call for call in router.procd_calls() if call.startswith("restart")] == []


def test_the_daemon_outlives_what_logs_and_is_heard_again(quick_router):
    quick_router.set_full_log("1")
    pid = quick_router.start()
    first = quick_router.instance_pid("log")
    quick_router.world.run("kill", "-KILL", first)
    wait_for(lambda: quick_router.instance_pid("log") not in (None, first), 10, "another")
    told = len(quick_router.output())
    wait_for(lambda: "no event ..." in quick_router.output()[told:], 20, "the daemon's voice")
    assert quick_router.pids() == [pid]


def test_a_daemon_without_anybody_to_log_starts_and_works(quick_router):
    quick_router.world.write(SCRIPT, "#!/bin/sh\nexec sleep 1000\n", 0o755)
    pid = quick_router.start()
    plug(quick_router)
    wait_for(quick_router.world.mounted, 20, "the mount")
    assert quick_router.pids() == [pid]
    assert quick_router.world.sh(f"readlink /proc/{pid}/fd/1").stdout.strip().endswith("tarn_nas_disk_log")


def test_a_lost_log_pipe_costs_the_log_and_makes_no_plain_file(quick_router):
    old = quick_router.start()
    quick_router.world.path(LOG_PIPE_FILE).unlink()
    for pid in (old, quick_router.instance_pid("log")):
        quick_router.world.run("kill", "-KILL", pid)
    new = quick_router.wait_ready(but=[old])
    assert quick_router.world.sh(f"readlink /proc/{new}/fd/1").stdout.strip() == "/dev/null"
    # Whoever was to open the pipe in a reader's place has had its time.
    time.sleep(3)
    assert not quick_router.world.exists(LOG_PIPE_FILE)
    quick_router.service("restart")
    assert quick_router.world.path(LOG_PIPE_FILE).is_fifo()


def test_the_daemon_never_reads_its_own_log(quick_router):
    pid = quick_router.start()
    flags = quick_router.world.sh(f"sed -n 's/^flags:.*\\(.\\)$/\\1/p' /proc/{pid}/fdinfo/1").stdout.strip()
    assert flags == "1"
