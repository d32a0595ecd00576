"""The demo: the daemon's main job on real filesystems, told step by step.

Run by scripts/demo, which installs and builds first.  Exit status 0 means that
every check held.
"""

import hashlib
import os
import sys

from demo.shell import Shell
from demo.show import Failed, Narrator, mount_listing, table
from web.router import PLUGIN_PACKAGE, Plugin, stage
from web.server import PageServer

from world import Partition, World, kernel_has, missing
from world.state import PID_FILE

# A mount takes at least 2 s, a cycle 3 s, and a failed try up to 18 s.
MOUNT_TIMEOUT = 45
REMOVE_TIMEOUT = 45
LOG_TAIL = 3000
PAGE_PORT = 8017


def make_disks(world):
    """{short name: disk}; the story's order of plugging is this order."""
    card_fs = "vfat" if kernel_has("vfat") else "ext4"
    disks = {
        "usb": world.partitioned_disk(Partition("ext4", 1800, "DATA"),
                                      Partition("ext4", 500, "SMALL")),
        "stick": world.whole_disk("ntfs", 1400, label="STICK"),
        "card": world.partitioned_disk(Partition(card_fs, 1200, "CARD"), table="dos"),
    }
    if kernel_has("exfat"):
        disks["camera"] = world.whole_disk("exfat", 1100, label="CAMERA")
    return disks


DESCRIPTIONS = {
    "usb": "USB disk with two partitions, one of them only 500 MiB",
    "stick": "USB stick with a filesystem on the whole device",
    "card": "SD card",
    "camera": "USB stick with exFAT on the whole device",
}


def kernel_names(shorts):
    """Names as the kernel gives them out in this order of plugging."""
    letters = iter("abcdefgh")
    return {short: "mmcblk0" if short == "card" else f"sd{next(letters)}" for short in shorts}


def device_of(short, disk):
    """Name of the device that the daemon should mount of a disk."""
    return disk.name if disk.root_fs else disk.part_name(disk.partitions[0])


class Story:
    """The steps; each prints, waits and checks."""

    def __init__(self, world, daemon, tell):
        self.world = world
        self.daemon = daemon
        self.tell = tell
        self.disks = make_disks(world)
        self.homes = {}
        self.sums = {}

    def run(self):
        self.begin()
        for number, (short, name) in enumerate(kernel_names(self.disks).items(), 1):
            self.plug(short, name, f"disk{number}_part1")
        self.check_small_is_ignored()
        self.write_files()
        self.pull_disk()
        self.pull_the_rest()
        for short, name in kernel_names(reversed(self.disks)).items():
            self.plug(short, name, self.homes[short])
        self.check_files()
        self.safe_removal()
        self.stop()

    def begin(self):
        self.tell.step("The daemon has started in a router without disks")
        document = self.world.disk_json()
        self.tell.check("disk.json says that there is no disk",
                        document == {"disk_number": 0, "disk": []})
        for fs, name in (("vfat", "FAT"), ("exfat", "exFAT")):
            if not kernel_has(fs):
                self.tell.say(f"   (this machine's kernel has no {name}, so none is shown)")

    def plug(self, short, name, home):
        disk = self.disks[short]
        self.tell.step(f"Plugging the {DESCRIPTIONS[short]}, as {name}")
        self.world.plug(disk, name)
        self.world.announce(disk)
        device = device_of(short, disk)
        self.tell.wait(lambda: self.is_shown(device), MOUNT_TIMEOUT,
                       f"{device} to be mounted and published")
        self.show()
        if disk.root_fs:
            self.tell.say("   (of a filesystem on the whole device no label is read;"
                          " the device name stands in)")
        part = self.world.parts()[device]
        self.tell.check(f"{device} is at {part.path}, expected {home}", part.disk_name == home)
        self.tell.check(f"SD card flag of {device} is {part.sd_card}",
                        part.sd_card == int(short == "card"))
        self.homes[short] = part.disk_name

    def is_shown(self, device):
        part = self.world.parts().get(device)
        listed = mount_listing(self.world).get(f"/dev/{device}")
        return part and listed and listed[0] == part.path and part.free_size > 0

    def show(self):
        for line in table(self.world):
            self.tell.say(line)

    def check_small_is_ignored(self):
        self.tell.step("The 500 MiB partition is below 1000 MiB and is rightly ignored")
        small = self.disks["usb"].part_name(self.disks["usb"].partitions[1])
        self.tell.check(f"{small} is not in disk.json", small not in self.world.parts())
        self.tell.check(f"{small} is not mounted", f"/dev/{small}" not in self.world.mounted())
        self.tell.check("disk_num.txt counts the disks",
                        self.world.disk_num() == str(len(self.disks)))

    def write_files(self):
        self.tell.step("Writing a file to each disk")
        for short, home in self.homes.items():
            content = os.urandom(300_000)
            target = self.world.path(f"/tmp/mountd/{home}/file of {short}")
            target.write_bytes(content)
            self.sums[short] = hashlib.sha256(content).hexdigest()
        self.world.run("sync", "-f", *(f"/tmp/mountd/{home}" for home in self.homes.values()))
        self.tell.check("the files are written", self.files_are_intact(self.homes))

    def files_are_intact(self, shorts):
        return all(self.sum_of(short) == self.sums[short] for short in shorts)

    def sum_of(self, short):
        path = self.world.path(f"/tmp/mountd/{self.homes[short]}/file of {short}")
        return hashlib.sha256(path.read_bytes()).hexdigest() if path.exists() else ""

    def pull_disk(self):
        self.tell.step("Pulling the USB disk without asking first")
        self.world.tools.clear_logs()
        self.pull("usb")
        self.show()
        calls = [call[:2] for call in self.world.tools.service_calls()]
        self.tell.check("samba was stopped before and started after",
                        ("samba4", "stop") in calls and ("samba4", "start") in calls
                        and calls.index(("samba4", "stop")) < calls.index(("samba4", "start")))
        self.tell.check("the database remembers its directory, as not mounted",
                        self.remembered("usb") == "no")

    def pull(self, short):
        disk = self.disks[short]
        device = device_of(short, disk)
        self.world.send(*self.world.pull(disk))
        self.tell.wait(lambda: device not in self.world.parts()
                       and f"/dev/{device}" not in self.world.mounted(),
                       REMOVE_TIMEOUT, f"{device} to be unmounted and forgotten")

    def remembered(self, short):
        rows = [row for row in self.world.db_rows() if row["disk_name"] == self.homes[short]]
        return rows[0]["mountd"] if len(rows) == 1 else "not one row"

    def pull_the_rest(self):
        self.tell.step("Pulling the other disks, once a rescan has listed them")
        self.wait_rescan()
        for short in self.disks:
            if self.disks[short].name:
                self.pull(short)
        self.wait_rescan()
        self.show()
        self.tell.check("nothing is mounted", not self.world.mounts())
        self.tell.check("disk.json says that there is no disk",
                        self.world.disk_json()["disk_number"] == 0)

    def wait_rescan(self):
        since = self.daemon.mark()
        self.tell.wait(lambda: self.daemon.rescanned_since(since), 60,
                       "the daemon's next look at /sys/block")

    def check_files(self):
        self.tell.step("Every disk is back in its directory")
        for short in self.homes:
            self.tell.check(f"the file in {self.homes[short]} is intact",
                            self.sum_of(short) == self.sums[short])

    def safe_removal(self):
        self.tell.step("Removing everything safely")
        self.world.safe_remove()
        self.tell.wait(lambda: not self.world.mounts()
                       and self.world.disk_json() == {"disk_number": 0, "disk": []},
                       REMOVE_TIMEOUT, "all disks to be unmounted")
        self.show()
        self.tell.check("the database remembers every directory, as not mounted",
                        all(self.remembered(short) == "no" for short in self.homes))
        for disk in self.disks.values():
            self.world.pull(disk, surprise=False)
        self.tell.say("   the disks are pulled")

    def stop(self):
        self.tell.step("Stopping the daemon with two SIGINTs")
        self.tell.say("   waiting for its end (at most 60 s)")
        self.tell.check("it ended with status 0", self.daemon.stop(60) == 0)
        self.tell.check("its pid file is gone",
                        not self.world.exists(PID_FILE))
        self.tell.check("nothing is left mounted", not self.world.mounts())


def main(arguments):
    if arguments not in ([], ["--shell"], ["--web"]):
        print("usage: scripts/demo [--shell | --web]", file=sys.stderr)
        return 2
    lacks = missing() + [f"the kernel cannot mount {fs}" for fs in ("ext4", "ntfs")
                         if not kernel_has(fs)]
    if lacks:
        print("The demo cannot run here:", *lacks, sep="\n  ", file=sys.stderr)
        return 1
    with World() as world:
        # On a router the companion keeps the daemon from ending in long silence.
        world.start_companion()
        print("Starting the daemon in a private world", flush=True)
        try:
            daemon = world.start_daemon()
        except AssertionError as error:
            print(f"The daemon does not start: {error}", file=sys.stderr)
            return 1
        tell = Narrator(lambda: daemon.running)
        if arguments == ["--web"]:
            show_page(world, tell)
        if arguments:
            return Shell(world, daemon, tell, make_disks(world)).run(sys.stdin)
        return tell_story(world, daemon, tell)


def show_page(world, tell):
    """Serve the web interface's page for as long as this process lives."""
    server = PageServer(Plugin(world, stage(PLUGIN_PACKAGE, world.workdir / "plugin")), PAGE_PORT)
    tell.say(f"""
The page is at {server.url} for a browser on this machine. Plug and pull disks
here, look and remove them there. A small stand-in takes the place of LuCI's menu and
theme; plugin, page and access rights are the real ones.
  {server.url}?user=reader    an account that may only look
  {server.url}?lang=de        in German
From another machine: ssh -L {server.port}:127.0.0.1:{server.port} this-machine
""")


def tell_story(world, daemon, tell):
    try:
        Story(world, daemon, tell).run()
    except Failed:
        tell.say("   the story ends here")
    except AssertionError as error:
        tell.check(str(error), False)
    if tell.failed:
        tell.say(f"\nThe daemon's log ends:\n{daemon.log()[-LOG_TAIL:]}")
    return tell.summary()


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
