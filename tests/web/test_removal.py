"""Removals asked for over ubus, refused or carried out by the real daemon."""

import json
import signal
import time
from subprocess import PIPE

import pytest
from shared.moments import first_rescan_over
from web.exchange import is_call
from web.router import PLUGIN
from web.test_list import add_disk, mount, part, publish

from world import PIPES, Partition, wait_for

HOSTILE = [";reboot", "disk1_part1;reboot", "disk1 part1", "$(reboot)", "../disk1_part1", "disk1_part1\n#safe_remove",
           "", "x" * 32, "ä", ".", "disk1_part1 "]
NO_STRINGS = ["{}", '{"disk_name": 1, "dev_name": 1}', '{"disk_name": null, "dev_name": true}', "", "{", "[]",
              '{"disk_name": ["disk1_part1"], "dev_name": {"disk_name": "disk1_part1"}}']


@pytest.fixture
def full(world, listener):
    """A disk of two mounted partitions and one that is not, one without a table; somebody takes messages."""
    add_disk(world, "sda", 5000, [1200, 1200, 1200])
    add_disk(world, "sdb", 2000)
    publish(world, [part(f"sda{number}", f"disk1_part{number}") for number in (1, 2, 3)],
            [part("sdb", "disk2_part1")])
    mount(world, "sda1", "/tmp/mountd/disk1_part1")
    mount(world, "sda2", "/tmp/mountd/disk1_part2")
    mount(world, "sdb", "/tmp/mountd/disk2_part1")
    return listener


def test_the_methods_and_their_arguments_are_declared(plugin):
    assert plugin.methods() == {"list": {}, "remove": {"disk_name": "text"}, "remove_disk": {"dev_name": "text"},
                                "safe_remove": {}}


@pytest.mark.parametrize("method, arguments, line", [
    ("remove", {"disk_name": "disk1_part2"}, "#remove_disk:disk1_part2"),
    ("remove", {"disk_name": "disk2_part1"}, "#remove_dev:sdb"),
    ("remove_disk", {"dev_name": "sda"}, "#remove_dev:sda"),
    ("remove_disk", {"dev_name": "sdb", "ubus_rpc_session": "0123"}, "#remove_dev:sdb"),
    ("safe_remove", {}, "#safe_remove"),
    ("safe_remove", {"disk_name": 5}, "#safe_remove")])
def test_a_removal_is_one_line_in_the_web_interfaces_pipe(plugin, full, method, arguments, line):
    assert is_call(method, arguments)
    assert plugin.call(method, arguments) == {"ok": True}
    assert full.received() == [line]


@pytest.mark.parametrize("method, arguments, word", [
    ("remove", {"disk_name": "disk1_part3"}, "not_mounted"),
    ("remove", {"disk_name": "disk1_part4"}, "unknown_name"),
    ("remove", {"disk_name": "disk1"}, "unknown_name"),
    ("remove", {"dev_name": "sda1"}, "invalid_argument"),
    ("remove_disk", {"dev_name": "sdc"}, "unknown_name"),
    ("remove_disk", {"dev_name": "sda1"}, "unknown_name"),
    ("remove_disk", {"dev_name": "loop0"}, "invalid_argument"),
    ("remove_disk", {"disk_name": "disk1_part1"}, "invalid_argument")])
def test_what_is_not_there_is_refused(plugin, full, method, arguments, word):
    assert plugin.error(method, arguments) == word
    assert full.received() == []


@pytest.mark.parametrize("method, argument", [("remove", "disk_name"), ("remove_disk", "dev_name")])
def test_names_that_are_none_are_refused(plugin, full, method, argument):
    for name in HOSTILE:
        assert not is_call(method, {argument: name})
        assert plugin.error(method, {argument: name}) == "invalid_argument", name
    for text in NO_STRINGS:
        assert json.loads(plugin.call_text(method, text)) == {"ok": False, "error": "invalid_argument"}, text
    assert full.received() == []


def test_nothing_mounted_at_all_is_refused(world, plugin, listener):
    add_disk(world, "sda", 5000)
    publish(world, [part("sda", "disk1_part1")])
    mount(world, "sdb1", "/mnt/by-hand")
    assert plugin.error("safe_remove") == "not_mounted"
    assert plugin.error("remove_disk", {"dev_name": "sda"}) == "not_mounted"
    assert listener.received() == []


def test_what_stayed_mounted_is_told_to_the_daemon_again_before_its_removal(world, plugin, full):
    publish(world, [part("sda2", "disk1_part2")])
    assert plugin.call("remove", {"disk_name": "disk1_part1"})["ok"]
    assert full.received() == ["#add:sda1", "#remove_dev:sda1"]
    assert plugin.call("remove_disk", {"dev_name": "sda"})["ok"]
    assert full.received() == ["#add:sda1", "#remove_dev:sda"]
    assert plugin.call("remove", {"disk_name": "disk2_part1"})["ok"]
    assert full.received() == ["#add:sdb", "#remove_dev:sdb"]
    publish(world)
    assert plugin.call("remove", {"disk_name": "disk1_part1"})["ok"]
    assert full.received() == ["#add:sda1", "#remove_dev:sda"]
    assert plugin.call("safe_remove")["ok"]
    assert full.received() == ["#add:sda1", "#add:sda2", "#add:sdb", "#safe_remove"]


CALLS = [("remove", {"disk_name": "disk1_part1"}), ("remove_disk", {"dev_name": "sda"}), ("safe_remove", {})]


def test_a_full_pipe_holds_a_call_up_for_seconds_only(plugin, full):
    full.fill()
    for method, arguments in CALLS:
        began = time.monotonic()
        assert plugin.error(method, arguments) == "busy"
        assert time.monotonic() - began < 4
    assert "#" not in "".join(full.received())


def test_without_a_reader_nothing_is_written_and_no_file_comes_into_being(world, plugin, full):
    full.close()
    assert world.path(PIPES["safe_remove"]).is_fifo()
    for method, arguments in CALLS:
        assert plugin.error(method, arguments) == "not_running"
    assert full.received() == []
    world.path(PIPES["safe_remove"]).unlink()
    for method, arguments in CALLS:
        assert plugin.error(method, arguments) == "not_running"
    assert not world.exists(PIPES["safe_remove"])


def test_a_plain_file_in_place_of_the_pipe_is_left_alone(world, plugin, full):
    world.path(PIPES["safe_remove"]).unlink()
    world.write(PIPES["safe_remove"], "")
    for method, arguments in CALLS:
        assert plugin.error(method, arguments) == "not_running"
    assert world.read(PIPES["safe_remove"]) == ""


def test_a_call_leaves_no_process_behind(world, plugin, full):
    assert plugin.call("safe_remove")["ok"]
    running = world.sh("ps w").stdout
    assert PLUGIN not in running and "sleep 1\n" not in running


def test_an_unknown_method_answers_nothing(world, plugin):
    assert world.run(PLUGIN, "call", "reboot", input_text="{}").stdout == ""


def plugged(world, plugin, count):
    """Wait until so many partitions are mounted and listed; returns them."""
    def look():
        parts = plugin.parts()
        return sum(entry["mounted"] for entry in parts.values()) == count and parts
    return wait_for(look, 60, f"{count} mounts")


def in_use(world, directory):
    """A process that keeps a directory's mount busy; give it an end of input to end it."""
    process = world.popen("/bin/sh", "-c", f"cd {directory}; echo in; read -r line", stdin=PIPE, stdout=PIPE)
    assert process.stdout.readline() == b"in\n"
    return process


def unmounted(world, *devices, timeout=20):
    wait_for(lambda: not {f"/dev/{name}" for name in devices} & set(world.mounted()), timeout,
             f"{devices} to be unmounted")


@pytest.mark.takes_minutes
def test_the_real_daemon_removes_a_partition_a_disk_and_all(world, plugin):
    disk = world.partitioned_disk(*(Partition("ext4", 1200, f"PART{number}") for number in (1, 2, 3)))
    stick, card = world.whole_disk("ext4", 1200), world.partitioned_disk(Partition("ext4", 1200))
    for each, name in ((disk, "sda"), (stick, "sdb"), (card, "mmcblk0")):
        world.plug(each, name)
    daemon = world.start_daemon()
    parts = plugged(world, plugin, 5)
    first_rescan_over(world, daemon)

    assert plugin.call("remove", {"disk_name": parts["sda1"]["disk_name"]})["ok"]
    unmounted(world, "sda1")
    assert len(world.mounted()) == 4
    assert plugin.call("remove", {"disk_name": parts["sdb"]["disk_name"]})["ok"]
    unmounted(world, "sdb")
    assert len(world.mounted()) == 3
    wait_for(lambda: plugin.unused() == {"sda1": "removed", "sdb": "no_filesystem"}, 20, "both to be forgotten")

    user = in_use(world, world.mounted()["/dev/sda2"])
    assert plugin.call("remove_disk", {"dev_name": "sda"})["ok"]
    wait_for(lambda: plugin.unused().get("sda2") == "busy", 40, "the daemon to give up")
    unmounted(world, "sda3")
    user.communicate(timeout=10)
    assert plugin.call("remove_disk", {"dev_name": "sda"})["ok"]
    unmounted(world, "sda2")
    assert plugin.error("remove_disk", {"dev_name": "sda"}) == "not_mounted"

    assert plugin.call("safe_remove")["ok"]
    unmounted(world, "mmcblk0p1")
    wait_for(lambda: plugin.list()["disk"] == [], 20, "an empty list")
    assert plugin.error("safe_remove") == "not_mounted"
    assert daemon.running
    assert not world.mounted()


def test_a_stopped_or_killed_daemon_is_told_as_such(world, plugin):
    daemon = world.start_daemon()
    assert plugin.list()["running"]
    daemon.stop()
    assert not plugin.list()["running"]
    daemon = world.start_daemon()
    assert plugin.list()["running"]
    daemon.kill()
    assert world.exists(PIPES["safe_remove"])
    assert not plugin.list()["running"]
    assert plugin.error("safe_remove") == "not_running"


def test_a_daemon_that_hangs_still_gets_the_message(world, plugin):
    stick = world.whole_disk("ext4", 1200)
    world.plug(stick, "sda")
    daemon = world.start_daemon()
    plugged(world, plugin, 1)
    first_rescan_over(world, daemon)
    daemon.signal(signal.SIGSTOP)
    try:
        assert plugin.call("safe_remove")["ok"]
        assert world.mounted()
    finally:
        daemon.signal(signal.SIGCONT)
    unmounted(world, "sda")
