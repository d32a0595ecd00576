"""The keeper: first process of a world's pid namespace, which builds the world.

Runs as `exec(code)` with a dict `job` and must import nothing but the standard
library: its own file must not show on its command line, since the checkout's
path could hold the daemon's name and the daemon looks for that with `pgrep -f`.

It says "ready" when everything is in place and then reads its standard input
until the end.  When the maker of the world dies the input ends, the keeper with
it, and the kernel takes down all processes and mounts of the world.
"""

import ctypes
import os
import shutil
import signal
import socket
import stat
import sys

MS_BIND, MS_REC = 4096, 16384
_libc = ctypes.CDLL(None, use_errno=True)


def mount(source, target, fs=None, flags=0, data=""):
    """mount(2) that raises OSError with the target's name."""
    arguments = [text.encode() if text else None for text in (source, target, fs)]
    if _libc.mount(*arguments, flags, data.encode() or None) != 0:
        number = ctypes.get_errno()
        raise OSError(number, f"mount {source} on {target}: {os.strerror(number)}")


def tmpfs(target, mode, size=""):
    """Put an empty directory of the world's own over `target`."""
    mount("tmpfs", target, "tmpfs", data=f"mode={mode}" + (f",size={size}" if size else ""))


def through(fd):
    """A path to what `fd` was opened on, also when something covers it by now."""
    return f"/proc/self/fd/{fd}"


def own_etc():
    """A writable copy of /etc."""
    old = os.open("/etc", os.O_PATH)
    tmpfs("/etc", "755")
    source = through(old) + "/"

    def visible_anyway(folder, names):
        place = "/etc" + folder[len(through(old)):].rstrip("/")
        return [name for name in names if f"{place}/{name}" in job["visible"]]  # noqa: F821
    shutil.copytree(source, "/etc", symlinks=True, dirs_exist_ok=True,
                    ignore=visible_anyway, ignore_dangling_symlinks=True)
    os.close(old)


def own_dev():
    """A /dev that holds what programs need and none of the machine's disks."""
    tmpfs("/dev", "755")
    nodes = {"null": (1, 3), "zero": (1, 5), "full": (1, 7), "random": (1, 8),
             "urandom": (1, 9), "tty": (5, 0), "loop-control": (10, 237), "fuse": (10, 229)}
    for name, numbers in nodes.items():
        os.mknod(f"/dev/{name}", stat.S_IFCHR | 0o666, os.makedev(*numbers))
    for number, name in enumerate(("stdin", "stdout", "stderr")):
        os.symlink(f"/proc/self/fd/{number}", f"/dev/{name}")
    os.symlink("/proc/self/fd", "/dev/fd")
    os.symlink("pts/ptmx", "/dev/ptmx")
    os.mkdir("/dev/pts")
    os.mkdir("/dev/shm")
    mount("devpts", "/dev/pts", "devpts", data="newinstance,ptmxmode=0666,mode=620")
    tmpfs("/dev/shm", "1777")


def own_sys():
    """Empty /sys/block, /sys/class/block and /sys/dev/block, and a /sys/devices
    of our own to link to, with the machine's directories bound into it."""
    kept = {name: os.open(f"/sys/devices/{name}", os.O_PATH)
            for name in os.listdir("/sys/devices")
            if name != "platform" and not name.startswith("pci")
            and os.path.isdir(f"/sys/devices/{name}")}
    tmpfs("/sys/devices", "755")
    for name, fd in kept.items():
        os.mkdir(f"/sys/devices/{name}")
        mount(through(fd), f"/sys/devices/{name}", flags=MS_BIND | MS_REC)
        os.close(fd)
    for directory in ("/sys/block", "/sys/class/block", "/sys/dev/block"):
        tmpfs(directory, "755")


def bring_back(path, fd):
    """Make `path` visible again where it was, if one of our mounts covers it."""
    try:
        if os.path.samestat(os.stat(path), os.fstat(fd)):
            return
    except FileNotFoundError:
        os.makedirs(path)
    mount(through(fd), path, flags=MS_BIND | MS_REC)


def build():
    os.umask(0o022)
    # Orphans of the world become our children; nobody else collects them.
    signal.signal(signal.SIGCHLD, signal.SIG_IGN)
    visible = {path: os.open(path, os.O_PATH) for path in job["visible"]}  # noqa: F821
    socket.sethostname("router")
    tmpfs("/tmp", "1777", f"{job['tmp_mib']}m")  # noqa: F821
    tmpfs("/run", "755")
    own_etc()
    own_sys()
    own_dev()
    for path, fd in visible.items():
        bring_back(path, fd)
        os.close(fd)
    if job["shell"]:  # noqa: F821
        mount(job["shell"], os.path.realpath("/bin/sh"), flags=MS_BIND)  # noqa: F821
    os.chdir("/")


build()
print("ready", flush=True)
sys.stdin.read()
