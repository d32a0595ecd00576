"""What the demo prints: steps, waiting, checks, and the table of partitions."""

import time

from world import DaemonGone, wait_for

_HEADINGS = ("DIRECTORY", "DEVICE", "FILESYSTEM", "LABEL", "SIZE", "FREE", "SD CARD", "MOUNTED AS")


class Failed(Exception):
    """A step did not come true, so the rest of the story makes no sense."""


class Narrator:
    """Prints the story and counts its checks."""

    def __init__(self, daemon_alive):
        self._daemon_alive = daemon_alive
        self._step = 0
        self.passed = 0
        self.failed = 0

    def step(self, text):
        self._step += 1
        self.say(f"\n{self._step}. {text}")

    def say(self, text):
        print(text, flush=True)

    def check(self, text, holds):
        """Print one check; a failed one is counted and the story goes on."""
        if holds:
            self.passed += 1
        else:
            self.failed += 1
        self.say(f"   [{'ok' if holds else 'FAILED'}] {text}")

    def wait(self, condition, timeout, what):
        """Say what is waited for, wait, say how long it took; raises Failed."""
        begun = time.monotonic()
        print(f"   waiting for {what} (at most {timeout} s) ", end="", flush=True)
        tick = _Ticker()

        def look():
            tick()
            if condition():
                return True
            if not self._daemon_alive():
                raise DaemonGone("the daemon has ended")
            return False
        try:
            wait_for(look, timeout, what)
        except AssertionError as error:
            print(flush=True)
            self.check(f"{what}: {error}", False)
            raise Failed(what) from error
        print(f" {time.monotonic() - begun:.1f} s", flush=True)

    def summary(self):
        """Print the closing line; returns the exit status."""
        self.say(f"\n{self.passed} passed, {self.failed} failed")
        return 0 if self.failed == 0 and self.passed > 0 else 1


class _Ticker:
    """A dot each second, so that a waiting demo does not look dead."""

    def __init__(self):
        self._next = time.monotonic() + 1

    def __call__(self):
        if time.monotonic() >= self._next:
            self._next += 1
            print(".", end="", flush=True)


def table(world):
    """Lines of the table made from disk.json and the output of `mount`."""
    listed = mount_listing(world)
    rows = [_HEADINGS]
    for part in sorted(world.parts().values(), key=lambda part: part.disk_name):
        mounted = listed.get(f"/dev/{part.dev_name}", ("", "not mounted"))
        rows.append((part.disk_name, part.dev_name, part.fs_type, part.label,
                     f"{part.total_len} MiB", f"{part.free_size} MiB",
                     "yes" if part.sd_card else "no", mounted[1]))
    if len(rows) == 1:
        return ["   (no partition is published)"]
    widths = [max(len(row[column]) for row in rows) for column in range(len(_HEADINGS))]
    return ["   " + "  ".join(text.ljust(width) for text, width in zip(row, widths)).rstrip()
            for row in rows]


def mount_listing(world):
    """{device: (mount path, type)} as the world's own `mount` prints it."""
    words = (line.split() for line in world.run("mount").stdout.splitlines())
    return {row[0]: (row[2], row[4]) for row in words if len(row) > 4 and row[0].startswith("/dev/")}
