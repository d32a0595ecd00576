"""The page in use: screens, keyboard, screen reader, languages, and how often it looks."""

import pytest
from selenium.webdriver.common.keys import Keys
from web.test_list import add_disk, mount
from web.test_page_removal import umount

pytestmark = pytest.mark.xdist_group("use")


def test_a_narrow_screen_shows_all_of_it(browser, server, disks):
    browser.open(server, width=360, height=800)
    assert browser.run("return document.scrollingElement.scrollWidth <= window.innerWidth")
    for button in browser.all("#view button"):
        assert 0 <= button.rect["x"] and button.rect["x"] + button.rect["width"] <= 360
    browser.picture("web-narrow")


def test_the_keyboard_is_enough(browser, server, disks):
    browser.open(server)
    for _ in range(3):
        browser.driver.switch_to.active_element.send_keys(Keys.TAB)
        if browser.driver.switch_to.active_element.get_attribute("id") == "remove-sda":
            break
    browser.driver.switch_to.active_element.send_keys(Keys.ENTER)
    assert browser.driver.switch_to.active_element.get_attribute("id") == "cancel"
    browser.driver.switch_to.active_element.send_keys(Keys.TAB)
    browser.driver.switch_to.active_element.send_keys(Keys.ENTER)
    browser.wait(lambda: disks.received() == ["#remove_dev:sda"], "the message")


def test_a_screen_reader_finds_the_buttons(browser, server, disks):
    browser.open(server)
    names = [button.accessible_name for button in browser.all("#view button")]
    assert names == ["Remove all disks safely", "Remove USB disk sda safely", "Remove SD card mmcblk0 safely"]
    assert {button.aria_role for button in browser.all("#view button")} == {"button"}
    assert browser.all("#disk-sda")[0].accessible_name == "USB disk sda"
    browser.click("#remove-sda")
    assert browser.all(".modal")[0].aria_role == "dialog"


def test_the_focus_stays_where_it_is_when_something_changes(world, browser, server, disks):
    browser.open(server)
    browser.run("document.getElementById('remove-sda').focus()")
    umount(world, "disk2_part1")
    browser.wait(lambda: not browser.all("#remove-mmcblk0"), "the change")
    assert browser.driver.switch_to.active_element.get_attribute("id") == "remove-sda"


def test_it_looks_every_five_seconds_and_not_at_all_when_hidden(browser, server, disks):
    browser.open(server)
    seen = len(server.calls)
    browser.wait(lambda: len(server.calls) == seen + 1, "one look", 6)
    browser.run("Object.defineProperty(document, 'hidden', { configurable: true, get: function() { return true; } })")
    seen = len(server.calls)
    browser.pause(6)
    assert len(server.calls) == seen
    browser.run("delete document.hidden; document.dispatchEvent(new Event('visibilitychange'))")
    browser.wait(lambda: len(server.calls) > seen, "a look at once", 2)


def test_a_disk_that_was_just_plugged_in_is_being_looked_at(world, browser, server, disks):
    browser.open(server)
    add_disk(world, "sdb", 2000, [1200])
    add_disk(world, "sdc", 2000, [1200])
    mount(world, "sdc1", "/tmp/mountd/disk3_part1")
    browser.wait_text("Being looked at.", "#device-sdb1")
    browser.wait_text("Being looked at.", "#device-sdc1")
    browser.later(31)
    browser.wait_text("Not in use.", "#device-sdb1")
    browser.wait_text("Still mounted.", "#device-sdc1")


def test_it_speaks_german(browser, server, disks):
    browser.open(server, lang="de")
    assert "Sicher entfernen" in browser.text("#disk-sda")
    assert "frei von" in browser.all("#device-sda1 .cbi-progressbar")[0].get_attribute("title")
    browser.picture("web-german")
