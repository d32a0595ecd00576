"""A small web server that stands in for the router's: the page's files, and ubus over JSON-RPC.

It runs the real plugin, lets a session call what the shipped access list grants it, and tells the page what the shipped
menu and access list say of its rights.
"""

import json
import re
import secrets
import threading
import urllib.parse
from http.server import BaseHTTPRequestHandler, ThreadingHTTPServer
from pathlib import Path

from web.router import OBJECT, OPENWRT, PAGE_PACKAGE

HERE = Path(__file__).resolve().parent / "page"
SOURCE = OPENWRT / PAGE_PACKAGE
TYPES = {".html": "text/html; charset=utf-8", ".js": "text/javascript; charset=utf-8", ".css": "text/css"}
ACCESS = SOURCE / f"root/usr/share/rpcd/acl.d/{PAGE_PACKAGE}.json"
MENU = SOURCE / f"root/usr/share/luci/menu.d/{PAGE_PACKAGE}.json"
RIGHTS = {"root": ("read", "write"), "reader": ("read",), "nobody": ()}
DENIED = {"code": -32002, "message": "Access denied"}
UBUS_INVALID_COMMAND, UBUS_NOT_FOUND = 1, 4


def granted(rights):
    """(object, method) pairs that an account of these rights may call."""
    return {(name, method) for group in json.loads(ACCESS.read_text()).values() for right in rights
            for name, methods in group[right]["ubus"].items() for method in methods}


def menu_entry():
    """The page's entry: (path in the menu, entry)."""
    entry, = json.loads(MENU.read_text()).items()
    return entry


def words(language):
    """{English text: translation} from the package's own translation, empty for others."""
    path = SOURCE / f"po/{language}/tarn-nas-diskmanager.po"
    return read_po(path.read_text()) if re.fullmatch("[a-z]+", language) and path.exists() else {}


def read_po(text):
    """{msgid: msgstr} of a translation file."""
    entries = re.findall(r'^msgid ((?:".*"\n)+)msgstr ((?:".*"(?:\n|$))+)', text, re.MULTILINE)
    return {_joined(one): _joined(other) for one, other in entries if _joined(one)}


def _joined(lines):
    return "".join(json.loads(line) for line in lines.splitlines())


class PageServer:
    """Serves one world's page on 127.0.0.1 for as long as it is open."""

    def __init__(self, plugin, port=0):
        self.plugin = plugin
        self.sessions = {name: secrets.token_hex(16) for name in RIGHTS}
        self.calls = []
        self.broken = False
        self._server = _listen(port, _handler(self))
        self._server.daemon_threads = True
        self.port = self._server.server_port
        self.url = f"http://127.0.0.1:{self.port}/"
        threading.Thread(target=self._server.serve_forever, daemon=True).start()

    def close(self):
        self._server.shutdown()
        self._server.server_close()

    def session(self, query):
        """What the page is told: a script."""
        values = dict(urllib.parse.parse_qsl(query))
        user = values.get("user", "root")
        if user not in RIGHTS:
            return None
        _, entry = menu_entry()
        told = {"id": self.sessions[user], "view": entry["action"]["path"],
                "readonly": "write" not in RIGHTS[user], "words": words(values.get("lang", "en"))}
        return f"var session = {json.dumps(told)};"

    def ubus(self, request):
        """The answer to one JSON-RPC message."""
        session, name, method, arguments = request["params"]
        self.calls.append(method)
        user = next((user for user, number in self.sessions.items() if number == session), None)
        answer = {"jsonrpc": "2.0", "id": request["id"]}
        if user is None or (name, method) not in granted(RIGHTS[user]):
            return {**answer, "error": DENIED}
        return {**answer, "result": self._run(name, method, arguments)}

    def _run(self, name, method, arguments):
        if name != OBJECT or self.broken:
            return [UBUS_NOT_FOUND]
        text = self.plugin.call_text(method, json.dumps({**arguments, "ubus_rpc_session": "0" * 32}))
        return [0, json.loads(text)] if text else [UBUS_INVALID_COMMAND]


def _listen(port, handler):
    """A server on the port, or on any when that one is taken."""
    try:
        return ThreadingHTTPServer(("127.0.0.1", port), handler)
    except OSError:
        return ThreadingHTTPServer(("127.0.0.1", 0), handler)


def _handler(page):
    class Handler(BaseHTTPRequestHandler):
        """One request."""

        def do_GET(self):
            path, _, query = self.path.partition("?")
            if path == "/session.js":
                referred = urllib.parse.urlsplit(self.headers.get("Referer", "")).query
                return self._send(page.session(query or referred), ".js")
            return self._send(_file(path), Path(path).suffix or ".html")

        def do_POST(self):
            request = json.loads(self.rfile.read(int(self.headers["Content-Length"])))
            self._send(json.dumps(page.ubus(request)), ".js")

        def _send(self, content, suffix):
            if content is None:
                return self.send_error(404)
            body = content.encode()
            self.send_response(200)
            self.send_header("Content-Type", TYPES[suffix])
            self.send_header("Content-Length", str(len(body)))
            self.end_headers()
            self.wfile.write(body)

        def log_message(self, *_):
            pass

    return Handler


def _file(path):
    """Text of a file of the page's, None for others."""
    name = path.lstrip("/") or "index.html"
    folder = SOURCE / "htdocs" if name.startswith("luci-static/") else HERE
    found = (folder / name).resolve()
    if found.suffix in TYPES and found.is_relative_to(folder) and found.is_file():
        return found.read_text()
    return None
