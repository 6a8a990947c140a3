#!/usr/bin/python3
"""Fails if one program has two types, or two source files, of the same name.

usage: twin_names.py [ROOT]   (the project's root: by default the directory above this script's)

Two names of one thing in one program confuse every reader, also in different namespaces. Types inside other types do not
count: they are named after the outer one (Probe::State).
"""

import collections
import re
import sys

sys.dont_write_bytecode = True
import tree_check  # noqa: E402

PLUGIN = ["plugin", "handler", "resources", "settings", "codec", "krb5", "commands"]
# The worker loads the plug-in, so both are one program.
PROGRAMS = {"daemon": ["platform", "adminhostd", *PLUGIN], "command line": ["platform", "adminhostctl"]}
SOURCES = {".cpp", ".h"}
# A definition at the beginning of a line: inside another type it is indented.
TYPE = re.compile(r"^(?:enum class|enum|class|struct)(?: ADMINHOST_EXPORT)? (\w+)(?: final)?(?: *:(?!:)[^;]*)? *\{")


def twins(root, rooms):
    types = collections.defaultdict(set)
    files = collections.defaultdict(set)
    for room in rooms:
        for path in sorted((root / room).rglob("*")):
            if path.suffix not in SOURCES:
                continue
            name = path.relative_to(root)
            files[path.name].add(name.as_posix())
            for line in path.read_text(encoding="utf-8").splitlines():
                if match := TYPE.match(line):
                    types[match[1]].add(name.as_posix())
    for what, found in (("types", types), ("files", files)):
        for name, places in sorted(found.items()):
            if len(places) > 1:
                yield f"{', '.join(sorted(places))}: {what} of the same name {name}"


def findings(root):
    return sorted({finding for rooms in PROGRAMS.values() for finding in twins(root, rooms)})


tree_check.run(findings)
