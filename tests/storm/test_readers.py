"""Readers in a tight loop while the status is published thousands of times, through kills and a
full /tmp: each look finds a whole document."""

import json
import random
import subprocess
import sys
import time
from pathlib import Path

import pytest
from shared import preload
from shared.published import text_objections

from world import CHECKOUT, Partition
from world.state import DISK_JSON, DISK_NUM, PID_FILE, STATUS_NEW

READER = CHECKOUT / "tests/shared/tight_reader.py"
PUBLICATIONS = 10_000
KILLS = {"short": 40, "long": 400}
# The clock, and how much shorter each wait for an event is: a publication each few milliseconds, a
# mount pass each 150.
HASTE, HASTE_WAITS = 20, 3000
# After so long without a change each cycle publishes.
QUIET_SECONDS = 30 / HASTE
FAILURE_SECONDS = 15
FULL_EVERY = 4
FAILURES_WANTED = 3
PUBLISHED, FAILED = "clear empty disk", "publish err, fn = /tmp/tarn_nas//disk.json"
FILLER = "/tmp/filler"
NAMES = ("sda", "sdb", "sdc")


@pytest.fixture
def libraries(tmp_path_factory):
    """The folder of the libraries to preload."""
    return preload.build(tmp_path_factory.mktemp("preload"))


class Reader:
    """A tight reader of one file of the world."""

    def __init__(self, world, path):
        self._process = subprocess.Popen([sys.executable, READER, world.path(path)],
                                         stdin=subprocess.PIPE, stdout=subprocess.PIPE)

    def stop(self):
        return json.loads(self._process.communicate(timeout=60)[0])


class Publisher:
    """A daemon that publishes as fast as it can, run after run, each over other disks."""

    def __init__(self, world, start_daemon, environ, seed):
        self.world = world
        self.random = random.Random(seed)
        self.published = self.failed = self.kills = self.ends = self.fills = self.left = 0
        self._start, self._environ = start_daemon, environ
        self._daemon = None
        # Few and never mounted: a mount pass is short.
        self._disks = [world.partitioned_disk(Partition("swap", 1001), Partition("swap", 1002))
                       for _ in NAMES]
        world.plug(self._disks[0], NAMES[0])
        world.start_companion()

    def run(self, number):
        """One run: other disks, some publications, perhaps a full /tmp, and SIGKILL."""
        for disk, name in zip(self._disks, NAMES):
            if disk.name and self.random.random() < 0.4:
                self.world.pull(disk, surprise=False)
            elif not disk.name and self.random.random() < 0.6:
                self.world.plug(disk, name)
        if not any(disk.name for disk in self._disks):
            self.world.plug(self._disks[0], NAMES[0])
        # The old one's number can be part of a new one's.
        self.world.run("rm", "-f", PID_FILE)
        self._daemon = self._start(environ=self._environ)
        self._shake()
        if number % FULL_EVERY == 0:
            self._fill()
            self._until(lambda: False, self.random.uniform(0, 1))
        self._end()

    def _fill(self):
        """Publications in a full /tmp, whose room comes back before or after the kill."""
        self.fills += 1
        self.world.sh(f"cat /dev/zero > {FILLER}", check=False)
        self._until(lambda: self._daemon.log().count(FAILED) >= FAILURES_WANTED, FAILURE_SECONDS)
        if self.random.random() < 0.5:
            self._end()
        self.world.path(FILLER).unlink()

    def _shake(self):
        """A kill soon after the start and a change, or after many publications without one."""
        if self.random.random() < 0.5:
            part = f"{next(disk.name for disk in self._disks if disk.name)}2"
            self.world.send(f"#remove_dev:{part}", f"#add:{part}")
            self._until(lambda: False, self.random.uniform(0, QUIET_SECONDS))
        else:
            self._until(lambda: False, self.random.uniform(QUIET_SECONDS, 4 * QUIET_SECONDS))

    def _until(self, condition, seconds):
        """Wait for it, or so long, or until the daemon has ended: without room for the answer
        whether the companion runs, a minute of silence ends it."""
        deadline = time.monotonic() + seconds
        while self._runs() and not condition() and time.monotonic() < deadline:
            time.sleep(0.02)

    def _runs(self):
        return self._daemon is not None and self._daemon.running

    def _end(self):
        if self._daemon is None:
            return
        self.ends += not self._daemon.running
        self.kills += self._daemon.running
        self._daemon.kill()
        log = self._daemon.log()
        failed = log.count(FAILED)
        self.failed += failed
        self.published += log.count(PUBLISHED) - failed
        self.left += self.world.exists(STATUS_NEW)
        self._daemon = None


def test_every_look_finds_a_whole_document_through_kills_and_a_full_tmp(
        world, start_daemon, libraries, request, long_form, figure):
    seed = request.config.getoption("--seed") or 30_000
    figure("seed", seed)
    kills = KILLS["long" if long_form else "short"]
    publisher = Publisher(world, start_daemon,
                          preload.install(world, libraries, "haste", haste=HASTE,
                                          haste_waits=HASTE_WAITS), seed)
    readers = {path: Reader(world, path) for path in (DISK_JSON, DISK_NUM)}
    number = 0
    while publisher.published < PUBLICATIONS or publisher.kills < kills:
        number += 1
        publisher.run(number)
    seen = {path: reader.stop() for path, reader in readers.items()}

    figure("publications", publisher.published)
    figure("failed in a full /tmp", publisher.failed)
    figure("kills", publisher.kills)
    figure("ends of its own in a full /tmp", publisher.ends)
    figure("times /tmp was full", publisher.fills)
    figure("kills that left a file on its way", publisher.left)
    for path, result in seen.items():
        figure(f"looks at {Path(path).name}", result["reads"])
        figure(f"changes seen in {Path(path).name}", result["changes"])
    document, number = seen[DISK_JSON], seen[DISK_NUM]
    assert [fault for text in document["texts"] for fault in text_objections(text)] == []
    assert set(number["texts"]) <= {"1", "2", "3"}
    assert document["missing"] == number["missing"] == 0
    # It was worth looking: many looks for each publication, and documents of all lengths.
    assert document["reads"] > publisher.published
    assert len(document["texts"]) > len(NAMES)
    assert publisher.failed > 0 and publisher.kills > 0
