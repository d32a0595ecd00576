"""Whether the lines of a log are whole, judged by the formats in the daemon's source."""

import re
from functools import cache

from world import CHECKOUT

_HEADER = r"(?:(?:Warning|ERROR)\[(?P<a>\w+\.cpp):\d+\]|(?P<b>[\w/.]+\.cpp)\(\d+\))"
_LINE = re.compile(_HEADER + r"(?P<text>.*)")
_ANY_HEADER = re.compile(r"\w\.cpp(?:\(\d+\)|:\d+\])")
_CALL = re.compile(r"\blog_(info|warn|err|errno)\(\s*((?:\"(?:[^\"\\]|\\.)*\"\s*)+)")
_STRING = re.compile(r"\"((?:[^\"\\]|\\.)*)\"")
_CONVERSION = re.compile(r"%(?:\.\*)?(?:ll|l|z)?[a-z]")
# Second lines of messages: statements, process ids, what blkid printed, and nothing.
_CONTINUATION = re.compile(
    r"|(?:CREATE TABLE|select|insert into|update) .*|\d+|/dev/\w+: .*|#\w.*")
# What the commands say that run with the daemon's own output.
_FOREIGN = re.compile(r"(?:umount|mount|mount\.ntfs-3g): .*|mount: .*|       dmesg\(1\) .*")


@cache
def _formats():
    """{file: patterns of its messages' first lines}"""
    found = {}
    for source in (CHECKOUT / "src").rglob("*.cpp"):
        found[source.name] = [_pattern(kind, text)
                              for kind, text in _CALL.findall(source.read_text())]
    return found


def _pattern(kind, literals):
    text = "".join(_STRING.findall(literals)).encode().decode("unicode_escape")
    first_line = text.split("\n", 1)[0]
    pieces = (re.escape(piece) for piece in _CONVERSION.split(first_line))
    return re.compile((r"\([\w ]+\)" if kind == "errno" else "") + ".*".join(pieces))


def is_foreign(line):
    """True for a line that no message of the daemon's is the source of."""
    return bool(_FOREIGN.fullmatch(line))


def is_announcement(line):
    """True for the line in front of a command, which goes to standard output alone."""
    match = _LINE.fullmatch(line)
    return bool(match) and match["text"].startswith("exec cmd = ")


def is_whole(line):
    """True for one message's line, complete and alone."""
    match = _LINE.fullmatch(line)
    if not match:
        return bool(_CONTINUATION.fullmatch(line)) or is_foreign(line)
    if _ANY_HEADER.search(match["text"]):
        return False
    name = (match["a"] or match["b"]).rsplit("/", 1)[-1]
    return is_announcement(line) or any(
        pattern.fullmatch(match["text"]) for pattern in _formats().get(name, ()))


def broken_lines(text):
    """Lines of a log that are not whole; a last line without its end is one."""
    lines = text.split("\n")
    return [line for line in lines[:-1] if not is_whole(line)] + [end for end in lines[-1:] if end]
