"""A router on which disks come and go while its daemon is killed and started again."""

import contextlib
import os
import random
import threading
import time
import uuid

from shared.file_events import FileEvents
from shared.published import objections

from world import PIPES, DaemonGone, Partition, WaitTimeout, state
from world.state import DB_JOURNAL, DISK_DB, DISK_JSON, PID_FILE, STATUS_NEW

KERNEL_NAMES = ["sda", "sdb", "sdc", "sdd", "sde"]
# Those of a cycle and that of the start.
SCRATCH = [*state.SCRATCH, "/tmp/disk_pid_tmp"]
# Instants to kill at: a file of the daemon's and at most how many of its events to let pass.
DATABASE_INSTANTS = [("/etc/config/tarn_nas", "disk.db-journal", 24),
                     ("/etc/config/tarn_nas", "disk.db-journal", 4),
                     ("/etc/config/tarn_nas", "disk.db", 8)]
FILE_INSTANTS = [*DATABASE_INSTANTS, *DATABASE_INSTANTS,
                 ("/tmp/tarn_nas", "status.new", 12), ("/tmp/tarn_nas", "disk.json", 3),
                 ("/tmp/tarn_nas", "disk_manager_pid", 2), ("/tmp/tarn_nas", "pipe_disk_remove", 2),
                 ("/tmp", "mount.txt", 30), ("/tmp", "disk_uid.txt", 20), ("/tmp", "out.txt", 20),
                 ("/tmp", "tmp_blkid", 20), ("/tmp", "disk_pid_tmp", 3)]
START_UP_SECONDS = 9
# No kill is later, with the time that the last events before it may take.
STORM_SECONDS = 60
SCAN_TIMEOUT, CYCLE_TIMEOUT = 90, 30
SELF_CHECK = ("dev not find, dev = ", "mount path err:")
# What the last of these texts in the log says about the moment of a kill.
PHASES = {"pid Not exist": "start-up", "pid exist": "start-up", "scan path = ": "discovery",
          "add dev name = ": "discovery", "mout path = ": "mount", "mount OK, ": "between mounts",
          "sql = ": "database write", "db table already exist": "database",
          "get part num": "publication", "no event": "wait", "get event = ": "event",
          "==> umount dev": "removal", "init.d": "services", "umount -f": "clean-up"}


class StormyRouter:
    """Four partitions on three disks, each with the one directory that it must always have.

    As long as a partition has no row all disks stay plugged: then the numbers are those of the
    sizes, whenever the row is made.  From then on only the row can explain the directory, since a
    run that finds fewer disks, or others first, counts them differently.
    """

    def __init__(self, world, seed):
        self.world = world
        self.random = random.Random(seed)
        uids = [str(uuid.UUID(int=self.random.getrandbits(128), version=4)) for _ in range(4)]
        names = ["disk1_part1", "disk1_part2", "disk2_part1", "disk3_part1"]
        self.remembered = dict(zip(uids, names))
        option = [("-U", uid) for uid in uids]
        self._contents = [
            (world.partitioned_disk(Partition("ext4", 1400, options=option[0]),
                                    Partition("ext4", 1200, options=option[1])), uids[:2]),
            (world.partitioned_disk(Partition("ext4", 1300, options=option[2])), uids[2:3]),
            (world.whole_disk("ext4", 1100, options=option[3]), uids[3:])]
        self.daemon = None
        self.self_checks = 0
        # Made by the first run anyway; here so that its writes can be watched.
        world.run("mkdir", "-p", "/etc/config/tarn_nas")
        self.plug_all()

    # Disks.

    def plugged(self):
        return [disk for disk, _ in self._contents if disk.name]

    def expected(self):
        """{device: directory name} of the partitions that are plugged."""
        devices = {}
        for disk, uids in self._contents:
            if disk.name:
                names = disk.device_names()[-len(uids):]
                devices.update((name, self.remembered[uid]) for name, uid in zip(names, uids))
        return devices

    def plug_all(self):
        for disk, _ in self._contents:
            if not disk.name:
                self.world.plug(disk, self._free_name())

    def shuffle(self):
        """Other disks under other names, as after a night without power; nobody tells."""
        if len(self.world.db_rows()) < len(self.remembered):
            self.plug_all()
            return
        for disk, _ in self._contents:
            if disk.name and self.random.random() < 0.5:
                self.world.pull(disk, surprise=False)
        for disk, _ in self._contents:
            if not disk.name and self.random.random() < 0.65:
                self.world.plug(disk, self._free_name())

    def _free_name(self):
        used = {disk.name for disk, _ in self._contents}
        return self.random.choice([name for name in KERNEL_NAMES if name not in used])

    # Runs of the daemon.

    def start(self):
        """Start it over whatever the last run left, as its init script does."""
        self.daemon = self.world.start_daemon(wait=False)

    def start_and_settle(self):
        """Start it and hold everything against what is remembered."""
        world, begun = self.world, time.time()
        self.start()
        self._wait_scanned()
        world.wait(lambda: self._status_is_sound(begun), CYCLE_TIMEOUT, "a valid disk.json")
        paths = {f"/dev/{name}": f"/tmp/mountd/{place}" for name, place in self.expected().items()}
        world.wait(lambda: world.mounted() == paths, 30,
                   lambda: f"{paths} mounted, where {world.mounted()} is")
        assert len(world.mounts()) == len(paths), world.mounts()
        world.wait(lambda: self._published() == self.expected(), 30,
                   lambda: f"{self.expected()} in disk.json, where {self._published()} stands")
        world.wait(lambda: not self._used_scratch(), 10,
                   lambda: f"the end of {self._used_scratch()}")
        assert world.read(PID_FILE) == str(self.daemon.pid)
        assert all(world.path(pipe).is_fifo() for pipe in PIPES.values())
        self.check_rows()
        known = {row["uid"] for row in world.db_rows()}
        assert known >= self._plugged_uids()

    def restart(self):
        """End it in good order, move disks about, and start it without waiting."""
        self.daemon.stop()
        if self.random.random() < 0.3:
            # May be done by hand at any time. What follows are the first rows again.
            self.world.run("rm", "-f", DISK_DB)
        self.shuffle()
        self.start()

    def _wait_scanned(self):
        """Until the loop's first wait: the scan and what it publishes are over."""
        try:
            self.daemon.wait_log("no event ...", SCAN_TIMEOUT)
        except DaemonGone:
            log = self.daemon.log()
            assert "===> pid exist" in log, log
            # By chance the old pid is part of a new one. The init script deletes the file first.
            assert self._pid_text(log) in log.split("pid sets = ")[1].split("cur pid = ")[0]
            self.world.run("rm", "-f", PID_FILE)
            self.start()
            self.daemon.wait_log("no event ...", SCAN_TIMEOUT)

    @staticmethod
    def _pid_text(log):
        return log.split("cur pid = ")[1].split("\n")[0]

    # Checks.

    def check_rows(self):
        """A sound file, no row twice, none cut, each with the one directory of its partition."""
        fault = self.world.db_fault()
        assert not fault, fault
        for row in self.world.db_rows():
            place = self.remembered[row["uid"]]
            assert (row["disk_name"], row["mount_path"]) == (place, f"/tmp/mountd/{place}"), row
            assert row["dev_name"] and row["mountd"] in ("yes", "no"), row

    def _has_journal(self):
        """True when a transaction was cut off between its first write and its end."""
        journal = self.world.path(DB_JOURNAL)
        return journal.exists() and journal.stat().st_size > 0

    def _plugged_uids(self):
        return {uid for disk, uids in self._contents if disk.name for uid in uids}

    def _status_is_sound(self, begun):
        document = self.world.disk_json()
        # The kernel's file times lag behind by a tick.
        fresh = self.world.path(DISK_JSON).stat().st_mtime >= begun - 0.05
        return fresh and document is not None and objections(document) == []

    def _published(self):
        return {name: part.disk_name for name, part in self.world.parts().items()}

    def _scratch(self):
        return [path for path in SCRATCH if self.world.exists(path)]

    def _used_scratch(self):
        """Scratch files that this run has written; others keep what lies there until a query."""
        log = self.daemon.log()
        return [path for path in self._scratch() if f"> {path}\n" in log]

    # The storm.

    def storm(self, actions=True):
        """Disks come and go until the daemon is killed.

        Returns what it was doing, or "" when its self-check had ended it before.
        """
        instant, killer = self._prepare_kill()
        killer.start()
        deadline = time.monotonic() + STORM_SECONDS
        while self.daemon.running:
            assert time.monotonic() < deadline, f"not killed {instant}"
            if actions:
                self._act()
            else:
                time.sleep(0.05)
        killer.join()
        if self.daemon.returncode == -9:
            return self._phase()
        log = self.daemon.log()
        assert self.daemon.returncode == 0 and any(text in log for text in SELF_CHECK), instant
        return ""

    def after_the_end(self):
        """What holds at once, before anybody has cleaned up.  Returns what is left to clean."""
        world = self.world
        # A supervisor starts the next run seconds later: commands of the dead one have ended.
        world.wait(lambda: not self._orphans(), 20, "the last command of the killed daemon")
        self.check_rows()
        # Whatever the instant, a reader finds a whole document.
        assert not world.exists(DISK_JSON) or world.disk_json() is not None
        if any(text in self.daemon.log() for text in SELF_CHECK):
            self.self_checks += 1
            self.plug_all()
        left = {"stale pid file": world.exists(PID_FILE), "mounts": bool(world.mounts()),
                "scratch file": bool(self._scratch()), "cut-off transaction": self._has_journal(),
                "status file on its way": world.exists(STATUS_NEW),
                "no database file": not world.exists(DISK_DB)}
        return [name for name, holds in left.items() if holds]

    def litter(self):
        """Leave what a kill at a moment too short to be met by chance would leave."""
        if self.random.random() < 0.2 and self.world.exists(DISK_JSON):
            text = self.world.read(DISK_JSON)
            self.world.write(STATUS_NEW, text[:self.random.randrange(len(text) + 1)])
        for path in SCRATCH:
            if self.random.random() < 0.2:
                self.world.write(path, '/dev/sda: UUID="stale" TYPE="ntfs"\n' * 3)

    def _orphans(self):
        return self.world.read("/proc/1/task/1/children")

    def _prepare_kill(self):
        """A thread that kills at a moment, or at a file event, or when neither comes."""
        daemon, moment = self.daemon, self.random.uniform(0, START_UP_SECONDS)
        # The first rows are worth more kills than their few milliseconds would get by chance.
        first_rows = not self.world.exists(DISK_DB) and self.random.random() < 0.7
        folder, name, most = self.random.choice(
            DATABASE_INSTANTS if first_rows else FILE_INSTANTS)
        count = self.random.randint(1, most)
        chance = self.random.random()
        if chance < 0.3 and not first_rows or not self.world.exists(folder):
            return f"after {moment:.3f} s", threading.Timer(moment, daemon.kill)
        events = FileEvents(self.world.path(folder))

        def kill_at_event():
            with events:
                # A transaction takes some hundred microseconds: nobody may come in between.
                with contextlib.suppress(PermissionError):
                    os.setpriority(os.PRIO_PROCESS, threading.get_native_id(), -20)
                events.wait(name, count, START_UP_SECONDS)
                daemon.kill()
        return f"at event {count} of {name}", threading.Thread(target=kill_at_event)

    def _phase(self):
        log = self.daemon.log()
        places = {log.rfind(text): phase for text, phase in PHASES.items()}
        return places[max(places)] if max(places) >= 0 else "start-up"

    def _act(self):
        absent = [disk for disk, _ in self._contents if not disk.name]
        present = self.plugged()
        choice = self.random.random()
        try:
            if choice < 0.35 and absent:
                disk = self.random.choice(absent)
                self.world.plug(disk, self._free_name())
                self._send(*[f"#add:{name}" for name in disk.device_names()])
            elif choice < 0.6 and present:
                messages = self.world.pull(self.random.choice(present),
                                           surprise=self.random.random() < 0.2)
                self._send(*messages)
            elif choice < 0.7 and present:
                self._send(f"#remove_dev:{self.random.choice(present).device_names()[-1]}")
            elif choice < 0.78:
                self._send(f"#remove_disk:{self.random.choice(list(self.remembered.values()))}")
            elif choice < 0.84:
                self._send("#safe_remove")
            elif choice < 0.92 and present:
                self._send(f"#add:{self.random.choice(present).device_names()[-1]}")
            else:
                self._send("#heart_beat")
        except WaitTimeout:
            # Nobody reads any more: it has been killed.
            pass
        time.sleep(self.random.uniform(0, 0.6))

    def _send(self, *messages):
        self.world.send(*messages, timeout=1)
