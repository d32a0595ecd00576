#!/usr/bin/env python3
"""Judges what no compiler sees: which folder may include which, how long files are, that documents, versions, paths and
the package's menu agree with the source. Prints a line for each finding; ends with 1 when there was one."""

import pathlib
import re
import sys

ROOT = pathlib.Path(__file__).resolve().parent.parent
SRC = ROOT / "src"

# A folder includes itself and what stands in rows below its own; folders of one row do not know each other.
LAYERS = [["main"], ["manager"], ["disk"], ["fs", "db_sqlite", "config"], ["util"], ["log"]]

FILE_LINES = 400
HEADER_LINES = 120

# The log lies below the module that makes the other paths.
PATH_MAKERS = {"util/paths.h", "util/paths.cpp", "log/log.cpp"}

LOG_INDEX = ROOT / "docs" / "log.md"
FROZEN_INDEX = ROOT / "docs" / "frozen.md"
FILESYSTEMS = SRC / "util" / "fs_code.h"
PACKAGE = ROOT / "openwrt" / "tarn-nas-diskmanager"
# Filesystems that the driver of another one mounts.
ALSO_DRIVES = {"ext2": "ext4", "ext3": "ext4"}
LITERAL = r'"((?:[^"\\]|\\.)*)"'


def sources(*suffixes):
    return sorted(path for path in SRC.rglob("*") if path.suffix in (suffixes or (".h", ".cpp")))


def name_of(path):
    return path.relative_to(SRC).as_posix()


def without_comment(line):
    return re.sub(r"(?:^|\s)//.*$", "", line)


def includes_of(path):
    return re.findall(r'^#include "([^"]+)"', path.read_text(), re.MULTILINE)


def row_of(folder):
    return next((row for row, folders in enumerate(LAYERS) if folder in folders), None)


def check_directions():
    for path in sources():
        folder = name_of(path).split("/")[0]
        if row_of(folder) is None:
            yield f"src/{name_of(path)}: the folder {folder} has no place among the layers"
            continue
        for included in includes_of(path):
            other = included.split("/")[0]
            if other != folder and (row_of(other) is None or row_of(other) <= row_of(folder)):
                yield f"src/{name_of(path)}: {folder} must not include {included}"


def module_of(name):
    return name.rsplit(".", 1)[0]


def check_cycles():
    """A module is a header with its source file: what either includes, the module needs."""
    needs = {}
    for path in sources():
        module = module_of(name_of(path))
        needs.setdefault(module, set()).update(module_of(i) for i in includes_of(path) if module_of(i) != module)

    done, way = set(), []

    def walk(module):
        if module in way:
            yield "include cycle: " + " -> ".join(way[way.index(module):] + [module])
            return
        if module in done:
            return
        way.append(module)
        for other in sorted(needs.get(module, ())):
            yield from walk(other)
        way.pop()
        done.add(module)

    for module in sorted(needs):
        yield from walk(module)


def check_lengths():
    for path in sources():
        limit = HEADER_LINES if path.suffix == ".h" else FILE_LINES
        lines = len(path.read_text().splitlines())
        if lines > limit:
            yield f"src/{name_of(path)}: {lines} lines, at most {limit}"


def check_paths():
    for path in sources():
        if name_of(path) in PATH_MAKERS:
            continue
        for number, line in enumerate(path.read_text().splitlines(), 1):
            if re.search(r'"/[a-z]+/', without_comment(line)):
                yield f"src/{name_of(path)}:{number}: a path outside util/paths"


def logged_texts():
    """The format of each warning and error, with the files that have it; pieces of one literal are joined."""
    found = {}
    call = re.compile(r"\blog_(?:warn|err|errno)\(\s*((?:" + LITERAL + r"\s*)+)")
    for path in sources(".cpp"):
        for match in call.finditer(path.read_text()):
            text = "".join(re.findall(LITERAL, match.group(1)))
            text = text.replace('\\"', '"').removesuffix("\\n")
            found.setdefault(text, set()).add(name_of(path))
    return found


def documented_texts():
    """The first cell of each row of the index that begins with a text in backticks."""
    return re.findall(r"^\| `([^`]+)` \|", LOG_INDEX.read_text(), re.MULTILINE)


def check_log_index():
    literals = "\n".join(
        "".join(re.findall(LITERAL, piece))
        for path in sources()
        for piece in re.findall(r"(?:" + LITERAL.replace("(", "(?:", 1) + r"\s*)+", path.read_text())
    ).replace('\\"', '"')
    documented = documented_texts()
    for text in documented:
        if text not in literals:
            yield f"docs/log.md: `{text}` is not in the source"
    for text, names in logged_texts().items():
        if text not in documented:
            yield f"docs/log.md: `{text}` of {', '.join(sorted(names))} is missing"


def check_frozen_names():
    for header, names in re.findall(r"^\| `([^`]+\.h)` \| (.+) \|$", FROZEN_INDEX.read_text(), re.MULTILINE):
        path = SRC / header
        text = path.read_text() if path.exists() else ""
        for name in re.findall(r"`([^`]+)`", names):
            if not re.search(rf"\b{name}\b", text):
                yield f"docs/frozen.md: {name} is not in src/{header}"


def check_versions():
    places = {
        "CMakeLists.txt": r"\bVERSION ([0-9.]+)\n",
        "src/main/options.cpp": r'\bVERSION\[\] = "([^"]+)"',
        "openwrt/tarn-nas-diskmanager/Makefile": r"(?m)^PKG_VERSION:=(.+)$",
    }
    found = {}
    for name, pattern in places.items():
        match = re.search(pattern, (ROOT / name).read_text())
        found[name] = match.group(1) if match else "none"
    if len(set(found.values())) > 1:
        yield "the version differs: " + ", ".join(f"{name} has {version}" for name, version in found.items())


def mount_commands():
    """Name and mount command of each filesystem in the daemon's table that has one."""
    table = re.search(r"\bFILESYSTEMS\[\] = \{(.*?)\n\};", FILESYSTEMS.read_text(), re.DOTALL).group(1)
    return re.findall(r'"([^"]+)",\s*(?:"[^"]*"|NO_TEXT),\s*"(mount[^"]*)"', table)


def package_that_mounts(command):
    """What OpenWrt calls the package of the kernel's driver, or of the program that mounts in its place."""
    program, *words = command.split()
    if program != "mount":
        return program.removeprefix("mount.")
    driver = words[words.index("-t") + 1]
    return "kmod-fs-" + ALSO_DRIVES.get(driver, driver)


def check_filesystem_switches():
    makefile = (PACKAGE / "Makefile").read_text()
    menu = (PACKAGE / "Config.in").read_text()
    commands = mount_commands()
    if not commands:
        yield f"{FILESYSTEMS.relative_to(ROOT)}: no filesystem with a mount command is found"
    for name, command in commands:
        package = package_that_mounts(command)
        switch = re.search(rf"\+(\w+):{re.escape(package)}(?=\s)", makefile)
        if not switch:
            yield f"{PACKAGE.relative_to(ROOT)}/Makefile: {name} needs +SWITCH:{package} among the dependencies"
        elif not re.search(rf"^config {switch[1]}$", menu, re.MULTILINE):
            yield f"{PACKAGE.relative_to(ROOT)}/Config.in: {name} needs a switch, config {switch[1]}"


CHECKS = [check_directions, check_cycles, check_lengths, check_paths, check_log_index, check_frozen_names,
          check_versions, check_filesystem_switches]


def main():
    findings = [finding for check in CHECKS for finding in check()]
    print("\n".join(findings), end="\n" if findings else "")
    return 1 if findings else 0


if __name__ == "__main__":
    sys.exit(main())
