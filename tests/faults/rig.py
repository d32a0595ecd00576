"""Two disks and a daemon on which faults are tried, and what must be right again afterwards."""

import time
from pathlib import Path

from shared.moments import quiet_moment
from shared.preload import HASTE

from world import DaemonGone, Partition, WaitTimeout, add_messages

SAFELY_REMOVED = "disk safe remove ..."
BOUND = 90
RECOVERY = 45
# A rescan comes in the first cycle that ends 8 s or more after the last.
WINDOW = (8 + 3 + 2 + 1) / HASTE


class Rig:
    """A world with two partitioned disks; what is right is what the first start made."""

    def __init__(self, world, **options):
        self.world = world
        self.disks = [world.partitioned_disk(Partition("ext4", 1200, "KEPT")),
                      world.partitioned_disk(Partition("ext4", 1100, "MOVED"))]
        for disk, name in zip(self.disks, ("sda", "sdb"), strict=True):
            world.plug(disk, name)
        world.start_companion()
        self.daemon = world.start_daemon(**options)
        self.fds = None
        world.wait(lambda: len(world.parts()) == 2, 30, "two partitions in disk.json")
        self.daemon.wait_rescan()
        self.published = self._published()
        self.fds = sorted(self.daemon.fds().values())

    # What a cycle is made of.

    def busy_cycle(self, enough=lambda: True):
        """All that a cycle holds: removal, addition, mount, publication, rescan, safe removal."""
        self.plug_cycle(enough)
        self.safe_removal()

    def plug_cycle(self, enough=lambda: True):
        """Removal, addition, mount, publication and rescan.

        On a machine with much else to do it lasts until `enough` holds.
        """
        moved = self.disks[1]
        begun = time.monotonic()
        self.world.send(f"#remove_dev:{moved.name}1", *add_messages(moved))
        while (spent := time.monotonic() - begun) < WINDOW or not enough() and spent < BOUND:
            time.sleep(0.05)
        # Nothing was said of the other disk.
        assert self.world.mounted().get("/dev/sda1") == self.paths()["/dev/sda1"]

    def safe_removal(self, timeout=BOUND):
        """Returns when all is unmounted and the daemon waits for the disks to be taken."""
        mark = self.daemon.mark()
        self.world.safe_remove()
        self.daemon.wait_log(SAFELY_REMOVED, timeout, mark)

    def replug(self, by_hand=True):
        """The disks go and come again, as far as the daemon is told.

        A disk that the daemon could not unmount while it was to forget it stays
        mounted; on a router it goes with the device, here by hand.
        """
        for disk in self.disks:
            self.world.send(f"#remove_dev:{disk.name}")
        self.answer()
        left = self.world.mounts()
        assert by_hand or not left, f"{left} are left mounted"
        for entry in left:
            self.world.run("umount", entry.path)
        for disk in self.disks:
            self.world.send(*add_messages(disk))

    def answer(self):
        """Wait until the daemon has read all that was sent: it does not hang."""
        quiet_moment(self.world, self.daemon)

    # What must hold.

    def check(self, fds_kept_open=0, by_hand=True):
        """After a fault: alive, no descriptor lost, and with the next plug all is right."""
        assert self.daemon.running, f"ended with {self.daemon.returncode}"
        self.answer()
        self.replug(by_hand)
        self.wait_right()
        self.check_process(fds_kept_open)

    def check_process(self, fds_kept_open=0):
        """No descriptor and no child is left over."""
        self.world.wait(lambda: len(self.daemon.fds()) == len(self.fds) + fds_kept_open, 10,
                        lambda: f"descriptors {self.fds}, where {self.daemon.fds()} are open")
        children = Path(f"/proc/{self.daemon.outer_pid}/task/{self.daemon.outer_pid}/children")
        self.world.wait(lambda: children.read_text() == "", 10, "no child of the daemon")

    def wait_right(self, timeout=RECOVERY, rows=True):
        """Wait until inventory, mounts and files are as they must be, and the rows if wanted."""
        try:
            self.world.wait(lambda: not self.wrong(rows), timeout, "")
        except WaitTimeout:
            if not self.daemon.running:
                raise DaemonGone(f"ended with {self.daemon.returncode}") from None
            raise AssertionError(f"after {timeout} s: {self.wrong(rows)}") from None

    def wrong(self, rows=True):
        """What is not right, as a text; empty when all is."""
        parts = self._published()
        if parts != self.published:
            return f"disk.json holds {parts}, not {self.published}"
        if self.world.disk_num() != str(len(self.disks)):
            return f"disk_num.txt holds {self.world.disk_num()}"
        if any(part.free_size == 0 for part in self.world.parts().values()):
            return "disk.json lacks the free space"
        if self.world.mounted() != self.paths():
            return f"{self.world.mounted()} is mounted, not {self.paths()}"
        return self.world.db_fault() or (self._wrong_rows() if rows else "")

    def paths(self):
        """{device path: mount path} as it must be."""
        return {f"/dev/{name}": f"/tmp/mountd/{values[0]}"
                for name, values in self.published.items()}

    def _published(self):
        return {name: (part.disk_name, part.fs_type, part.uid, part.label, part.total_len)
                for name, part in self.world.parts().items()}

    def _wrong_rows(self):
        rows = {row["uid"]: row for row in self.world.db_rows()}
        for name, (directory, _, uid, _, _) in self.published.items():
            if uid not in rows:
                return f"no row of {name}"
            if (rows[uid]["disk_name"], rows[uid]["mountd"]) != (directory, "yes"):
                return f"row of {name}: {rows[uid]}"
        return ""
