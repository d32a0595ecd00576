"""A router for the web interface: a private world with busybox and jshn on which the plugin is installed."""

import contextlib
import json
import os
import shutil
import subprocess

from world import CHECKOUT, wait_for
from world.events import PIPES
from world.overlay import overlay
from world.state import PID_FILE
from world.tools import STUB_DIR

OPENWRT = CHECKOUT / "openwrt"
BUILDROOT = CHECKOUT / "tests/openwrt/buildroot"
PLUGIN_PACKAGE = "rpcd-mod-tarn-nas-diskmanager"
PAGE_PACKAGE = "luci-app-tarn-nas-diskmanager"
OBJECT = "tarn_nas_diskmanager"
PLUGIN = f"/usr/libexec/rpcd/{OBJECT}"
SCRIPTS = "/usr/lib/tarn-nas-diskmanager"
JSHN = CHECKOUT / "build/deps/jshn/bin/jshn"


def stage(package, folder):
    """Let a package's Makefile install into a folder; returns the folder."""
    subprocess.run(["make", "-s", "-C", OPENWRT / package, f"TOPDIR={BUILDROOT}", f"STAGE={folder}",
                    f"install-{package}"], check=True, capture_output=True, text=True)
    return folder / "root"


class Plugin:
    """The plugin on one world, called as rpcd calls it."""

    def __init__(self, world, root):
        self.world = world
        if not JSHN.exists():
            raise FileNotFoundError(f"{JSHN} is not built (scripts/setup makes it)")
        world.path(f"{STUB_DIR}/jshn").symlink_to(JSHN)
        for directory in ("/usr/libexec", "/usr/lib"):
            overlay(world, directory)
        world.write(f"{SCRIPTS}/pipe.sh", (OPENWRT / "tarn-nas-diskmanager/files/pipe.sh").read_text())
        for source in (path for path in root.rglob("*") if path.is_file()):
            target = world.path("/" + str(source.relative_to(root)))
            target.parent.mkdir(parents=True, exist_ok=True)
            shutil.copy(source, target)

    def methods(self):
        """The methods and their arguments, as the plugin declares them."""
        return json.loads(self.world.run(PLUGIN, "list").stdout)

    def call(self, method, arguments=None, timeout=20):
        """The answer to a call."""
        return json.loads(self.call_text(method, json.dumps(arguments or {}), timeout))

    def error(self, method, arguments=None):
        """The word for why a call did nothing; empty when it did."""
        return self.call(method, arguments).get("error", "")

    def call_text(self, method, text, timeout=20):
        """What the plugin prints when it is given `text` as its arguments."""
        done = self.world.run(PLUGIN, "call", method, input_text=text, timeout=timeout)
        assert not done.stderr, done.stderr
        return done.stdout

    def list(self):
        return self.call("list")

    def parts(self):
        """Listed partitions by device name."""
        return {part["dev_name"]: part for disk in self.list()["disk"] for part in disk["part"]}

    def unused(self):
        """{device name: reason} of what is not listed."""
        return {entry["dev_name"]: entry["reason"] for entry in self.list()["unused"]}


class Listener:
    """A process that holds the daemon's pipe and pid file as the daemon does, and never reads."""

    _SCRIPT = ("mkdir -p /tmp/tarn_nas; mkfifo {pipe}; exec 3<>{pipe};"
               " printf %s $$ >/tmp/tarn_nas/disk_manager_pid; exec sleep 1000")

    def __init__(self, world):
        self.world = world
        self.pipe = world.path(PIPES["safe_remove"])
        self._process = world.popen("/bin/sh", "-c", self._SCRIPT.format(pipe=PIPES["safe_remove"]),
                                    stdin=subprocess.DEVNULL)
        wait_for(lambda: world.exists(PID_FILE) and world.read(PID_FILE), 10, "the listener")

    def received(self):
        """The lines that lie in the pipe, which is then empty."""
        fd = os.open(self.pipe, os.O_RDWR | os.O_NONBLOCK)
        try:
            return os.read(fd, 65536).decode().splitlines()
        except BlockingIOError:
            return []
        finally:
            os.close(fd)

    def fill(self):
        """Let nothing more go into the pipe."""
        fd = os.open(self.pipe, os.O_RDWR | os.O_NONBLOCK)
        try:
            for size in (4096, 1):
                with contextlib.suppress(BlockingIOError):
                    while True:
                        os.write(fd, b"\n" * size)
        finally:
            os.close(fd)

    def close(self):
        with contextlib.suppress(ProcessLookupError):
            os.killpg(self._process.pid, 9)
        self._process.wait(10)
        # What holds the pipe may end a moment after the process that brought it into the world.
        wait_for(lambda: not self._is_there(), 10, "the listener's end")

    def _is_there(self):
        # A test may have put something else in its place.
        if not self.pipe.is_fifo():
            return False
        try:
            os.close(os.open(self.pipe, os.O_WRONLY | os.O_NONBLOCK))
        except OSError:
            return False
        return True
