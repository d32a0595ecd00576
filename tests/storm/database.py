"""The partition database as a daemon that was killed left it."""

import contextlib
import shutil
import sqlite3
import tempfile
from pathlib import Path

from world.state import DISK_DB

JOURNAL = DISK_DB + "-journal"
COLUMNS = ("uid", "dev_name", "disk_name", "mount_path", "mountd")


def has_journal(world):
    """True when a transaction was cut off between its first write and its end."""
    return world.exists(JOURNAL) and world.path(JOURNAL).stat().st_size > 0


def integrity(world):
    """What `PRAGMA integrity_check` says, "ok" for a sound file or none."""
    return _ask(world, "PRAGMA integrity_check", lambda rows: rows[0][0], "ok")


def rows(world):
    """Rows as dicts, as the next run will find them; [] without file or table."""
    if _ask(world, "select count(*) from sqlite_master where name='disk'",
            lambda answer: answer[0][0], 0) == 0:
        return []
    return _ask(world, f"select {','.join(COLUMNS)} from disk",
                lambda answer: [dict(zip(COLUMNS, row)) for row in answer], [])


def _ask(world, statement, reading, without_file):
    """Reads a copy, since opening a cut-off transaction rolls it back, which is the daemon's to do.

    The journal goes with the file: only the two together are the database.
    """
    if not world.exists(DISK_DB):
        return without_file
    with tempfile.TemporaryDirectory(prefix="tarn-db-") as folder:
        copy = Path(folder) / "disk.db"
        for place, target in ((DISK_DB, copy), (JOURNAL, Path(f"{copy}-journal"))):
            with contextlib.suppress(FileNotFoundError):
                shutil.copyfile(world.path(place), target)
        with contextlib.closing(sqlite3.connect(copy)) as connection:
            return reading(connection.execute(statement).fetchall())
