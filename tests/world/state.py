"""What the daemon and the kernel say about a world, read from outside."""

import json
import re
import sqlite3
from dataclasses import dataclass

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
