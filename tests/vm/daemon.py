"""The daemon inside the machine: put there as built, started, asked and stopped."""

import json
import re
import shutil
import subprocess
import tempfile
import time
from pathlib import Path

from vm.vm import VmError

from world import CHECKOUT, PIPES
from world.built import RELEASE
from world.state import DISK_JSON, MOUNT_BASE, PID_FILE

PACKAGE = CHECKOUT / "openwrt" / "tarn-nas-diskmanager" / "files"
LIBRARIES = "lib/x86_64-linux-gnu"
HOTPLUG = "etc/hotplug.d/block/60-tarn_nas_diskmanager"
# The machine's /usr/lib is its /lib.
HELPERS = "lib/tarn-nas-diskmanager"

PIPE = PIPES["add_remove"]

STOPPED = ["samba4 stop", "nas_samba3 stop", "tarn_nas_sys_dl stop", "tarn_nas_sys_up stop"]
STARTED = ["samba4 start", "nas_samba3 start", "tarn_nas_sys_dl start", "tarn_nas_sys_up start"]

# Every mount is looked for in steps of two seconds and every wait for an event takes up to three: eight mounts take a
# minute in an emulated machine that shares its processor with others.
SETTLE_LIMIT = 240
# Each look starts programs in an emulated machine, and the daemon needs its processor too.
LOOK_EVERY = 1


def pack_daemon(archive):
    """An archive to be unpacked over the root file system: the daemon, the libraries it loads, the package's scripts."""
    with tempfile.TemporaryDirectory() as folder:
        root = Path(folder)
        (root / "bin").mkdir()
        (root / LIBRARIES).mkdir(parents=True)
        (root / HOTPLUG).parent.mkdir(parents=True)
        (root / HELPERS).mkdir(parents=True)
        shutil.copy2(RELEASE, root / "bin" / RELEASE.name)
        shutil.copy2(PACKAGE / "tarn_nas_diskmanager.hotplug", root / HOTPLUG)
        shutil.copy2(PACKAGE / "pipe.sh", root / HELPERS / "pipe.sh")
        shutil.copy2(PACKAGE / "disk_get_label.sh", root / "bin" / "disk_get_label.sh")
        (root / "bin" / "disk_get_label.sh").chmod(0o755)

        listed = subprocess.run(["ldd", RELEASE], capture_output=True, text=True, check=True).stdout

        for library in re.findall(r"=> (/\S+)", listed):
            shutil.copy2(library, root / LIBRARIES / Path(library).name)

        names = "\n".join(str(path.relative_to(root)) for path in sorted(root.rglob("*")))

        with open(archive, "wb") as out:
            subprocess.run(["cpio", "--quiet", "-o", "-H", "newc", "-R", "0:0"], cwd=root, input=names.encode(),
                           stdout=out, check=True)


class Daemon:
    """Drives the daemon of one machine."""

    def __init__(self, vm):
        self.vm = vm

    def start(self):
        self.vm.check("/bin/start_daemon &")
        self.vm.wait(f"[ -p {PIPE} ] && [ -s {PID_FILE} ]")

    def start_companion(self):
        self.vm.check("/bin/tarn_nas_sys >/dev/null 2>&1 &")

    def interrupt(self):
        """Interrupts the wait for events: while the daemon runs a command, the C library ignores the signal."""
        self._signal_listening("INT")

    def stop(self):
        """Ends the daemon as its start script does and returns its exit status."""
        self.interrupt()
        self.vm.wait("grep -q 'get sig = SIGINT, c = 0' /tmp/daemon.log")
        self.interrupt()
        return int(self.vm.wait("cat /tmp/daemon.status", SETTLE_LIMIT))

    def pull_usb(self, name):
        self.vm.pull_usb(name)

    def eject_card(self):
        self.vm.eject_card()

    def send(self, message):
        self.vm.check(f"echo '{message}' >{PIPE}")

    def log(self):
        return self.vm.run("cat /tmp/daemon.log").output

    def services(self):
        return self.vm.run("cat /tmp/services 2>/dev/null").output.splitlines()

    def status(self):
        """The published document, or None while it is being written."""
        try:
            return json.loads(self.vm.run(f"cat {DISK_JSON}").output)
        except ValueError:
            return None

    def parts(self):
        """The published partitions by label."""
        status = self.status() or {"disk": []}
        return {part["label"]: part for disk in status["disk"] for part in disk["part"]}

    def places(self):
        """Where the published partitions are, directory names by label."""
        return {label: part["disk_name"] for label, part in self.parts().items()}

    def mounts(self):
        """The kernel's view: (device, filesystem) by directory name."""
        found = {}

        for line in self.vm.check("cat /proc/mounts").splitlines():
            device, path, kind = line.split()[:3]

            if path.startswith(MOUNT_BASE + "/"):
                found[path[len(MOUNT_BASE) + 1:]] = (device, kind)

        return found

    def wait_places(self, expected):
        """Waits until exactly these partitions are published at these directories and mounted there."""
        self.wait_until(lambda: self.places() == expected and set(self.mounts()) == set(expected.values()), expected)

    def wait_until(self, holds, expected="something else"):
        end = time.monotonic() + SETTLE_LIMIT

        while not holds():
            if time.monotonic() > end:
                raise VmError(f"expected {expected}, published {self.places()}, mounted {self.mounts()}")

            time.sleep(LOOK_EVERY)

    def _signal_listening(self, signal):
        self.vm.wait(f"pid=$(cat {PID_FILE}) && grep -q select /proc/$pid/wchan && kill -{signal} $pid")

    def reset(self):
        """Leaves the machine as if just booted, for the next test; fails when that cannot be done."""
        self.vm.run("kill -9 $(pidof start_daemon tarn_nas_diskmanager tarn_nas_sys) 2>/dev/null")
        self.vm.pull_everything()
        self.vm.wait("! ls /sys/block | grep -q -e '^sd' -e '^mmcblk'")
        self.vm.check(f"for path in $(cut -d ' ' -f 2 /proc/mounts | grep '^{MOUNT_BASE}/'); do umount $path; done")
        self.vm.wait(f"! grep -q '{MOUNT_BASE}/' /proc/mounts")
        self.vm.check("rm -rf /tmp/* /etc/config/tarn_nas /etc/tarn_utils /run/blkid && mkdir /tmp/log")
