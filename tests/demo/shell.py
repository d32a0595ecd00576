"""The demo's shell: a world kept up, and commands to plug and pull its disks."""

import inspect
import subprocess
import sys

from demo.show import Failed, table

HELP = """\
  plug NAME [DEVICE]   plug a disk, as the next free sdX (mmcblk0 for the card) or as DEVICE
  pull NAME [now]      pull a disk without asking first; a stick with a filesystem on the
                       whole device only after a rescan has listed it, unless "now"
  safe-remove          what the web interface sends before disks are pulled
  status               the disks, and the table of published partitions
  log [LINES]          the end of the daemon's log (20 lines)
  sh COMMAND           run a shell command in the world, for example: sh ls -R /tmp/mountd
  help                 this text
  quit                 stop the daemon and take the world down"""
PLUG_TIMEOUT = 45
PULL_TIMEOUT = 60


def _takes(command, words):
    try:
        inspect.signature(command).bind(*words)
    except TypeError:
        return False
    return True


class UsageError(Exception):
    """What was typed makes no sense; the text says why."""


class Shell:
    """Reads commands, one a line, from a terminal or a pipe."""

    def __init__(self, world, daemon, tell, disks):
        self.world = world
        self.daemon = daemon
        self.tell = tell
        self.disks = disks
        self._plugged_at = {}
        self._commands = {
            "plug": self.plug, "pull": self.pull, "safe-remove": self.safe_remove,
            "status": self.status, "log": self.log, "sh": self.sh, "help": self.help,
        }

    def run(self, stream):
        """Serve until "quit" or the end of input; 0 when the daemon then stops well."""
        self.help()
        self.status()
        while (line := self._read(stream)) is not None:
            words = line.split()
            if words == ["quit"]:
                break
            if words:
                self._serve(words)
        self.tell.say("stopping the daemon")
        try:
            return 0 if self.daemon.stop() == 0 else 1
        except AssertionError as error:
            self.tell.say(f"  {error}")
            return 1

    def _read(self, stream):
        if stream.isatty():
            print("demo> ", end="", flush=True)
        line = stream.readline()
        if line and not stream.isatty():
            self.tell.say(f"demo> {line.strip()}")
        return line or None

    def _serve(self, words):
        command = self._commands.get(words[0])
        try:
            if command is None:
                raise UsageError(f"no command {words[0]!r}; try help")
            if not _takes(command, words[1:]):
                raise UsageError(f"wrong number of words after {words[0]!r}; try help")
            command(*words[1:])
        except (UsageError, AssertionError, subprocess.TimeoutExpired) as error:
            self.tell.say(f"  {error}")
        except Failed:
            self.tell.say("  the log may tell why")

    def plug(self, short, device=""):
        disk = self._disk(short)
        if disk.name:
            raise UsageError(f"{short} is plugged already, as {disk.name}")
        name = device or self._free_name(short)
        if not name.isalnum():
            raise UsageError(f"{name!r} is no name of a device")
        if name in self.world.sysfs.names():
            raise UsageError(f"{name} is taken")
        self._plugged_at[short] = self.daemon.mark()
        self.world.hotplug(disk, name)
        mountable = [disk.name] if disk.root_fs else [
            disk.part_name(part) for part in disk.partitions if part.size_mib >= 1000]
        self.tell.wait(lambda: all(f"/dev/{part}" in self.world.mounted()
                                   and part in self.world.parts() for part in mountable),
                       PLUG_TIMEOUT, f"{short} to be mounted as {name}")
        self.status()

    def pull(self, short, when=""):
        disk = self._disk(short)
        if not disk.name or when not in ("", "now"):
            raise UsageError("usage: pull NAME [now]" if disk.name else f"{short} is not plugged")
        # Such a stick is forgotten by the rescan that misses it, and a rescan
        # misses only what an earlier one has listed.
        if disk.root_fs and not when:
            self.tell.wait(lambda: self.daemon.rescanned_since(self._plugged_at[short]),
                           PULL_TIMEOUT, "a rescan to have listed it")
        names = disk.device_names()
        self.world.hotunplug(disk)
        self.tell.wait(lambda: not any(f"/dev/{name}" in self.world.mounted()
                                       or name in self.world.parts() for name in names),
                       PULL_TIMEOUT, f"{short} to be unmounted and forgotten")
        self.status()

    def safe_remove(self):
        self.world.safe_remove()
        self.tell.wait(lambda: not self.world.mounts() and not self.world.parts(),
                       PULL_TIMEOUT, "all disks to be unmounted")
        self.tell.say("  the disks may be pulled now; plug one again to go on")

    def status(self):
        for short, disk in self.disks.items():
            self.tell.say(f"  {short:8} {f'plugged as {disk.name}' if disk.name else 'not plugged'}")
        for line in table(self.world):
            self.tell.say(line)

    def log(self, lines="20"):
        if not lines.isdigit():
            raise UsageError(f"{lines!r} is no number of lines")
        for line in self.daemon.log().splitlines()[-int(lines):]:
            self.tell.say(f"  {line}")

    def sh(self, *words):
        done = self.world.sh(" ".join(words), check=False)
        sys.stdout.write(done.stdout + done.stderr)
        sys.stdout.flush()

    def help(self):
        self.tell.say(HELP)

    def _disk(self, short):
        if short not in self.disks:
            raise UsageError(f"no disk {short!r}; there are {', '.join(self.disks)}")
        return self.disks[short]

    def _free_name(self, short):
        if short == "card":
            return "mmcblk0"
        taken = self.world.sysfs.names()
        return next(f"sd{letter}" for letter in "abcdefgh" if f"sd{letter}" not in taken)
