"""A router for the package's scripts: a private world with busybox, rc.common and a small procd."""

import re
import shutil
import subprocess
from pathlib import Path

from world import CHECKOUT, wait_for
from world.events import PIPES
from world.overlay import overlay

HERE = Path(__file__).resolve().parent
PACKAGE = "tarn-nas-diskmanager"
FEED_DIR = CHECKOUT / "openwrt" / PACKAGE
INIT = "/etc/init.d/tarn_nas_diskmanager"
HOTPLUG = "/etc/hotplug.d/block/60-tarn_nas_diskmanager"
PROG = "/usr/bin/tarn_nas_diskmanager"
CONFIG = "/etc/config/tarn_nas_diskmanager"
HELPERS = "/usr/lib/tarn-nas-diskmanager"
HEART_BEAT = f"{HELPERS}/heart_beat"
BEAT = "#heart_beat"


class Buildroot:
    """Runs the package's Makefile with stand-ins for OpenWrt's include files."""

    def __init__(self, directory, program):
        self.top = Path(directory)
        shutil.copytree(HERE / "buildroot", self.top)
        compiled = self.top / "stage/install/usr"
        (compiled / "bin").mkdir(parents=True)
        (compiled / "lib").mkdir()
        shutil.copy(program, compiled / "bin/tarn_nas_diskmanager")
        library = Path(program).parent / "libtarn-utils.so"
        if library.exists():
            shutil.copy(library, compiled / "lib")
        else:
            (compiled / "lib/libtarn-utils.so").write_text("")

    def make(self, *words, feed=FEED_DIR):
        """Run make on a target of the package; returns what it printed."""
        return subprocess.run(["make", "-s", "-C", feed, f"TOPDIR={self.top}", *words],
                              check=True, capture_output=True, text=True).stdout

    def show(self, package, *words, feed=FEED_DIR):
        """{field: text} of a package."""
        lines = self.make(f"show-{package}", *words, feed=feed).splitlines()
        return dict((line + " ").split(" ", 1) for line in lines)

    def install(self, *packages):
        """Run install sections; returns the root directory that they filled."""
        self.make(*(f"install-{package}" for package in packages))
        return self.top / "stage/root"

    def provides(self, package, *words):
        """Names of libraries that the package's programs may need, by its own account."""
        return set(self.make(f"provides-{package}", *words).split())


class Router:
    """A world on which the staged package lies and the scripts run under busybox ash.

    With `full_log` everything that the daemon says arrives in `output`.
    """

    def __init__(self, world, root, full_log=False):
        self.world = world
        # Both directories are the machine's own until an overlay covers them.
        self.world.label_script("")
        overlay(self.world, "/usr/lib")
        for source in sorted(path for path in root.rglob("*") if path.is_file()):
            target = self.world.path("/" + str(source.relative_to(root)))
            target.parent.mkdir(parents=True, exist_ok=True)
            shutil.copy(source, target)
        self._lay_procd()
        if full_log:
            self.set_full_log("1")

    def _lay_procd(self):
        self.world.write("/etc/rc.common", (HERE / "router/rc.common").read_text(), 0o755)
        self.world.write("/usr/lib/functions/procd.sh", (HERE / "router/procd.sh").read_text())
        self.world.write("/usr/lib/procd_supervise", (HERE / "router/procd_supervise").read_text())
        self.world.write("/run/procd/respawn_delay", "1")

    def set_full_log(self, value):
        """Set the package's option as uci does."""
        self.world.write(CONFIG, f"config log 'log'\n\toption full '{value}'\n")

    def beat_interval(self):
        """Seconds between two messages of the installed script."""
        text = self.world.read(HEART_BEAT)
        return int(re.search(r"^EVERY=(\d+)$", text, re.MULTILINE).group(1))

    def beat_every(self, seconds):
        """Let the installed script write more often."""
        old, new = (f"\nEVERY={value}\n" for value in (self.beat_interval(), seconds))
        self.world.write(HEART_BEAT, self.world.read(HEART_BEAT).replace(old, new), 0o755)

    # The service.

    def service(self, action, timeout=100):
        """Run the init script; returns its CompletedProcess."""
        return self.world.run(INIT, action, timeout=timeout)

    def start(self):
        """Start the service and wait until the daemon has its pipe open."""
        self.service("start")
        return self.wait_ready()

    def wait_ready(self, but=()):
        """Wait for a daemon that is none of `but` and has opened its pipe; returns its pid."""
        def ready():
            pids = [pid for pid in self.pids() if pid not in but]
            return pids and any(PIPES["add_remove"] in line for line in self.open_files(pids[0])) and pids[0]
        return wait_for(ready, 20, "a daemon with an open pipe")

    def instance_pid(self, name):
        """Pid that procd knows of an instance, or None when that process has ended."""
        pid = int(self.world.read(f"/run/procd/instances/{name}/pid"))
        return pid if self.world.run("readlink", f"/proc/{pid}/exe", check=False).stdout else None

    def pids(self):
        """Pids of the daemon, as the router sees them.

        A child carries its program until it has become the command that it was made for.
        """
        script = (f'for exe in /proc/[0-9]*/exe; do [ "$(readlink $exe)" = {PROG} ] && '
                  'sed -n "s/^PPid:[[:space:]]*//p" ${exe%exe}status && echo $exe; done')
        lines = self.world.sh(script, check=False).stdout.split()
        parents = {int(path.split("/")[2]): int(parent) for parent, path in zip(lines[::2], lines[1::2])}
        return [pid for pid, parent in parents.items() if parent not in parents]

    def open_files(self, pid):
        """Targets of a process's descriptors."""
        return self.world.sh(f"for fd in /proc/{pid}/fd/*; do readlink $fd; done",
                             check=False).stdout.split()

    def mode(self, *words):
        """Make the stand-in difficult; see there."""
        self.world.write("/tmp/mode", " ".join(words) + "\n")

    def notes(self):
        """Lines that the stand-in noted, without the messages that only say that somebody is there."""
        return [line for line in self._all_notes() if line != BEAT]

    def beats(self):
        """How many of those messages it read."""
        return self._all_notes().count(BEAT)

    def _all_notes(self):
        # A line that it is still noting is none yet.
        text = self.world.read("/tmp/notes") if self.world.exists("/tmp/notes") else ""
        return text[:text.rfind("\n") + 1].splitlines()

    def output(self):
        """What came to procd from all instances."""
        return self.world.read("/run/procd/output") if self.world.exists("/run/procd/output") else ""

    def procd_calls(self):
        """Calls of procd's functions so far."""
        return self.world.read("/run/procd/calls").splitlines()

    # Kernel events.

    def uevent(self, action, name, devtype="partition", timeout=20):
        """Let a kernel event arrive as hotplug-call hands it on."""
        self.world.run("env", f"ACTION={action}", f"DEVNAME={name}", f"DEVTYPE={devtype}",
                       "SUBSYSTEM=block", "/bin/sh", "-c", f"( . {HOTPLUG} )", timeout=timeout)

    def messages(self):
        """Messages that the stand-in read from its pipe."""
        return [line for line in self.notes() if line.startswith("#")]
