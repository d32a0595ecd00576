"""The floor: the commands that the daemon announced, run again in a world of the same shape."""

import json
import re

_ANNOUNCED = re.compile(r"exec cmd = (.*)$", re.MULTILINE)
# system() of the C library, as in the daemon; the interpreter's start is not counted.
_REPLAY = """
import json, os, sys, time
commands = json.load(sys.stdin)
null = os.open("/dev/null", os.O_WRONLY)
out = os.dup(1)
os.dup2(null, 1)
os.dup2(null, 2)
# The first command of a fresh process pays for what a running daemon has paid long ago.
os.system("true")
begun = time.monotonic()
for command in commands:
    os.system(command)
os.write(out, repr(time.monotonic() - begun).encode())
"""


def announced(log):
    """The commands of a piece of log, in order."""
    return _ANNOUNCED.findall(log)


def replay(world, commands):
    """Seconds that the commands take in a world."""
    done = world.run("/usr/bin/python3", "-I", "-S", "-c", _REPLAY, timeout=600,
                     input_text=json.dumps(commands))
    return float(done.stdout)
