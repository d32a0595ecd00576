"""The page over the real daemon and real filesystems: plugged, seen, removed by click, unplugged, plugged again."""

import pytest

from world import Partition

pytestmark = pytest.mark.xdist_group("story")
MOUNTED = 60


def use_up(world, device, mib):
    """Take up so much of a mounted filesystem."""
    world.run("fallocate", "-l", f"{mib}M", f"{world.mounted()[f'/dev/{device}']}/film")


@pytest.mark.takes_minutes
def test_disks_come_and_go_on_the_page(world, browser, server):
    daemon = world.start_daemon()
    disk = world.partitioned_disk(Partition("ext4", 1800, "PHOTOS"), Partition("ext4", 1200, "BACKUP"),
                                  Partition("ext4", 500, "SMALL"))
    card = world.partitioned_disk(Partition("ext4", 1200, "CAMERA"), table="dos")
    blank = world.blank_disk(2000)
    browser.open(server, height=720)
    assert "No disk is plugged in." in browser.text()

    for each, name in ((disk, "sda"), (card, "mmcblk0"), (blank, "sdb")):
        world.hotplug(each, name)
    browser.wait(lambda: browser.all("#remove-sda") and browser.all("#remove-mmcblk0"), "both disks", MOUNTED)
    browser.wait_text("BACKUP", "#disk-sda", MOUNTED)
    for device, mib in (("sda1", 1100), ("sda2", 300), ("mmcblk0p1", 900)):
        use_up(world, device, mib)
    browser.wait(lambda: all(f"{gib} GiB" in browser.run("return document.body.innerHTML") for gib in ("1.8", "1.2")),
                 "sizes")
    browser.wait(lambda: server.plugin.parts()["mmcblk0p1"]["free_size"] < 400, "the space used", MOUNTED)
    daemon.wait_rescan()
    browser.later(31)
    browser.wait_text("No filesystem", "#disk-sdb")
    browser.wait(lambda: "CAMERA" in browser.text("#disk-mmcblk0"), "all of it")
    browser.picture("page")

    browser.remove("#remove-sda")
    browser.wait_text("You can unplug it now.", ".modal", 40)
    assert list(world.mounted()) == ["/dev/mmcblk0p1"]
    browser.click("#close")
    world.hotunplug(disk, surprise=False)
    browser.wait(lambda: not browser.all("#disk-sda"), "the disk to leave the page", 30)

    browser.remove("#remove-all")
    browser.wait_text("You can unplug it now.", ".modal", 40)
    assert not world.mounted()
    browser.click("#close")
    world.hotunplug(card, surprise=False)
    world.hotplug(disk, "sda")
    browser.wait(lambda: browser.all("#remove-sda"), "the disk to come back", MOUNTED)
    assert browser.complaints() == []
