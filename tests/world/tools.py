"""Programs of a world: stubs, recorded commands, init scripts, busybox applets.

The world's PATH begins with STUB_DIR, which is empty at first.  With busybox the
applets' directory comes next.
"""

import functools
import os
import shutil
import subprocess
from pathlib import Path

from .built import CHECKOUT

STUB_DIR = "/run/world/bin"
APPLET_DIR = "/run/world/applets"
COMMAND_LOG = "/run/world/commands.log"
SERVICE_LOG = "/run/world/services.log"
LABEL_SCRIPT = "/usr/bin/disk_get_label.sh"
SYSTEM_PATH = "/usr/sbin:/usr/bin:/sbin:/bin"
BUSYBOX = CHECKOUT / "build/busybox/busybox"
SERVICES = ("samba4", "nas_samba3", "tarn_nas_sys_dl", "tarn_nas_sys_up",
            "tarn_nas_diskmanager", "firewall")
COMPANION = "tarn_nas_sys"

# /proc/uptime and not date: every shell reads it without a process.
_SERVICE_TEXT = """#!/bin/sh
read -r uptime idle < /proc/uptime
echo "{name} $1 $uptime" >> {log}
"""
_RECORD_TEXT = """#!/bin/sh
read -r uptime idle < /proc/uptime
echo "$uptime {name} $*" >> {log}
exec {real} "$@"
"""
# The shell comes under its own path; a router's busybox has no such name.
_NOT_APPLETS = {"sh", "ash", "busybox"}


@functools.cache
def make_busybox():
    """Have the busybox of a router; the first call of all takes half a minute."""
    subprocess.run([Path(__file__).parent / "make_busybox"], check=True, timeout=600)


class Tools:
    """Changes to the programs that the processes of one world find."""

    def __init__(self, root, busybox):
        self._root = Path(root)
        self._applets = _applets() if busybox else set()
        self._in(STUB_DIR).mkdir(parents=True)
        if busybox:
            self._in(APPLET_DIR).mkdir()
            for name in self._applets:
                self._in(APPLET_DIR, name).symlink_to(BUSYBOX)
        self._in("/etc/init.d").mkdir(exist_ok=True)
        for name in SERVICES:
            self.init_script(name, _SERVICE_TEXT.format(name=name, log=SERVICE_LOG))

    @property
    def search_path(self):
        applets = [APPLET_DIR] if self._applets else []
        return ":".join([STUB_DIR, *applets, SYSTEM_PATH])

    def stub(self, name, text):
        """Put a script in front of a program; `text` needs no "#!" line."""
        self._script(f"{STUB_DIR}/{name}", text if text.startswith("#!") else f"#!/bin/sh\n{text}")

    def unstub(self, name):
        """Remove a stub or a recorder; the real program is found again."""
        self._in(STUB_DIR, name).unlink()

    def hide(self, name):
        """Make a program answer as if it were not installed (status 127)."""
        self.stub(name, f'echo "sh: {name}: not found" >&2\nexit 127\n')

    def record(self, *names):
        """Note every call of these programs in the command log, then run them."""
        for name in names:
            self.stub(name, _RECORD_TEXT.format(name=name, log=COMMAND_LOG, real=self.real(name)))

    def real(self, name):
        """Path of the real program, for use inside a stub."""
        if name in self._applets:
            return f"{APPLET_DIR}/{name}"
        found = shutil.which(name, path=SYSTEM_PATH)
        if not found:
            raise FileNotFoundError(f"{name} is not installed")
        return found

    def commands(self):
        """Recorded calls in order, as "name arguments" texts."""
        return [line.split(" ", 1)[1] for line in self._lines(COMMAND_LOG)]

    def init_script(self, name, text):
        """Replace an init script; without this they only note their calls."""
        self._script(f"/etc/init.d/{name}", text)

    def service_calls(self):
        """(name, argument, uptime in seconds) of each init script call, in order."""
        rows = (line.rsplit(" ", 2) for line in self._lines(SERVICE_LOG))
        return [(name, argument, float(uptime)) for name, argument, uptime in rows]

    def clear_logs(self):
        """Forget the calls noted so far."""
        for log in (COMMAND_LOG, SERVICE_LOG):
            self._in(log).unlink(missing_ok=True)

    def companion_program(self):
        """Path of a program that does nothing but carry the companion's name."""
        path = f"/run/world/{COMPANION}"
        if not self._in(path).exists():
            shutil.copy("/usr/bin/sleep", self._in(path))
        return path

    def _in(self, *parts):
        return self._root.joinpath(*(part.lstrip("/") for part in parts))

    def _script(self, path, text):
        # Renamed into place, so that a running call never meets half a script.
        fresh = self._in(path + ".new")
        fresh.write_text(text)
        fresh.chmod(0o755)
        os.replace(fresh, self._in(path))

    def _lines(self, path):
        log = self._in(path)
        return log.read_text().splitlines() if log.exists() else []


def _applets():
    listed = subprocess.run([BUSYBOX, "--list"], capture_output=True, text=True,
                            check=True, timeout=30)
    return {name for name in listed.stdout.split() if "[" not in name} - _NOT_APPLETS
