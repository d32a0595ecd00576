"""A virtual machine with real hot-plug: USB sticks on an xHCI controller and a card in an SD slot.

`Vm` starts qemu with the kernel and root file system that `prepare` left in build/vm, runs shell commands inside
through a virtio port and plugs and pulls disks through qemu's monitor, as a hand would.
"""

import base64
import json
import os
import select
import socket
import subprocess
import tempfile
import time
from pathlib import Path

from world import CHECKOUT

BUILD = CHECKOUT / "build" / "vm"
KERNEL = BUILD / "vmlinuz"
INITRAMFS = BUILD / "initramfs.cpio"

# Far beyond what each takes on a machine that does nothing else.
BOOT_LIMIT = 300
PLUG_LIMIT = 60
MONITOR_LIMIT = 60
COMMAND_LIMIT = 180


class VmError(Exception):
    """The machine did not do what it was asked in time."""


def usable_accelerator():
    """A /dev/kvm on a processor without the extensions is itself emulated, and slower than qemu's own translation."""
    flags = Path("/proc/cpuinfo").read_text().split()
    extensions = "vmx" in flags or "svm" in flags
    return "kvm" if extensions and os.access("/dev/kvm", os.R_OK | os.W_OK) else "tcg"


class LineSocket:
    """A Unix socket that carries lines of text."""

    def __init__(self, path):
        self.socket = socket.socket(socket.AF_UNIX)
        self.socket.connect(str(path))
        self.buffer = b""

    def send(self, line):
        self.socket.sendall(line.encode() + b"\n")

    def receive(self, limit):
        end = time.monotonic() + limit

        while b"\n" not in self.buffer:
            rest = end - time.monotonic()

            if rest <= 0 or not select.select([self.socket], [], [], rest)[0]:
                raise VmError(f"no answer within {limit} s")

            chunk = self.socket.recv(65536)

            if not chunk:
                raise VmError("the machine is gone")

            self.buffer += chunk

        line, self.buffer = self.buffer.split(b"\n", 1)
        return line.decode()

    def close(self):
        self.socket.close()


class Monitor:
    """qemu's monitor (QMP)."""

    def __init__(self, path):
        self.lines = LineSocket(path)
        self.events = []
        json.loads(self.lines.receive(MONITOR_LIMIT))
        self.command("qmp_capabilities")

    def command(self, name, **arguments):
        self.lines.send(json.dumps({"execute": name, "arguments": arguments}))

        while True:
            answer = json.loads(self.lines.receive(MONITOR_LIMIT))

            if "event" in answer:
                self.events.append(answer)
            elif "error" in answer:
                raise VmError(f"{name}: {answer['error']['desc']}")
            else:
                return answer["return"]

    def wait_device_deleted(self, device):
        def seen():
            return any(event["event"] == "DEVICE_DELETED" and event["data"].get("device") == device
                       for event in self.events)

        while not seen():
            answer = json.loads(self.lines.receive(MONITOR_LIMIT))

            if "event" in answer:
                self.events.append(answer)

        self.events = [event for event in self.events if event["data"].get("device") != device]

    def close(self):
        self.lines.close()


class Result:
    """What one command in the machine printed (both outputs together) and its exit status."""

    def __init__(self, status, output):
        self.status = status
        self.output = output


class Vm:
    """One running machine; usable in a `with` statement.

    overlay    an archive that is unpacked over the root file system
    boot_disk  the image of a USB disk whose first partition, an ext4 one, becomes the root file system
    """

    def __init__(self, overlay=None, boot_disk=None):
        self.overlay = overlay
        self.boot_disk = boot_disk
        self.accelerator = usable_accelerator()
        self.boot_seconds = None
        self.process = None
        self.plugged = {}

    def __enter__(self):
        self.start()
        return self

    def __exit__(self, *_):
        self.stop()

    def start(self):
        self.folder = tempfile.TemporaryDirectory(prefix="vm-")
        self.path = Path(self.folder.name)
        begin = time.monotonic()
        self.process = subprocess.Popen(self._command(), stdin=subprocess.DEVNULL,
                                        stdout=open(self.path / "qemu.log", "wb"), stderr=subprocess.STDOUT)

        try:
            self._connect()
            self.boot_seconds = time.monotonic() - begin
        except Exception as error:
            log = self._log_tail()
            self.stop()
            raise VmError(f"the machine did not start: {error}\n{log}") from error

    def stop(self):
        if self.process:
            self.process.kill()
            self.process.wait()
            self.process = None
            self.folder.cleanup()

    def run(self, command, limit=COMMAND_LIMIT):
        """Runs a shell script in the machine and returns its Result."""
        self.control.send(base64.b64encode(command.encode()).decode())
        status, _, output = self.control.receive(limit).partition(" ")
        return Result(int(status), base64.b64decode(output).decode(errors="replace"))

    def check(self, command, limit=COMMAND_LIMIT):
        """Runs a shell script that must succeed and returns what it printed."""
        result = self.run(command, limit)

        if result.status != 0:
            raise VmError(f"{command!r} ended with {result.status}: {result.output}")

        return result.output

    def wait(self, command, limit=PLUG_LIMIT):
        """Repeats a shell script until it succeeds and returns what it printed."""
        end = time.monotonic() + limit

        while True:
            result = self.run(command)

            if result.status == 0:
                return result.output

            if time.monotonic() > end:
                raise VmError(f"{command!r} did not succeed within {limit} s: {result.output}")

            time.sleep(0.1)

    def plug_usb(self, name, image, driver="usb-storage"):
        """Plugs a stick made of the image file; `name` is what `pull_usb` calls it."""
        self._add_image(name, image)
        self.plugged[name] = [name]

        if driver == "usb-uas":
            self.monitor.command("device_add", driver="usb-uas", id=f"{name}-uas", bus="xhci.0")
            self.monitor.command("device_add", driver="scsi-hd", id=name, drive=name, bus=f"{name}-uas.0")
            self.monitor.command("qom-set", path=f"/machine/peripheral/{name}-uas", property="attached", value=True)
            self.plugged[name] = [f"{name}-uas"]
        else:
            self.monitor.command("device_add", driver=driver, id=name, drive=name, bus="xhci.0", removable=True)

    def pull_usb(self, name):
        """Pulls the stick at once, whatever the machine is doing with it."""
        for device in self.plugged.pop(name):
            self.monitor.command("device_del", id=device)
            self.monitor.wait_device_deleted(device)

        self.monitor.command("blockdev-del", **{"node-name": name})

    def insert_card(self, image):
        """Puts a card into the SD slot; the image's size has to be a power of two."""
        self.monitor.command("blockdev-change-medium", id="card", filename=str(image), format="raw")

    def eject_card(self):
        """Takes the card out at once."""
        self.monitor.command("eject", id="card", force=True)

    def pull_everything(self):
        for name in list(self.plugged):
            self.pull_usb(name)

        self.eject_card()

    def _add_image(self, name, image):
        self.monitor.command("blockdev-add", **{
            "node-name": name, "driver": "raw", "discard": "unmap",
            "file": {"driver": "file", "filename": str(image), "discard": "unmap"}})

    def _command(self):
        initrds = [INITRAMFS]
        # A test run that is killed takes its machine along.
        command = ["setpriv", "--pdeathsig", "KILL", "qemu-system-x86_64",
                   "-nodefaults", "-no-user-config", "-display", "none", "-no-reboot", "-machine", "q35", "-m", "256", "-smp", "1", "-kernel", str(KERNEL),
                   "-append", "console=ttyS0 quiet loglevel=4 panic=-1 usb_storage.delay_use=0 tsc=reliable"
                   + (" boot_disk=sda1" if self.boot_disk else "")]
        command += ["-accel", self.accelerator, "-cpu", "host" if self.accelerator == "kvm" else "max"]

        if self.overlay:
            initrds.append(self.overlay)

        command += ["-initrd", str(self._join(initrds)),
                    "-serial", f"file:{self.path}/console.log",
                    "-qmp", f"unix:{self.path}/monitor,server=on,wait=off",
                    "-device", "virtio-serial-pci",
                    "-chardev", f"socket,id=control,path={self.path}/control,server=on,wait=off",
                    "-device", "virtserialport,chardev=control,name=control",
                    "-device", "qemu-xhci,id=xhci,p2=8,p3=8",
                    "-drive", "if=none,id=slot",
                    "-device", "sdhci-pci", "-device", "sd-card,id=card,drive=slot"]

        if self.boot_disk:
            command += ["-drive", f"if=none,id=boot,format=raw,file={self.boot_disk}",
                        "-device", "usb-storage,drive=boot,bus=xhci.0,removable=on"]

        return command

    def _join(self, parts):
        if len(parts) == 1:
            return parts[0]

        # The kernel unpacks archives that stand one behind the other; each has to begin at a multiple of four.
        joined = self.path / "initrd"

        with open(joined, "wb") as out:
            for part in parts:
                data = Path(part).read_bytes()
                out.write(data + b"\0" * (-len(data) % 4))

        return joined

    def _connect(self):
        end = time.monotonic() + 10

        while not ((self.path / "monitor").exists() and (self.path / "control").exists()):
            if self.process.poll() is not None or time.monotonic() > end:
                raise VmError("qemu ended")

            time.sleep(0.02)

        self.monitor = Monitor(self.path / "monitor")
        self.control = LineSocket(self.path / "control")

        if self.control.receive(BOOT_LIMIT) != "ready":
            raise VmError("unexpected greeting")

    def _log_tail(self):
        texts = []

        for name in ("qemu.log", "console.log"):
            log = self.path / name

            if log.exists():
                texts.append(log.read_text(errors="replace")[-2000:])

        return "\n".join(texts)
