"""What the page shows, over disks that are laid out for it."""

import pytest
from web.server import OBJECT
from web.test_list import LABELS, add_disk, mount, part, publish

pytestmark = pytest.mark.xdist_group("page")


def test_disks_are_shown_with_what_is_on_them(browser, server, disks):
    browser.open(server)
    usb, card = browser.text("#disk-sda"), browser.text("#disk-mmcblk0")
    for text in ("USB disk sda", "DATA", "/tmp/mountd/disk1_part1", "EXT4", "Remove safely"):
        assert text in usb
    assert "SD card mmcblk0" in card and "CARD" in card
    bar = browser.all("#device-sda1 .cbi-progressbar")[0]
    assert bar.get_attribute("title") == "450 MiB free of 1.8 GiB"
    assert bar.get_attribute("aria-valuenow") == "75"
    assert browser.all("#device-sda1 .cbi-progressbar div")[0].get_attribute("style") == "width: 75%;"
    assert browser.complaints() == []


def test_what_is_not_used_is_grey_and_says_why_and_what_to_do(browser, server, disks):
    browser.open(server)
    assert "Too small: less than 1000 MiB. Make the partition larger" in browser.text("#device-sda2")
    assert [browser.all(f"#device-{name}")[0].value_of_css_property("opacity") for name in ("sda1", "sda2")] == ["1", "0.65"]


def test_each_reason_has_its_words(world, browser, server, listener):
    world.sysfs.add_disk("nvme0n1", 2048000, 1)
    add_disk(world, "sdb", 2000, [1200])
    mount(world, "sdb1", "/tmp/mountd/disk9_part1")
    publish(world, [part("sda1", "disk1_part1")])
    browser.open(server)
    assert "Not a kind of disk" in browser.text("#disk-nvme0n1")
    assert "Unplugged." in browser.text("#disk-sda")
    assert "Still mounted." in browser.text("#disk-sdb")
    assert not browser.all("#remove-nvme0n1") and not browser.all("#remove-sda") and browser.all("#remove-sdb")


def test_a_label_is_text_and_nothing_else(world, browser, server, listener):
    numbers = range(1, len(LABELS) + 1)
    add_disk(world, "sda", 20000, [1800] * len(LABELS))
    publish(world, [part(f"sda{number}", f"disk1_part{number}", label=LABELS[number - 1]) for number in numbers])
    mount(world, "sda1", "/tmp/mountd/disk1_part1")
    browser.open(server, width=400, height=1400)
    for number in numbers:
        cell = browser.all(f"#device-sda{number} td")[0]
        assert cell.get_attribute("textContent") == LABELS[number - 1]
    browser.picture("web-hostile-labels")
    assert browser.run("return document.scrollingElement.scrollWidth <= 400")
    browser.click("#remove-sda")
    question = browser.all(".modal p")[0].get_attribute("textContent")
    assert [label for label in LABELS if label not in question] == []
    assert browser.run("return document.querySelectorAll('main script, main b, .modal script, .modal b').length") == 0
    assert browser.complaints() == []


def test_without_disks_it_says_how_to_plug_one(world, browser, server, listener):
    publish(world)
    browser.open(server)
    text = browser.text("#no-disks")
    assert "No disk is plugged in." in text and "Plug a USB disk" in text
    assert "comes back when it is plugged in again" in text
    browser.picture("web-no-disk")


def test_without_a_daemon_it_says_so_and_offers_no_removal(browser, server, disks):
    disks.close()
    browser.open(server)
    assert "The disk manager is not running." in browser.text() and "Startup" in browser.text()
    assert not browser.all("#view button")
    browser.picture("web-not-running")


def test_a_router_that_does_not_answer_is_told_and_comes_back(browser, server, disks):
    server.broken = True
    browser.open(server)
    assert "The router does not answer." in browser.text()
    server.broken = False
    browser.wait_text("USB disk sda")


def test_an_account_that_may_only_read_has_no_buttons_and_is_refused(browser, server, disks):
    browser.open(server, user="reader")
    assert "DATA" in browser.text()
    assert not browser.all("button")
    browser.picture("web-reader")
    for method in ("remove", "remove_disk", "safe_remove"):
        refused = server.ubus({"id": 1, "params": [server.sessions["reader"], OBJECT, method, {"dev_name": "sda"}]})
        assert refused["error"]["message"] == "Access denied"
    for number in (server.sessions["nobody"], "0" * 32):
        assert "error" in server.ubus({"id": 1, "params": [number, OBJECT, "list", {}]})
    assert disks.received() == []
