"""What the daemon and the kernel say about a world, read from outside."""

import contextlib
import json
import re
import sqlite3
import tempfile
from collections import Counter
from dataclasses import dataclass
from pathlib import Path

from .waiting import wait_for

DISK_JSON = "/tmp/tarn_nas/disk.json"
DISK_NUM = "/tmp/tarn_nas/disk_num.txt"
STATUS_NEW = "/tmp/tarn_nas/status.new"
DISK_DB = "/etc/config/tarn_nas/disk.db"
DB_JOURNAL = DISK_DB + "-journal"
PID_FILE = "/tmp/tarn_nas/disk_manager_pid"
# What the commands of a cycle answered stands in these until it is read.
SCRATCH = ("/tmp/mount.txt", "/tmp/tmp_blkid", "/tmp/out.txt", "/tmp/disk_uid.txt")
MOUNT_BASE = "/tmp/mountd"


@dataclass(frozen=True)
class Mount:
    """One line of the kernel's mount list."""

    dev: str
    path: str
    fs: str
    options: str


@dataclass(frozen=True)
class StatusPart:
    """One published partition, with the disk's flag beside its own first seven values."""

    dev_name: str
    disk_name: str
    fs_type: str
    uid: str
    label: str
    total_len: int
    free_size: int
    sd_card: int

    @property
    def path(self):
        return f"{MOUNT_BASE}/{self.disk_name}"


def parse_mounts(text):
    """Mount records from the text of /proc/PID/mounts."""
    fields = (line.split(" ") for line in text.splitlines())
    return [Mount(*(_unescape(value) for value in values[:4])) for values in fields]


def parse_parts(document):
    """Flat list of the partitions of a parsed disk.json."""
    return [StatusPart(sd_card=disk["sd_card"],
                       **{key: value for key, value in part.items()
                          if key in StatusPart.__dataclass_fields__})
            for disk in document["disk"] for part in disk.get("part", [])]


def _unescape(text):
    return re.sub(r"\\([0-7]{3})", lambda match: chr(int(match.group(1), 8)), text)


def load_json(text):
    """The document, or None while it is being rewritten."""
    try:
        return json.loads(text)
    except json.JSONDecodeError:
        return None


class Observed:
    """What can be seen of a world.  The heir has `keeper_pid`, `workdir` and the file
    operations `path`, `read` and `exists`."""

    def mounts(self, under=MOUNT_BASE):
        """The world's mounts at or below a directory, oldest first."""
        text = Path(f"/proc/{self.keeper_pid}/mounts").read_text()
        return [entry for entry in parse_mounts(text)
                if entry.path == under or entry.path.startswith(under.rstrip("/") + "/")]

    def mounted(self):
        """{device path: mount path} below the mount base."""
        return {entry.dev: entry.path for entry in self.mounts()}

    def disk_json(self):
        """The published document, None when there is none or half of one."""
        return load_json(self.read(DISK_JSON)) if self.exists(DISK_JSON) else None

    def parts(self):
        """Published partitions by device name."""
        document = self.disk_json()
        return {part.dev_name: part for part in parse_parts(document)} if document else {}

    def disk_num(self):
        """Text of the count file, None when there is none."""
        return self.read(DISK_NUM) if self.exists(DISK_NUM) else None

    @contextlib.contextmanager
    def db_copy(self):
        """A connection on a copy of the database as it is now, an empty one without a file.

        A copy, since SQLite resolves every link of a path by itself, /proc/PID/root
        included, and since opening a cut-off transaction rolls it back, which is the
        daemon's to do.  The journal goes with the file: only the two together are the
        database.
        """
        with tempfile.TemporaryDirectory(prefix="db-", dir=self.workdir) as folder:
            copy = Path(folder, "disk.db")
            for path, content in zip((copy, Path(f"{copy}-journal")), self._db_files()):
                if content is not None:
                    path.write_bytes(content)
            with contextlib.closing(sqlite3.connect(copy)) as connection:
                connection.row_factory = sqlite3.Row
                yield connection

    def db_rows(self):
        """Rows of the table "disk" as dicts in stored order; [] without file or table.

        Raises sqlite3.DatabaseError for a file that is no sound database.
        """
        with self.db_copy() as database:
            return [dict(row) for row in _rows(database)]

    def db_fault(self):
        """What is wrong with the database, as a text; empty when nothing is."""
        with self.db_copy() as database:
            verdict = [row[0] for row in database.execute("pragma integrity_check")]
            if verdict != ["ok"]:
                return f"integrity_check: {verdict}"
            uids = Counter(row["uid"] for row in _rows(database))
        twice = [uid for uid, times in uids.items() if times > 1]
        return f"rows of {twice} more than once" if twice else ""

    def db_execute(self, statement, values=()):
        """Change the database file; the daemon must not be at it meanwhile."""
        target = self.path(DISK_DB)
        target.parent.mkdir(parents=True, exist_ok=True)
        with self.db_copy() as database:
            with database:
                database.execute(statement, values)
            target.write_bytes(database.serialize())

    def _db_files(self):
        """The bytes of file and journal, None for one that is not there.

        While the daemon writes, only what two looks in a row find belongs together.
        """
        def look():
            first, second = ([_content(self.path(path)) for path in (DISK_DB, DB_JOURNAL)]
                             for _ in range(2))
            return first if first == second else None
        return wait_for(look, 10, f"{DISK_DB} to rest", 0.01)


def _content(path):
    try:
        return path.read_bytes()
    except FileNotFoundError:
        return None


def _rows(database):
    """All rows; none while the table is not made yet."""
    made = database.execute("select 1 from sqlite_master where name='disk'").fetchall()
    return database.execute("select * from disk").fetchall() if made else []
