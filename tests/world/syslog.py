"""A /dev/log for a world, read all the time.

A datagram socket that nobody reads stops its senders after a few messages, and
not only the daemon sends: mount.ntfs-3g would never finish its unmount.
"""

import re
import socket
import threading
from dataclasses import dataclass

from .waiting import wait_for


@dataclass(frozen=True)
class Message:
    """One received message; `priority` is facility times eight plus level."""

    priority: int
    ident: str
    text: str


class Syslog:
    """Collects what is sent to the socket until `close`."""

    def __init__(self, path):
        self._messages = []
        self._socket = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)
        self._socket.bind(str(path))
        threading.Thread(target=self._collect, daemon=True).start()

    def messages(self, ident=""):
        """Messages so far, of one sender if `ident` is given, in order."""
        return [message for message in list(self._messages) if ident in ("", message.ident)]

    def wait_message(self, text, ident="tarndisk", timeout=30):
        """Wait for a message that holds `text`; returns it."""
        def look():
            return next((message for message in self.messages(ident) if text in message.text), None)
        return wait_for(look, timeout, f"{text!r} from {ident} in syslog")

    def close(self):
        # Wakes the reader, which a plain close would leave asleep.
        self._socket.shutdown(socket.SHUT_RDWR)
        self._socket.close()

    def _collect(self):
        while True:
            try:
                data = self._socket.recv(65536)
            except OSError:
                return
            if not data:
                return
            self._messages.append(_parse(data.decode(errors="replace")))


def _parse(text):
    # <29>Nov 21 08:30:53 ident[pid]: text
    match = re.match(r"<(\d+)>\w{3} [ \d]\d [\d:]{8} ([^:\[]*)(?:\[\d+\])?: ?(.*)", text, re.DOTALL)
    if not match:
        return Message(-1, "", text)
    return Message(int(match.group(1)), match.group(2), match.group(3))
