"""Calls and answers held against their schemas."""

import json

import jsonschema
from web.router import Plugin

from world import CHECKOUT

FOLDER = CHECKOUT / "docs/ubus"
METHODS = ("list", "remove", "remove_disk", "safe_remove")
SCHEMAS = {method: json.loads((FOLDER / f"{method}.schema.json").read_text()) for method in METHODS}
_ANSWERS = {method: jsonschema.Draft7Validator({**schema["properties"]["answer"],
                                                "definitions": schema.get("definitions", {})})
            for method, schema in SCHEMAS.items()}
_CALLS = {method: jsonschema.Draft7Validator(schema["properties"]["call"])
          for method, schema in SCHEMAS.items()}


def objections(method, answer):
    """What the schema has against an answer, as texts."""
    return [f"{error.json_path}: {error.message}" for error in _ANSWERS[method].iter_errors(answer)]


def is_call(method, arguments):
    """True for arguments that the schema allows."""
    return _CALLS[method].is_valid(arguments)


def words(field):
    """The words that an answer to "list" may have as reason of a "part" or of an "unused" device."""
    return SCHEMAS["list"]["definitions"][field]["properties"]["reason"]["enum"]


class CheckedPlugin(Plugin):
    """The plugin, each answer of which is as its schema says."""

    def call(self, method, arguments=None, timeout=20):
        answer = super().call(method, arguments, timeout)
        assert objections(method, answer) == [], answer
        return answer
