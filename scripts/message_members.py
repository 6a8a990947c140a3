#!/usr/bin/python3
"""Fails if a name of a member of the messages between front and worker is in a source other than MessageMembers.h.

usage: message_members.py [ROOT]   (the project's root: by default the directory above this script's)
"""

import re
import sys

sys.dont_write_bytecode = True
import tree_check  # noqa: E402

NAMES = "adminhostd/MessageMembers.h"
SOURCES = {".cpp", ".h"}
MEMBER = re.compile(r'member\(\s*("[A-Za-z.]+")')


def findings(root):
    members = set(MEMBER.findall((root / NAMES).read_text(encoding="utf-8")))
    if not members:
        yield f"{NAMES}: no names of members were found"
        return
    anywhere = re.compile("|".join(sorted(map(re.escape, members))))
    for path in sorted(root.glob("*/**/*")):
        name = path.relative_to(root).as_posix()
        if path.suffix not in SOURCES or name == NAMES or name.startswith((".", "build")):
            continue
        for number, line in enumerate(path.read_text(encoding="utf-8").splitlines(), 1):
            for member in anywhere.findall(line):
                yield f"{name}:{number}: names the member {member} of a message, which only {NAMES} may"


tree_check.run(findings)
