"""What the daemon and the kernel say about a world, read from outside."""

import contextlib
import json
import re
import sqlite3
import time
from dataclasses import dataclass
from pathlib import Path

DISK_JSON = "/tmp/tarn_nas/disk.json"
DISK_NUM = "/tmp/tarn_nas/disk_num.txt"
DISK_DB = "/etc/config/tarn_nas/disk.db"
PID_FILE = "/tmp/tarn_nas/disk_manager_pid"
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
    """One published partition, with the disk's flag beside its own seven values."""

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
    return [StatusPart(sd_card=disk["sd_card"], **part)
            for disk in document["disk"] for part in disk.get("part", [])]


def _unescape(text):
    return re.sub(r"\\([0-7]{3})", lambda match: chr(int(match.group(1), 8)), text)


def load_json(text):
    """The document, or None while it is being rewritten."""
    try:
        return json.loads(text)
    except json.JSONDecodeError:
        return None


def open_db(content):
    """A connection on a copy of a database file's bytes.

    SQLite resolves every link of a path by itself, /proc/PID/root included, and
    would open the machine's own file; so the bytes are read here instead.
    """
    connection = sqlite3.connect(":memory:")
    if content:
        connection.deserialize(content)
    connection.row_factory = sqlite3.Row
    return connection


class Observed:
    """What can be seen of a world.  The heir has `keeper_pid` and the file
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

    def db_rows(self):
        """Rows of the table "disk" as dicts in stored order; [] without a database.

        Raises sqlite3.DatabaseError for a file that stays unreadable for 2 s.
        """
        for _ in range(40):
            # The bytes may be read in the middle of one of the daemon's writes.
            with contextlib.suppress(sqlite3.DatabaseError):
                return self._db_rows_now()
            time.sleep(0.05)
        return self._db_rows_now()

    def _db_rows_now(self):
        if not self.exists(DISK_DB):
            return []
        with contextlib.closing(open_db(self.path(DISK_DB).read_bytes())) as database:
            return [dict(row) for row in database.execute("select * from disk")]

    def db_execute(self, statement, values=()):
        """Change the database file; the daemon must not be at it meanwhile."""
        target = self.path(DISK_DB)
        target.parent.mkdir(parents=True, exist_ok=True)
        content = target.read_bytes() if target.exists() else b""
        with contextlib.closing(open_db(content)) as database:
            with database:
                database.execute(statement, values)
            target.write_bytes(database.serialize())
