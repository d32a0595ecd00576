"""Removals by click: asked, waited for, and what is said in the end."""

import pytest
from web.test_list import mount, publish

pytestmark = pytest.mark.xdist_group("removal")


def umount(world, name):
    world.run("umount", f"/tmp/mountd/{name}")


def test_a_removal_asks_waits_for_the_kernel_and_says_when_to_unplug(world, browser, server, disks):
    browser.open(server)
    browser.click("#remove-sda")
    assert "Remove USB disk sda (DATA)?" in browser.text(".modal")
    browser.click("#confirm")
    browser.wait(lambda: disks.received() == ["#remove_dev:sda"], "the message")
    browser.pause(1.5)
    assert browser.all(".modal .spinning") and "unplug it now" not in browser.text(".modal")
    umount(world, "disk1_part1")
    browser.wait_text("You can unplug it now.", ".modal")
    browser.picture("web-unplug-it-now")
    browser.click("#close")
    assert not browser.all("#remove-sda")
    assert "You can unplug it now." in browser.text("#device-sda1")
    assert browser.all("#remove-mmcblk0")


def test_all_are_removed_at_once(world, browser, server, disks):
    browser.open(server)
    browser.remove("#remove-all")
    browser.wait(lambda: disks.received() == ["#safe_remove"], "the message")
    umount(world, "disk1_part1")
    browser.pause(1.5)
    assert "unplug them now" not in browser.text(".modal")
    umount(world, "disk2_part1")
    browser.wait_text("You can unplug them now.", ".modal")
    browser.click("#close")
    browser.wait(lambda: not browser.all("#remove-all"), "no button")


def test_what_somebody_else_removed_meanwhile_can_be_unplugged(world, browser, server, disks):
    browser.open(server)
    browser.click("#remove-sda")
    umount(world, "disk1_part1")
    browser.click("#confirm")
    browser.wait_text("You can unplug it now.", ".modal")
    assert disks.received() == []


def test_no_is_no(browser, server, disks):
    browser.open(server)
    browser.click("#remove-sda")
    browser.click("#cancel")
    assert browser.text(".modal") == ""
    assert disks.received() == [] and "remove_disk" not in server.calls


def test_after_a_minute_it_says_that_the_disk_is_in_use(browser, server, disks):
    browser.open(server)
    browser.remove("#remove-sda")
    browser.wait(lambda: disks.received(), "the message")
    browser.later(61)
    browser.wait_text("Still in use.", ".modal")
    assert "Close what uses it" in browser.text(".modal") and "Do not unplug" in browser.text(".modal")
    browser.picture("web-still-in-use")


def test_a_daemon_that_has_given_up_is_asked_again(world, browser, server, disks):
    browser.open(server)
    browser.remove("#remove-sda")
    browser.wait(lambda: disks.received() == ["#remove_dev:sda"], "the message")
    publish(world)
    browser.wait_text("Still mounted.", "#device-sda1")
    assert disks.received() == []
    browser.later(16)
    browser.wait(lambda: disks.received() == ["#add:sda1", "#remove_dev:sda"], "the second message")


def test_a_disk_that_is_mounted_again_is_not_to_be_unplugged(world, browser, server, disks):
    browser.open(server)
    browser.remove("#remove-sda")
    browser.wait(lambda: disks.received() == ["#remove_dev:sda"], "the message")
    umount(world, "disk1_part1")
    browser.wait_text("You can unplug it now.", ".modal")
    mount(world, "sda1", "/tmp/mountd/disk1_part1")
    browser.wait_text("The disk is in use again.", ".modal")


def test_a_refusal_is_told(world, browser, server, disks):
    browser.open(server)
    disks.close()
    browser.remove("#remove-sda")
    browser.wait_text("The disk manager is not running.", ".modal")
