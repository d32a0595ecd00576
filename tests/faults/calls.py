"""The system calls that the daemon makes itself, and the errors that each can end with.

Which calls these are is not believed but looked up: a test traces a start and a
whole cycle and finds every call either in CALLS or in CANNOT_FAIL.
"""

import re
from dataclasses import dataclass


@dataclass(frozen=True)
class Call:
    """One kind of call.

    names    the kernel's names for it, on whatever processor
    errors   what a kernel can really return for it
    hides    its failure can hide a device's data, so the device is left out, or
             recorded with gaps, until it is announced again
    stages   it is made at start-up ("start"), in a running cycle ("cycle"), for the copy
             of the log ("syslog"), or to get what strangers planted out of the way
             ("planted"); "files" is a cycle in which only scratch files are meant
    rare     once or twice in a cycle
    vital    without it the daemon ends, in order
    stores   the database's: what was not written is written with the next mount
    """

    names: tuple
    errors: tuple
    hides: bool = False
    stages: tuple = ("start", "cycle")
    rare: bool = False
    vital: bool = False
    stores: bool = False

    @property
    def name(self):
        return self.names[0]


CALLS = (
    Call(("openat", "open"), ("EMFILE", "ENOMEM", "EACCES", "EIO", "ENOSPC", "EINTR"), hides=True),
    Call(("read",), ("EIO", "EAGAIN", "EINTR"), hides=True),
    # EAGAIN where the reader of the output is slow and made its pipe non-blocking.
    Call(("write",), ("ENOSPC", "EIO", "EAGAIN", "EINTR")),
    Call(("close",), ("EIO", "EINTR")),
    Call(("access", "faccessat", "faccessat2"), ("ENOMEM", "EACCES", "EIO"), hides=True),
    Call(("newfstatat", "fstat", "stat", "lstat", "statx"), ("ENOMEM", "EACCES", "EIO"),
         hides=True),
    Call(("getdents64",), ("EIO", "ENOMEM"), hides=True),
    Call(("lseek",), ("EIO",), hides=True, rare=True),
    Call(("readlink", "readlinkat"), ("ENOMEM", "EACCES", "EIO"), stages=("cycle",),
         rare=True),
    Call(("statfs",), ("EIO", "EACCES", "ENOMEM", "EINTR")),
    # A scratch file that cannot be claimed is not written to.
    Call(("unlink", "unlinkat"), ("EIO", "EACCES", "ENOSPC", "ENOMEM"), hides=True),
    Call(("mknodat", "mknod"), ("ENOSPC", "EACCES", "EIO", "ENOMEM"), stages=("start",),
         vital=True),
    Call(("pread64",), ("EIO", "EINTR"), stores=True),
    Call(("pwrite64",), ("ENOSPC", "EIO", "EINTR"), stores=True),
    Call(("fdatasync", "fsync"), ("EIO", "ENOSPC", "EINTR"), stores=True),
    Call(("fcntl",), ("EAGAIN", "EACCES", "ENOMEM", "EINTR"), stores=True),
    Call(("fchown",), ("EIO", "ENOSPC"), rare=True, stores=True),
    # The stack of the helper that becomes the shell, stdio's and malloc's memory.
    Call(("mmap",), ("ENOMEM",), hides=True),
    Call(("munmap",), ("ENOMEM",)),
    # malloc's and SQLite's random numbers, before the kernel has gathered any.
    Call(("getrandom",), ("EAGAIN",), stages=("start",)),
    # A shell that cannot be started.
    Call(("clone3", "clone", "vfork", "fork"), ("EAGAIN", "ENOMEM"), hides=True),
    Call(("wait4", "waitid"), ("EINTR",)),
    Call(("pselect6", "select"), ("EINTR", "ENOMEM")),
    Call(("clock_nanosleep", "nanosleep"), ("EINTR",)),
    # A pipe whose first byte cannot be read gives no message, and so no further calls.
    Call(("read",), ("EIO", "EAGAIN", "EINTR"), hides=True, stages=("files",)),
    Call(("socket",), ("EMFILE", "ENOMEM", "EACCES"), stages=("syslog",)),
    Call(("connect",), ("ECONNREFUSED", "EACCES", "EINTR"), stages=("syslog",)),
    Call(("sendto",), ("ENOMEM", "EAGAIN", "EINTR"), stages=("syslog",)),
    Call(("mkdir", "mkdirat"), ("ENOSPC", "EIO", "ENOMEM"), hides=True,
         stages=("planted",)),
    # Without it the last document stays, and a foreign thing where it is.
    Call(("rename", "renameat", "renameat2"), ("ENOSPC", "EIO", "EACCES"), hides=True,
         stages=("start", "cycle", "planted"), rare=True),
    Call(("rmdir",), ("EIO", "EACCES", "ENOMEM"), hides=True,
         stages=("planted",)),
)

# Calls without an error that a correct program can meet; brk has none at all, it
# answers with the old break, and malloc goes on with mmap.
CANNOT_FAIL = {"rt_sigaction", "rt_sigprocmask", "rt_sigreturn", "getpid", "geteuid", "brk",
               "exit_group", "restart_syscall", "clock_gettime", "futex", "mprotect"}

_CALL = re.compile(r"^(\w+)\(")


def names_in(trace):
    """Names of the calls in a trace, in order."""
    return [match.group(1) for match in map(_CALL.match, trace.splitlines()) if match]


def known_names():
    return {name for call in CALLS for name in call.names} | CANNOT_FAIL


def of_stage(stage):
    return [call for call in CALLS if stage in call.stages]


def in_portions(stage, size):
    """(call, errors) pairs, at most so many errors each."""
    return [(call, call.errors[first:first + size]) for call in of_stage(stage)
            for first in range(0, len(call.errors), size)]


def parametrize(metafunc, stages, size):
    """Give a test its stages, calls and errors; the long form one error at a time, to share
    the work."""
    if "errors" in metafunc.fixturenames:
        size = 1 if metafunc.config.getoption("--long") else size
        cases = [(stage, *pair) for stage in stages for pair in in_portions(stage, size)]
        metafunc.parametrize("stage, call, errors", cases, ids=[
            f"{stage}-{call.name}-{'-'.join(errors)}" for stage, call, errors in cases])
