"""Messages in the three pipes: what is understood, what is dropped, that nothing is ever run."""

import os

import pytest

from world import PIPES

pytestmark = pytest.mark.usefixtures("watched_status")

EVENTS = {
    "#add:sdx": "EVENT_DISK_ADD",
    "#remove_dev:sdx1": "EVENT_DISK_REMOVE_DEV",
    "#remove_disk:disk9_part9": "EVENT_DISK_REMOVE_DISK",
    "#heart_beat": "EVENT_DISK_HEART_BEAT",
    "#safe_remove": "EVENT_DISK_SAFE_REMOVE",
}
GET_EVENT = "===> get event = "
HEART_BEAT = GET_EVENT + "EVENT_DISK_HEART_BEAT"


def lines_with(text, log):
    """What stands behind `text` in each log line that holds it."""
    return [line.split(text, 1)[1] for line in log.splitlines() if text in line]


def heart_beat(world, daemon, pipe="add_remove"):
    """Send the harmless event through a pipe and wait until it is understood."""
    mark = daemon.mark()
    world.send("#heart_beat", pipe=pipe)
    daemon.wait_log(HEART_BEAT, 30, mark)


@pytest.mark.parametrize("pipe", PIPES)
def test_each_event_is_understood_on_each_pipe(world, daemon, pipe):
    for message in EVENTS:
        world.send(message, pipe=pipe)
    daemon.wait_log(GET_EVENT + "EVENT_DISK_SAFE_REMOVE")

    log = daemon.log()
    assert lines_with(GET_EVENT, log) == list(EVENTS.values())
    assert lines_with("add dev name = ", log) == ["sdx"]
    assert "want remove dev(sdx1) not exist!" in log
    assert lines_with("remove disk name = ", log) == ["disk9_part9"]
    assert "===> safe remove disk" in log


def test_a_keyword_counts_when_the_message_only_begins_with_it(world, daemon):
    world.send("#addition:sdx", "#remove_device:sdy1", "#remove_diskette:disk8_part8",
               "#heart_beat and whatever follows", "#heart_beats:more", "#safe_removed")
    daemon.wait_log("===> safe remove disk")

    log = daemon.log()
    assert lines_with(GET_EVENT, log) == [
        "EVENT_DISK_ADD", "EVENT_DISK_REMOVE_DEV", "EVENT_DISK_REMOVE_DISK",
        "EVENT_DISK_HEART_BEAT", "EVENT_DISK_HEART_BEAT", "EVENT_DISK_SAFE_REMOVE"]
    assert lines_with("add dev name = ", log) == ["sdx"]
    assert "want remove dev(sdy1) not exist!" in log
    assert lines_with("remove disk name = ", log) == ["disk8_part8"]


def test_malformed_messages_are_logged_and_dropped_and_a_good_one_after_them_works(world, daemon):
    refused = ["#add", "#remove_dev", "#remove_disk", "#add sda", "#ad:sda", "#", "#:sda",
               "#ADD:sda", "# add:sda", "##add:sda", "#remove:sda", "#unknown"]
    silent = ["", "add:sda", " #add:sda", "hello", ":"]
    world.send(*refused, *silent)
    heart_beat(world, daemon)

    log = daemon.log()
    assert lines_with(GET_EVENT, log) == ["EVENT_DISK_HEART_BEAT"]
    assert lines_with("err event = ", log) == refused
    assert "add dev name" not in log


def test_a_line_without_its_end_is_lost_and_does_not_spoil_the_next(world, daemon):
    mark = daemon.mark()
    world.send_bytes(b"#add:sd")
    daemon.wait_log("no event ...", 30, mark)
    world.send_bytes(b"x1\n")
    heart_beat(world, daemon)
    assert lines_with(GET_EVENT, daemon.log()) == ["EVENT_DISK_HEART_BEAT"]
    assert "add dev name" not in daemon.log()

    with daemon.held_still():
        world.send_bytes(b"#add:sdy")
        world.send("#add:sdz", pipe="remove")
    daemon.wait_log("add dev name = sdz")
    assert lines_with("add dev name = ", daemon.log()) == ["sdz"]


def test_over_long_lines_are_dropped_whole_and_a_good_one_after_them_works(world, daemon):
    lengths = (254, 255, 256, 257, 258, 511, 512, 513, 5000)
    lines = [b"#add:".ljust(length - 1, b"x") for length in lengths]
    # Cut in two, such a line would end in an event.
    lines += [b"#add:".ljust(place, b"x") + b"#safe_remove" for place in (253, 254, 255, 256, 257)]
    world.send_bytes(b"\n".join(lines) + b"\n")
    heart_beat(world, daemon)

    log = daemon.log()
    assert lines_with(GET_EVENT, log) == ["EVENT_DISK_HEART_BEAT"]
    assert log.count("disk name long") == len(lines)
    assert "add dev name" not in log


def test_an_over_long_line_without_its_end_is_lost_too(world, daemon):
    with daemon.held_still():
        world.send_bytes(b"#add:" + b"x" * 60000)
    daemon.wait_log("no event ...", 30, daemon.mark())
    heart_beat(world, daemon)
    assert lines_with(GET_EVENT, daemon.log()) == ["EVENT_DISK_HEART_BEAT"]


def test_binary_and_format_texts_do_no_harm(world, daemon):
    every_byte = bytes(value for value in range(1, 256) if chr(value) not in "\r\n;#")
    world.send_bytes(every_byte + b"\n")
    world.send_bytes(b"#" + every_byte[::-1] + b"\n")
    world.send_bytes(b"\0\0\0\xff\xfe\n" + os.urandom(200).replace(b"#", b"") + b"\n")
    world.send("#%n%n%s%s%1000000d", "#add:%n%n%s%s", "#remove_dev:%s%n", "#remove_disk:%n%s",
               "#add:sd\x07\x1b[2J", "#add:sdä")
    heart_beat(world, daemon)

    log = daemon.log()
    assert "err event = #%n%n%s%s%1000000d" in log
    assert "=== ===> dev err, dev = /dev/%n%n%s%s" in log
    assert "want remove dev(%s%n) not exist!" in log
    assert "remove disk name = %n%s" in log
    assert "=== ===> dev err, dev = /dev/sdä" in log
    assert "exec cmd = blkid" not in log


def test_newline_return_semicolon_and_zero_byte_end_a_message(world, daemon):
    world.send_bytes(b"#add:sdw\r#add:sdx;#add:sdy\0#add:sdz\n#heart_beat\r\n")
    daemon.wait_log(HEART_BEAT)
    assert lines_with("add dev name = ", daemon.log()) == ["sdw", "sdx", "sdy", "sdz"]


def test_what_follows_a_semicolon_is_a_message_of_its_own(world, daemon):
    world.send("#add:sdx;junk")
    daemon.wait_log("get event = junk")
    heart_beat(world, daemon)

    log = daemon.log()
    assert lines_with(GET_EVENT, log) == ["EVENT_DISK_ADD", "EVENT_DISK_HEART_BEAT"]
    assert lines_with("add dev name = ", log) == ["sdx"]


def test_an_empty_name_is_accepted_as_an_event_and_names_no_device(world, daemon):
    world.send("#add:", "#remove_dev:", "#remove_disk:")
    heart_beat(world, daemon)
    log = daemon.log()
    assert lines_with(GET_EVENT, log)[:3] == list(EVENTS.values())[:3]
    assert lines_with("=== ===> dev err, dev = ", log) == ["/dev/"]
    assert "want remove dev() not exist!" in log


def test_names_of_31_characters_pass_and_of_32_are_too_long(world, daemon):
    world.send("#add:" + "a" * 31, "#add:" + "b" * 32, "#remove_dev:" + "c" * 31,
               "#remove_dev:" + "d" * 32, "#remove_disk:" + "e" * 31, "#remove_disk:" + "f" * 32)
    # A zero byte as the end is not counted: the name fills its field to the last byte.
    world.send_bytes(b"#add:" + b"g" * 32 + b"\0" + b"#add:" + b"h" * 33 + b"\0")
    heart_beat(world, daemon)

    log = daemon.log()
    assert lines_with("add dev name = ", log) == ["a" * 31, "g" * 32]
    assert lines_with("=== ===> dev err, dev = ", log) == ["/dev/" + "a" * 31, "/dev/" + "g" * 32]
    assert f"want remove dev({'c' * 31}) not exist!" in log
    assert lines_with("remove disk name = ", log) == ["e" * 31]
    assert log.count("disk name long") == 4


def test_pipes_filled_at_once_are_emptied_in_order_one_message_a_cycle(world, daemon):
    mark = daemon.mark()
    with daemon.held_still():
        world.send("#remove_disk:third", pipe="remove")
        world.send("#remove_disk:second", pipe="safe_remove")
        world.send("#remove_disk:first", "#remove_disk:first_again")
    daemon.wait_log("remove disk name = third")

    log = daemon.log_since(mark)
    assert lines_with("remove disk name = ", log) == ["first", "first_again", "second", "third"]
    taken = log[log.index("get event = #remove_disk:first"):log.index("remove disk name = third")]
    assert "no event ..." not in taken


def test_a_burst_of_40_lines_in_one_write_is_taken_in_full_and_in_order(world, daemon):
    names = [f"sdx{number}" for number in range(40)]
    world.send_bytes("".join(f"#add:{name}\n" for name in names).encode())
    daemon.wait_log("add dev name = sdx39", 40)
    assert lines_with("add dev name = ", daemon.log()) == names


UNSAFE_NAMES = [
    "sda$(touch /tmp/owned)", "sda`touch /tmp/owned`", "sda|touch /tmp/owned",
    "sda||touch /tmp/owned", "sda&touch /tmp/owned", "sda&&touch /tmp/owned", "sda>/tmp/owned",
    "sda >/tmp/owned", "$(touch${IFS}/tmp/owned)", "sda 1", "sda\t1", "sda'", 'sda"', "sda\\",
    "sd*", "sd?", "sd[a]", "sd{a,b}", "~", "sda#", "sda(", "/../tmp", "/../../tmp", "../etc/passwd",
    "sda/1", "sda=1", "sda,1", "sda%1", "sda@1", "sda+1", "sda:1", "sda^1",
]


def test_names_that_no_device_can_have_run_nothing_and_are_answered_dev_err(world, daemon):
    disk = world.whole_disk("swap", 1200)
    world.plug(disk, "sda")
    for name in UNSAFE_NAMES:
        world.send(f"#add:{name}", f"#remove_dev:{name}", f"#remove_disk:{name}")
    heart_beat(world, daemon)

    log = daemon.log()
    assert lines_with("=== ===> dev err, dev = ", log) == [f"/dev/{name}" for name in UNSAFE_NAMES]
    for name in UNSAFE_NAMES:
        assert f"want remove dev({name}) not exist!" in log
    commands = set(lines_with("exec cmd = ", log))
    assert all(command.startswith(("/etc/init.d/", "mkdir -p", "mount > ")) for command in commands)
    assert not world.exists("/tmp/owned")


def test_a_command_behind_a_semicolon_is_a_message_and_not_run(world, daemon):
    world.send("#add:sdx;touch /tmp/owned", "#remove_dev:sdx;touch /tmp/owned",
               "#remove_disk:x;touch /tmp/owned")
    heart_beat(world, daemon)
    assert daemon.log().count("get event = touch /tmp/owned") == 3
    assert "touch" not in "".join(lines_with("exec cmd = ", daemon.log()))
    assert not world.exists("/tmp/owned")


def test_names_that_devices_do_have_reach_blkid(world, daemon):
    names = ["sdx", "mmcblk7p1", "cciss!c0d0", "dm-0", "a.b", "a_b"]
    world.send(*(f"#add:{name}" for name in names))
    heart_beat(world, daemon)
    expected = [f"blkid /dev/{name} > /tmp/tmp_blkid" for name in names]
    commands = lines_with("exec cmd = ", daemon.log())
    assert [command for command in commands if command.startswith("blkid")] == expected
