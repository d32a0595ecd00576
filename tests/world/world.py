"""The world itself: made by a keeper process, entered with nsenter."""

import atexit
import contextlib
import json
import os
import shutil
import stat
import subprocess
import sys
import tempfile
import weakref
from pathlib import Path

from . import disk as disks
from . import state
from .built import CHECKOUT, PROGRAM
from .daemon import Daemon, child_of
from .events import PIPES, add_messages, remove_messages, write_pipe
from .overlay import overlay
from .sysfs import Sysfs
from .syslog import Syslog
from .tools import BUSYBOX, COMPANION, LABEL_SCRIPT, Tools, make_busybox
from .waiting import wait_for

HOTPLUG_HOOK = "/etc/hotplug.d/block/10-mount"
_NAMESPACES = ["--mount", "--pid", "--ipc", "--uts"]
# A shell that turns into the program once it is let go, with the same process id.
_HELD = "held back"
_HOLD = f'echo {_HELD}; read -r go; exec "$0" "$@" < /dev/null'
_BOOT = "import json,sys; job=json.loads(sys.stdin.readline()); exec(job['code'])"
# What a router's kernel lists beside the disks; the daemon must pass over them.
_OTHER_DEVICES = ("loop0", "mtdblock0", "zram0")
_WORKDIR = "tarn-world-"

_live = weakref.WeakSet()


@atexit.register
def _close_all():
    for world in list(_live):
        world.close()


def _remove_leftovers():
    """Remove the directories of processes that were killed and could not do it themselves."""
    for folder in Path(tempfile.gettempdir()).glob(f"{_WORKDIR}*-*"):
        pid = folder.name.removeprefix(_WORKDIR).split("-")[0]
        if not Path(f"/proc/{pid}").exists():
            shutil.rmtree(folder, ignore_errors=True)


class World(state.Observed):
    """A private router: its own /tmp, /run, /etc, /dev, /sys/block and processes.

    tools    "" for the distribution's programs, "busybox" for a router's busybox
             as /bin/sh and first in PATH (blkid and mount.ntfs-3g stay)
    program  the daemon's binary
    tmp_mib  size of /tmp
    environ  further variables for every process of the world

    Public parts: `tools` (stubs, recorders, init scripts), `sysfs`, `workdir` (a
    directory of the machine, removed with the world), `keeper_pid`.
    """

    def __init__(self, tools="", program=None, tmp_mib=64, environ=None):
        self.program = Path(program or os.environ.get("TARN_DAEMON") or PROGRAM)
        _remove_leftovers()
        self.workdir = Path(tempfile.mkdtemp(prefix=f"{_WORKDIR}{os.getpid()}-"))
        self._disks = []
        self._detaching = []
        self._daemons = []
        self._sockets = []
        self._processes = []
        self._keeper = None
        self._busybox = tools == "busybox"
        if self._busybox:
            make_busybox()
        _live.add(self)
        try:
            self.keeper_pid = self._start_keeper(tmp_mib)
            self.tools = Tools(self.root, self._busybox)
            self.sysfs = Sysfs(self.path("/sys"))
            self._furnish()
        except BaseException:
            self.close()
            raise
        self._environ = {"PATH": self.tools.search_path, "HOME": "/root", "LANG": "C",
                         "TZ": "UTC", **(environ or {})}

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.close()

    # Files of the world, from outside.

    @property
    def root(self):
        """The world's root directory as seen from the machine."""
        return Path(f"/proc/{self.keeper_pid}/root")

    def path(self, inside):
        """The machine's path to a file of the world."""
        return self.root / str(inside).lstrip("/")

    def read(self, inside):
        """Text of a file of the world."""
        return self.path(inside).read_text(errors="replace")

    def write(self, inside, text, mode=0o644):
        """Write a file of the world, with its directories."""
        target = self.path(inside)
        target.parent.mkdir(parents=True, exist_ok=True)
        target.write_text(text)
        target.chmod(mode)

    def exists(self, inside):
        return os.path.lexists(self.path(inside))

    # Processes.

    def run(self, *words, timeout=60, check=True, input_text=None):
        """Run a program in the world; returns CompletedProcess with text output.

        What it leaves running in the background is not waited for.
        """
        with tempfile.TemporaryFile("w+") as out, tempfile.TemporaryFile("w+") as err:
            process = self.popen(*words, stdin=subprocess.PIPE, stdout=out, stderr=err)
            try:
                process.communicate((input_text or "").encode(), timeout=timeout)
            except subprocess.TimeoutExpired:
                self._kill_group(process)
                raise
            texts = []
            for stream in (out, err):
                stream.seek(0)
                texts.append(stream.read())
        done = subprocess.CompletedProcess(words, process.returncode, *texts)
        if check:
            done.check_returncode()
        return done

    def sh(self, text, **options):
        """Run a shell text in the world, with the world's /bin/sh; see `run`."""
        return self.run("/bin/sh", "-c", text, **options)

    def popen(self, *words, environ=None, **options):
        """Start a program in the world; returns the Popen of its nsenter."""
        entry = ["nsenter", "--target", str(self.keeper_pid), *_NAMESPACES, "--"]
        return subprocess.Popen(entry + [str(word) for word in words],
                                env={**self._environ, **(environ or {})},
                                start_new_session=True, **options)

    def start_daemon(self, *options, wait=True, environ=None, held=False):
        """Start the daemon with its output in a file; returns a Daemon.

        With `wait` its start-up scan is over when this returns.  With `held` it is
        still a shell that waits for Daemon.release.
        """
        words = ["/bin/sh", "-c", _HOLD] if held else []
        log_path = self.workdir / f"daemon-{len(self._daemons) + 1}.log"
        with log_path.open("ab") as log:
            process = self.popen(*words, self.program, *options, environ=environ,
                                 stdin=subprocess.PIPE if held else subprocess.DEVNULL,
                                 stdout=log, stderr=log)
        self._processes.append(process)
        daemon = Daemon(process, log_path)
        self._daemons.append(daemon)
        if held:
            daemon.wait_log(_HELD)
        elif wait:
            daemon.wait_started()
        return daemon

    def start_companion(self):
        """Run a process that `pidof tarn_nas_sys` finds; returns its Popen."""
        process = self.popen(self.tools.companion_program(), "infinity",
                             stdin=subprocess.DEVNULL)
        self._processes.append(process)
        wait_for(self._companion_runs, 30, "the companion process")
        return process

    def stop_companion(self, process):
        """End a process of `start_companion`; `pidof` no longer finds it."""
        self._kill_group(process)
        wait_for(lambda: not self._companion_runs(), 30, "the companion's end")

    def _companion_runs(self):
        return self.run("pidof", COMPANION, check=False).stdout.strip()

    # Disks.

    def whole_disk(self, fs, size_mib=1200, **options):
        """A new disk with a filesystem on the whole device; see disk.whole_disk."""
        return self._keep(disks.whole_disk(fs, size_mib, **options))

    def partitioned_disk(self, *partitions, **options):
        """A new disk with a table; see disk.partitioned_disk."""
        return self._keep(disks.partitioned_disk(list(partitions), **options))

    def blank_disk(self, size_mib=1200, **options):
        """A new disk of zeros."""
        return self._keep(disks.blank_disk(size_mib, **options))

    def plug(self, disk, name, port="", only=None):
        """Let a disk appear under a kernel name: loops, /sys entries, nodes.

        `port` replaces the controller part of its device path.  `only` holds the
        numbers of the partitions to show, all by default.  Sends no message.
        """
        if disk.name:
            raise ValueError(f"{disk.name} is plugged already")
        disk.name, disk.port = name, port
        disk.attach()
        loop = disk.loops[name]
        self.sysfs.add_disk(name, disk.sectors, loop.devno, disk.sector_size, port)
        self._make_node(name, loop)
        for part in disk.partitions:
            if only is None or part.number in only:
                self.show_partition(disk, part)

    def show_partition(self, disk, part):
        """Let one partition of a plugged disk appear."""
        name = disk.part_name(part)
        self.sysfs.add_partition(disk.name, name, part.number, part.start,
                                 part.device_bytes // disks.SECTOR, disk.loops[name].devno)
        self._make_node(name, disk.loops[name])

    def pull(self, disk, surprise=True):
        """Let a disk vanish; returns the remove messages a hotplug script would send.

        Nodes and /sys entries go first.  With `surprise` a filesystem that is
        still mounted then meets I/O errors, and the kernel detaches the loop when
        it is unmounted.  Without, the loops are just let go.
        """
        messages = remove_messages(disk)
        shown = set(self.sysfs.names())
        for name in reversed(disk.device_names()):
            self.path(f"/dev/{name}").unlink(missing_ok=True)
            if name in shown:
                self.sysfs.remove(name)
        for loop in disk.loops.values():
            if surprise:
                loop.cut_off()
            loop.release()
        self._detaching += disk.loops.values()
        disk.loops = {}
        disk.name = ""
        return messages

    def hotplug(self, disk, name, **options):
        """`plug`, then the add messages as a hotplug script sends them."""
        self.plug(disk, name, **options)
        self.announce(disk)

    def hotunplug(self, disk, **options):
        """`pull`, then the remove messages as a hotplug script sends them."""
        self.send(*self.pull(disk, **options))

    # Messages.

    def announce(self, disk):
        """Send the add messages of a plugged disk."""
        self.send(*add_messages(disk))

    def send(self, *messages, pipe="add_remove", timeout=30):
        """Write messages into a pipe, a line each, whole or not at all.

        `pipe` is "add_remove", "safe_remove" or "remove"; a missing reader is a
        WaitTimeout, never a hang.
        """
        for message in messages:
            self.send_bytes(message.encode() + b"\n", pipe, timeout)

    def send_bytes(self, data, pipe="add_remove", timeout=30):
        """Write bytes into a pipe as they stand."""
        write_pipe(self.path(PIPES[pipe]), data, timeout)

    def safe_remove(self):
        """Send the message that the web interface sends."""
        self.send("#safe_remove", pipe="safe_remove")

    # Waiting and outside services.

    def wait(self, condition, timeout, what):
        """wait_for, named here since every test needs it."""
        return wait_for(condition, timeout, what)

    def diagnosis(self):
        """What to print beside a failed test."""
        try:
            lines = [f"{entry.dev} on {entry.path} type {entry.fs}" for entry in self.mounts()]
        except OSError as error:
            lines = [f"the world is gone: {error}"]
        lines += [f"/sys/block: {' '.join(self.sysfs.names())}"]
        for daemon in self._daemons:
            lines += [f"--- {daemon.log_path.name}, exit status {daemon.returncode}:",
                      daemon.log()[-12000:]]
        return "\n".join(lines)

    def syslog(self):
        """Put a /dev/log in place; returns the Syslog that reads it."""
        receiver = Syslog(self.path("/dev/log"))
        self._sockets.append(receiver)
        return receiver

    def label_script(self, text):
        """Install the optional label script under its fixed name in /usr/bin."""
        self.cover_usr_bin()
        self.write(LABEL_SCRIPT, text, 0o755)

    def cover_usr_bin(self):
        """Make /usr/bin the world's own to change."""
        overlay(self, "/usr/bin")
        if self._busybox:
            shell = self.run("readlink", "-f", "/bin/sh").stdout.strip()
            self.run("mount", "--bind", BUSYBOX, shell)

    # The end.

    def close(self):
        """End all processes, give back every mount and loop.  Safe to call twice.

        What fails keeps nothing else from being given back.  Raises WaitTimeout when the
        kernel keeps a loop attached.
        """
        _live.discard(self)
        with contextlib.ExitStack() as last_first:
            last_first.callback(self._wait_detached)
            last_first.callback(shutil.rmtree, self.workdir, ignore_errors=True)
            last_first.callback(self._release_disks)
            last_first.callback(self._stop_keeper)
            while self._sockets:
                last_first.callback(self._sockets.pop().close)
            while self._processes:
                last_first.callback(self._kill_group, self._processes.pop())

    def _start_keeper(self, tmp_mib):
        visible = [place for place in (CHECKOUT, self.program.parent) if place.is_dir()]
        job = {"code": (Path(__file__).parent / "keeper.py").read_text(),
               "visible": [str(place) for place in visible],
               "shell": str(BUSYBOX) if self._busybox else "", "tmp_mib": tmp_mib}
        self._keeper = subprocess.Popen(
            ["unshare", *_NAMESPACES, "--fork", "--kill-child=SIGKILL", "--mount-proc",
             "--propagation", "private", "--", sys.executable, "-I", "-S", "-c", _BOOT],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, stderr=subprocess.PIPE,
            text=True, cwd="/", start_new_session=True)
        self._keeper.stdin.write(json.dumps(job) + "\n")
        self._keeper.stdin.flush()
        if self._keeper.stdout.readline() != "ready\n":
            raise RuntimeError(f"no world could be made: {self._keeper.stderr.read()}")
        return child_of(self._keeper.pid)

    def _stop_keeper(self):
        if self._keeper is None:
            return
        for stream in (self._keeper.stdin, self._keeper.stdout, self._keeper.stderr):
            with contextlib.suppress(OSError):
                stream.close()
        try:
            self._keeper.wait(30)
        except subprocess.TimeoutExpired:
            self._keeper.kill()
            self._keeper.wait(30)

    def _furnish(self):
        """What a router has at boot and the daemon expects."""
        for directory in ("/tmp/log", "/tmp/sysinfo", "/run/lock", "/etc/config"):
            self.path(directory).mkdir(parents=True, exist_ok=True)
        self.write(HOTPLUG_HOOK, "#!/bin/sh\n", 0o755)
        for name in _OTHER_DEVICES:
            self.sysfs.add_other(name)

    def _keep(self, disk):
        self._disks.append(disk)
        return disk

    def _make_node(self, name, loop):
        os.mknod(self.path(f"/dev/{name}"), stat.S_IFBLK | 0o660, loop.devno)

    def _kill_group(self, process):
        # The group holds nsenter and what it started, inside and outside alike. Once its leader has
        # been waited for, its number may be that of another group by now, another world's even.
        if process.poll() is not None:
            return
        with contextlib.suppress(ProcessLookupError):
            os.killpg(process.pid, 9)
        process.wait(30)

    def _release_disks(self):
        for disk in self._disks:
            for loop in disk.loops.values():
                loop.release()
            self._detaching += disk.loops.values()
            disk.loops = {}
            disk.close()

    def _wait_detached(self):
        loops, self._detaching = self._detaching, []

        def still():
            return [loop.path for loop in loops if loop.is_attached()]
        wait_for(lambda: not still(), 30, lambda: f"the kernel to detach {still()}")
