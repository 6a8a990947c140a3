#!/usr/bin/python3
"""Fails on an include edge that the picture in docs/architecture.md does not have.

usage: include_edges.py [ROOT]   (the project's root: by default the directory above this script's)
"""

import re
import sys

sys.dont_write_bytecode = True
import tree_check  # noqa: E402

SOURCES = {".cpp", ".h"}
INCLUDE = re.compile(r'^\s*#\s*include\s*"([^"]+)"')
# Room: the rooms and folders that it may include besides itself. Rooms and folders are path prefixes. The longest prefix of
# a file's path counts, so an entry for a room or folder inside another room overrides that room's entry.
CONTROL = {"platform/value", "platform/text", "platform/plist", "platform/json", "platform/files", "platform/release"}
CLIENT = CONTROL | {"platform/task"}
MAY_INCLUDE = {
    "platform": set(),
    "codec": {"platform"},
    "krb5": {"platform"},
    "commands": {"platform"},
    "settings": {"platform", "codec", "krb5"},
    "resources": {"platform", "codec", "krb5", "settings"},
    "handler": {"platform", "codec", "krb5", "settings", "resources", "commands"},
    "plugin": {"platform", "codec", "krb5", "settings", "resources", "commands", "handler"},
    "adminhostd": {"platform"},
    "adminhostctl": CLIENT,
    "adminhostctl/desired": CONTROL | {"adminhostctl"},
    "adminhostctl/lumio": CONTROL | {"adminhostctl", "adminhostctl/desired"},
    "adminhostctl/program": CONTROL | {"adminhostctl", "adminhostctl/desired", "adminhostctl/lumio"},
}
PICTURE = "A room may include only the rooms to its right:"
TOP = {room.split("/", 1)[0] for room in MAY_INCLUDE}
FREE = {"tests", "bench", "fuzz"}


def longest(path, prefixes):
    """The longest of the prefixes that the path is or is below, or None."""
    return max((p for p in prefixes if (path + "/").startswith(p + "/")), key=len, default=None)


def refused(source, included):
    """Why `source` may not include `included`, or None."""
    origin = longest(source, MAY_INCLUDE)
    allowed = MAY_INCLUDE[origin] | {origin}
    target = longest(included, MAY_INCLUDE.keys() | FREE | allowed)
    if target in allowed:
        return None
    return f"{origin} must not include {target}"


def pictured(text):
    """The table that the picture in the text draws: in each of its lines, a room may include all rooms to its right."""
    picture = text.partition(PICTURE)[2].lstrip("\n").partition("\n\n")[0]
    table = {}
    for line in re.sub(r"\n +->", " ->", picture).splitlines():
        groups = [set(re.split(r", *", group.strip(" {}"))) for group in line.split("->")]
        for i, group in enumerate(groups):
            for room in group:
                table.setdefault(room, set()).update(*groups[i + 1:])
    return table


def differences(root):
    """Rooms for which the table and the picture differ."""
    document = root / "docs/architecture.md"
    if not document.exists():
        return
    picture = pictured(document.read_text(encoding="utf-8"))
    for room, allowed in MAY_INCLUDE.items():
        if room not in picture or picture[room] != allowed:
            shown = ", ".join(sorted(picture.get(room, set()) ^ allowed)) or "the room itself"
            yield f"docs/architecture.md: the picture differs from the table of include_edges.py for {room}: {shown}"
    parts = set().union(*MAY_INCLUDE.values())  # "platform/value": a part of a room, without an entry of its own
    for room in sorted(picture.keys() - MAY_INCLUDE.keys() - parts):
        yield f"docs/architecture.md: the picture has the room {room}, which the table of include_edges.py does not have"


def check(root):
    yield from differences(root)
    for path in sorted(root.glob("*/**/*")):
        name = path.relative_to(root).as_posix()
        top = name.split("/", 1)[0]
        if path.suffix not in SOURCES or top in FREE or top.startswith((".", "build")) or top == "node_modules":
            continue
        if top not in TOP:
            yield f"{name}: a room that the picture does not have"
            continue
        for number, line in enumerate(path.read_text(encoding="utf-8").splitlines(), 1):
            match = INCLUDE.match(line)
            # Includes start at the project's root. A file that is not there is generated, or the compiler reports it.
            if match and match[1].split("/", 1)[0] in TOP | FREE:
                why = refused(name, match[1])
                if why:
                    yield f"{name}:{number}: {match[1]}: {why}"


tree_check.run(check)
