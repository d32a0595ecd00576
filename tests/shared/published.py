"""The published status held against its schema, and watched for as long as a test lasts."""

import json
import threading

import jsonschema

from world import CHECKOUT
from world.state import DISK_JSON, load_json

_SCHEMA = jsonschema.Draft7Validator(
    json.loads((CHECKOUT / "docs/disk.schema.json").read_text()))
_LOOK_EVERY_SECONDS = 0.1


def objections(document):
    """What the schema and the document's own counts have against it, as texts."""
    found = [f"{error.json_path}: {error.message}" for error in _SCHEMA.iter_errors(document)]
    if found:
        return found
    if document["disk_number"] != len(document["disk"]):
        found.append(f"disk_number is {document['disk_number']}, not {len(document['disk'])}")
    # A disk that there was no memory for is an empty object.
    found += [f"part_num is {disk.get('part_num')}, not {len(disk.get('part', []))}"
              for disk in document["disk"] if disk.get("part_num", 0) != len(disk.get("part", []))]
    return found


def text_objections(text):
    """The same of the file's text."""
    document = load_json(text)
    return ["no JSON"] if document is None else objections(document)


class StatusWatch:
    """Looks at disk.json again and again and judges every document that it meets."""

    def __init__(self, world):
        self._world = world
        self._seen = set()
        self._over = threading.Event()
        self._thread = threading.Thread(target=self._watch, daemon=True)
        self.faults = []

    def start(self):
        self._thread.start()

    def stop(self):
        """Judge the last document as well."""
        self._over.set()
        self._thread.join()
        self._look()

    def _watch(self):
        try:
            while not self._over.wait(_LOOK_EVERY_SECONDS):
                self._look()
        except Exception as error:  # In a thread it would end as a mere warning.
            self.faults.append(f"the watch broke off: {error!r}")

    def _look(self):
        """Judge what stands there, once there is something."""
        try:
            text = self._world.read(DISK_JSON)
        except FileNotFoundError:
            return
        if text not in self._seen:
            self.faults += [f"{fault} in\n{text}" for fault in text_objections(text)]
            self._seen.add(text)


def directories(world):
    """{device name: directory name} of the published partitions."""
    return {name: part.disk_name for name, part in world.parts().items()}


def wait_directories(world, expected, timeout=40):
    """Wait until exactly these partitions are published under these directories."""
    world.wait(lambda: directories(world) == expected, timeout,
               lambda: f"{expected} in disk.json, where {directories(world)} stands")


def wait_mounted(world, expected, timeout=40):
    """Wait until exactly these devices are mounted and published, {device name: directory}."""
    paths = {f"/dev/{name}": f"/tmp/mountd/{place}" for name, place in expected.items()}
    world.wait(lambda: world.mounted() == paths, timeout,
               lambda: f"{paths} mounted, where {world.mounted()} is")
    wait_directories(world, expected, timeout)
