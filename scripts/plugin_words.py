#!/usr/bin/python3
"""Fails if the host or the generic client names something that only a plug-in knows.

usage: plugin_words.py [ROOT]   (the project's root: by default the directory above this script's)

The words are not listed here: they are the commands, keys, words and columns in the descriptions (commands/*.toml), and the
tools, tables and names of several words that the plug-in's own rooms have in literals. A compound word ("server_port",
"getCameras") is looked for everywhere, because it is not written by chance. Of the plain words, only the names of lists and
dictionaries are looked for, because the name of a single value ("name") may be anyone's: a dictionary's ("configuration") as a
whole string literal, a list's ("cameras") as a word within one.

Some words of the plug-in are not its own and are permitted: plain words that the daemon's own documentation defines
(docs/http.md, and the form of a description in commands/README.md), and a key that a room of platform/ documents in a header
and uses in its source.
"""

import re
import sys
import tomllib

sys.dont_write_bytecode = True
import tree_check  # noqa: E402

HOST = ["adminhostd", "platform", "adminhostctl"]
# The verbs of this one service with examples of the others, and the program that joins them.
NOT_HOST = ["adminhostctl/lumio", "adminhostctl/program"]
PLUGIN = ["plugin", "handler", "resources", "settings", "commands"]
SOURCES = {".cpp", ".h"}
TEXT = re.compile(r'"((?:[^"\\\n]|\\.)*)"')
TABLE = re.compile(r"\b(?:from|into|update|join|table) +([a-z_]+)", re.IGNORECASE)
TOOL = re.compile(r"^/(?:usr/)?s?bin/([^/ ]+)$")
IDENTIFIER = re.compile(r"^[a-z_][A-Za-z0-9_]*$")
# A word made of several words, which is not written by chance.
COMPOUND = re.compile(r"[a-z]+[A-Z]|[A-Za-z]_[A-Za-z]|[A-Za-z][0-9]$")


def read(path):
    return path.read_text(encoding="utf-8")


def described(root):
    """The words of the descriptions, and those of them that name lists and dictionaries, and lists only."""
    words = set()
    containers = set()
    lists = set()
    for path in sorted((root / "commands").glob("*.toml")):
        command = tomllib.loads(read(path))
        words.add(path.stem)
        for section in ("keys", "answer"):
            for key, description in command.get(section, {}).items():
                steps = [step for step in re.split(r"\[\]|\.", key) if step]
                words |= set(steps)
                if description["type"] in ("list", "dictionary"):
                    containers.add(steps[-1])
                if description["type"] == "list":
                    lists.add(steps[-1])
                words |= set(description.get("allowed", []))
                words |= set(description.get("entry", {}).get("columns", []))
    return words, containers, lists


def named(root):
    """Tools, tables and other names in the literals of the plug-in's own sources."""
    words = set()
    for room in PLUGIN:
        for path in sorted((root / room).rglob("*")):
            if path.suffix not in SOURCES:
                continue
            for text in TEXT.findall(read(path)):
                if tool := TOOL.match(text):
                    words.add(tool[1])
                if IDENTIFIER.match(text) and COMPOUND.search(text):
                    words.add(text)
                if text.lower().startswith(("select ", "insert ", "update ", "delete ")):
                    words |= set(TABLE.findall(text))
    return words


def documented(root):
    """Words that the daemon's own documentation defines."""
    form = read(root / "commands/README.md").partition("## The form that clients get")[2]
    spans = re.findall(r"`([A-Za-z_]+)`", read(root / "docs/http.md"))
    return set(spans) | set(re.findall(r"[A-Za-z_]+", form))


def of_the_platform(root):
    """Keys that a room of the platform documents in a header and writes in its source."""
    keys = set()
    for room in (root / "platform").iterdir():
        def literals(suffix):
            return {text for path in room.glob("*" + suffix) for text in TEXT.findall(read(path))}
        keys |= literals(".h") & literals(".cpp")
    return keys


def one_of(words):
    """A pattern that finds each of them as a whole word, and no word if there are none."""
    return re.compile(r"(?<![A-Za-z0-9_])(" + ("|".join(sorted(map(re.escape, words))) or "(?!)") + r")(?![A-Za-z0-9_])")


def findings(root):
    words, containers, lists = described(root)
    words |= named(root)
    rare = {word for word in words if COMPOUND.search(word)} - of_the_platform(root)
    plain = containers - rare - documented(root) - of_the_platform(root)
    if len(rare) < 20:
        yield f"only {len(rare)} words are known: the descriptions are not where they were"
        return
    anywhere = one_of(rare)
    in_literals = one_of(plain & lists)
    for room in HOST:
        for path in sorted((root / room).rglob("*")):
            name = path.relative_to(root).as_posix()
            if path.suffix not in SOURCES or any((name + "/").startswith(other + "/") for other in NOT_HOST):
                continue
            for number, line in enumerate(read(path).splitlines(), 1):
                code = line.partition("//")[0]
                found = anywhere.findall(line)
                for text in TEXT.findall(code):
                    found += [text] if text in plain else in_literals.findall(text)
                for word in found:
                    yield f"{name}:{number}: names \"{word}\", which only the plug-in knows"


tree_check.run(findings)
