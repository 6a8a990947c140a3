#!/usr/bin/python3
"""Generates the tables and the reference page from the command descriptions in this directory.

    generate.py table OUT.cpp   the tables of CommandTable.h
    generate.py docs OUT.md     the reference of the commands
    generate.py check OUT.md    status 1, with a message, unless OUT.md is what docs would write

A faulty description (an unknown word, a key whose parent is not described, an example that does not fit) is an error that
names the file.
"""

import base64
import datetime
import json
import pathlib
import sys
import tomllib

TYPES = ["any", "scalar", "text", "integer", "real", "boolean", "date", "data", "list", "dictionary"]
RULES = {
    "statement": "ruleStatement",
    "not_a_column": "ruleNotAColumn",
    "row_number": "ruleRowNumber",
    "identifier": "ruleIdentifier",
    "argument": "ruleArgument",
    "absolute_path": "ruleAbsolutePath",
    "short_names": "ruleShortNames",
    "one_line": "ruleOneLine",
}
RULE_TEXTS = {
    "statement": "no double quote or NUL; at most 95 kB",
    "not_a_column": "not the name of a column of its table, in any case (`rowid`, `oid`, `_rowid_` neither)",
    "row_number": "a decimal number",
    "identifier": "letters, digits and hyphens, not beginning with a hyphen",
    "argument": "no NUL, not beginning with a hyphen; at most 95 kB",
    "absolute_path": "begins with a slash, no NUL",
    "short_names": "all names together at most 1.5 MB",
    "one_line": "no line feed",
}
EFFECTS = {"added": "effectAdded", "removed": "effectRemoved", "changed": "effectChanged", "ignored": "effectNothing"}
UNITS = ["bytes", "megabytes", "seconds", "minutes", "people"]

ACCESS = {
    "read": "It changes nothing.",
    "write": "It changes settings or resources.",
    "control": "It starts or stops the service.",
    "account": "It handles accounts and their passwords.",
}

COMMAND_WORDS = {"order", "summary", "description", "access", "needs", "deadline_seconds", "shows_revision", "takes_revision", "state", "parts", "trials",
                 "errors", "keys", "answer", "include", "example"}
# Words for programs that compare and write a desired state (README.md).
STATE_WORDS = {"section", "identity", "label", "by_identity", "unlisted", "in_file", "kind", "kinds", "secret_if", "file",
               "localized", "of_host", "other_names", "locates", "restart", "looked_up", "shown_by"}
# Unit and sensible range of a setting's number; described where the setting is read.
RANGE_WORDS = {"unit", "minimum", "maximum"}
KEY_WORDS = {"type", "entered_as", "filled_with", "secret", "required", "allowed", "rules", "for", "with", "help", "entry"} | STATE_WORDS | RANGE_WORDS
ANSWER_WORDS = {"type", "secret", "column", "help", "title", "kind", "default_key", "identity", "label"} | RANGE_WORDS
ENTRY_WORDS = {"added_by", "removed_by", "first", "leading_zeros", "otherwise", "added_kinds", "columns", "together"}


class Wrong(Exception):
    pass


def need(condition, message):
    if not condition:
        raise Wrong(message)


def split(path):
    """"a.b[].c" -> ["a", "b", "[]", "c"]"""
    return [step for part in path.split(".") for step in ([part[:-2], "[]"] if part.endswith("[]") else [part])]


def parent(path):
    return path[:-2] if path.endswith("[]") else path.rpartition(".")[0]


def check_keys(keys, words, what, names):
    for path, key in keys.items():
        where = f"{what} {path}"
        need(set(key) <= words, f"{where}: unknown word {sorted(set(key) - words)}")
        need(key.get("type") in TYPES, f"{where}: type must be one of {TYPES}")
        need(key.get("entered_as", "text") in TYPES, f"{where}: unknown entered_as")
        need(set(key.get("rules", [])) <= set(RULES), f"{where}: unknown rule")
        need(set(key.get("for", [])) <= set(EFFECTS), f"{where}: unknown change")
        need(key.get("unit", "bytes") in UNITS, f"{where}: unknown unit")
        need(all(isinstance(key.get(word, 0), int) for word in ("minimum", "maximum")), f"{where}: not a whole number")
        need(key.get("minimum", 0) <= key.get("maximum", key.get("minimum", 0)), f"{where}: minimum is above maximum")
        need(set(key.get("entry", {})) <= ENTRY_WORDS, f"{where}: unknown word in entry")
        need(key.get("help", "").strip(), f"{where}: help is missing")
        for word in ("identity", "kind"):  # of a list's element: keys of it
            need(word not in key or f"{path}.{key[word]}" in keys, f"{where}: {word} is not described")
        need(all(f"{path}.{below}" in keys for below in key.get("title", [])), f"{where}: title is not described")
        need(set(key.get("restart", [])) <= names, f"{where}: restart names an unknown command")
        need(key.get("filled_with", "languages") == "languages", f"{where}: unknown word in filled_with")
        need("filled_with" not in key or key["type"] == "list", f"{where}: filled_with needs a list")
        need("secret_if" not in key or f"{parent(path)}.{key['secret_if']}" in keys, f"{where}: secret_if is not described")
        need(key.get("looked_up", "local_name") == "local_name", f"{where}: unknown word in looked_up")
        above = parent(path)
        if above:
            need(above in keys, f"{where}: {above} is not described")
            wanted = "list" if path.endswith("[]") else "dictionary"
            need(keys[above]["type"] == wanted, f"{where}: {above} must be a {wanted}")


def fits(value, kind):
    single = isinstance(value, (str, bool, int, float, datetime.datetime))
    return {
        "any": True,
        "scalar": single,
        "text": isinstance(value, str),
        "integer": isinstance(value, int) and not isinstance(value, bool),
        "real": isinstance(value, (int, float)) and not isinstance(value, bool),
        "boolean": isinstance(value, bool),
        "date": isinstance(value, datetime.datetime),
        "data": isinstance(value, bytes),
        "list": isinstance(value, list),
        "dictionary": isinstance(value, dict),
    }[kind]


def check_example(value, keys, path, what):
    if path:
        need(path in keys, f"example's {what}: {path} is not described")
        need(fits(value, keys[path]["type"]), f"example's {what}: {path} is not a {keys[path]['type']}")
    if isinstance(value, dict):
        for key, below in value.items():
            check_example(below, keys, f"{path}.{key}" if path else key, what)
    elif isinstance(value, list):
        for below in value:
            check_example(below, keys, f"{path}[]", what)


def from_json(pairs):
    value = dict(pairs)
    if set(value) == {"$date"}:
        return datetime.datetime.fromisoformat(value["$date"].replace("Z", "+00:00"))
    if set(value) == {"$data"}:
        return base64.b64decode(value["$data"])
    return value


def taken_over(commands, own, what, name, seen):
    """The keys of a command with those that it includes from others: what is "keys" or "answer"."""
    keys = dict(own)
    for under, source in commands[name].get("include", {}).get(what, {}).items():
        other, _, path = source.partition(":")
        need(other in commands, f"include: no command {other}")
        need((other, what) not in seen or other == name and what == "keys", f"include: {source} goes round in a circle")
        theirs = dict(own) if other == name else taken_over(commands, commands[other].get(what, {}), what, other,
                                                            seen | {(name, what)})
        need(not path or path in theirs, f"include: {source} is not described")
        for key, description in theirs.items():
            if key == path or not path or key.startswith((path + ".", path + "[]")):
                keys.setdefault((under + key[len(path):]).strip("."), description)
    return keys


def in_tree_order(keys, under=""):
    """Each key right after its parent, so that included keys are in their place."""
    ordered = {}
    for path, key in keys.items():
        if parent(path) == under:
            ordered[path] = key
            ordered |= in_tree_order(keys, path)
    return ordered


def load(directory):
    commands = {}
    for file in sorted(directory.glob("*.toml")):
        try:
            commands[file.stem] = tomllib.loads(file.read_text(encoding="utf-8"))
        except tomllib.TOMLDecodeError as error:
            raise Wrong(f"{file.name}: {error}") from error
    for name, command in commands.items():
        try:
            need(set(command) <= COMMAND_WORDS, f"unknown word {sorted(set(command) - COMMAND_WORDS)}")
            need(command.get("summary", "").strip(), "summary is missing")
            need(isinstance(command.get("order"), int), "order is missing")
            need(command.get("access") in ACCESS, f"access must be one of {list(ACCESS)}")
            need(isinstance(command.get("deadline_seconds", 1), int) and command.get("deadline_seconds", 1) > 0,
                 "deadline_seconds must be a whole number above 0")
            need(all(isinstance(name, str) and name for name in command.get("needs", [])), "needs must be a list of names")
            need(set(command.get("include", {})) <= {"keys", "answer"}, "include has the tables keys and answer")
            command["all_answers"] = taken_over(commands, command.get("answer", {}), "answer", name, {(name, "answer")})
            keys = {path: dict(key) for path, key in
                    taken_over(commands, command.get("keys", {}), "keys", name, {(name, "keys")}).items()}
            for path, key in keys.items():  # a setting is described once, where it is read
                for word in {"help"} | RANGE_WORDS:
                    if word in command["all_answers"].get(path, {}):
                        key.setdefault(word, command["all_answers"][path][word])
            check_keys(keys, KEY_WORDS, "key", set(commands))
            command["all_keys"] = in_tree_order(keys)
            for path, key in keys.items():  # texts of an element that people name it by are those that reading shows
                shown = [key[word] for word in ("label",) if word in key] + key.get("other_names", [])
                need(all(f"{path}.{name}" in keys | command["all_answers"] for name in shown),
                     f"key {path}: label or other_names is not described")
            check_keys(command["all_answers"], ANSWER_WORDS, "answer", set(commands))
            for error in command.get("errors", []):
                need(set(error) in ({"key", "meaning"}, {"code", "meaning"}), "an error has key or code, and meaning")
                need("key" not in error or error["key"] in command["all_answers"], f"error {error}: not an answer key")
            for section, text in command.get("parts", {}).items():
                command["parts"][section] = json.loads(text, object_pairs_hook=from_json)
                check_example(command["parts"][section], keys, "", f"part {section}")
            need(("trials" in command) == (command.get("state") == "try"), "trials belong to state = \"try\"")
            for trial in command.get("trials", []):
                need({"name", "needs", "error"} <= set(trial) <= {"name", "needs", "uses", "error", "detail"}, f"trial {trial}: wrong words")
                need(all(key in keys for key in trial["needs"] + trial.get("uses", [])), f"trial {trial['name']}: not a request key")
                need(all(trial.get(word, trial["error"]) in command["all_answers"] for word in ("error", "detail")), f"trial {trial['name']}: not an answer key")
            need("request" in command.get("example", {}), "example.request is missing")
            for what, described in (("request", keys), ("answer", command["all_answers"])):
                if what in command["example"]:
                    value = json.loads(command["example"][what], object_pairs_hook=from_json)
                    check_example(value, described, "", what)
                    command["example"][what] = value
        except Wrong as error:
            raise Wrong(f"{name}.toml: {error}") from error
    for word in ("read", "write", "try", "names"):
        need(sum(command.get("state") == word for command in commands.values()) <= 1, f"two commands have state = {word}")
    need(all(command.get("state", "read") in ("read", "write", "try", "names") for command in commands.values()), "state is read, write, try or names")
    by_order = {}
    for name, command in commands.items():
        other = by_order.setdefault(command["order"], name)
        need(other == name, f"{other}.toml and {name}.toml have the same order, {command['order']}")
    return dict(sorted(commands.items(), key=lambda item: item[1]["order"]))


# The description that clients get: also the source of docs and of the table.

def key_description(path, key):
    described = {"path": path, "type": key["type"], "help": key["help"].strip()}
    for word in ("entered_as", "filled_with"):
        if key.get(word):
            described[camel(word)] = key[word]
    for word in ("secret", "required"):
        if key.get(word):
            described[word] = True
    for word in ("allowed", "rules"):
        if key.get(word):
            described[word] = key[word]
    for word in ("unit", "minimum", "maximum", "column", "title", "default_key"):
        if word in key:
            described[camel(word)] = key[word]
    for word in sorted(STATE_WORDS):
        if key.get(word):
            described[camel(word)] = key[word]
    for word in ("added_by", "removed_by"):
        if key.get("entry", {}).get(word):
            described[camel(word)] = key["entry"][word]
    return described


def camel(word):
    first, *rest = word.split("_")
    return first + "".join(part.capitalize() for part in rest)


def describe(name, command):
    return {
        "name": name,
        "summary": command["summary"].strip(),
        "description": " ".join(command.get("description", command["summary"]).split()),
        **{word: command[word] for word in ("state", "parts", "trials") if word in command},
        "keys": [key_description(path, key) for path, key in command["all_keys"].items()],
        "answer": [key_description(path, key) for path, key in command["all_answers"].items()],
        "errors": command.get("errors", []),
        "example": command["example"],
    }


# C++

def quoted(text):
    out = ""
    for byte in text.encode():
        char = chr(byte)
        out += "\\" + char if char in "\"\\" else char if 32 <= byte < 127 else f"\\{byte:03o}"
    return f'"{out}"'


class Table:
    """Writes the constants below others first, so that each can name what it points to."""

    def __init__(self):
        self.lines = []
        self.count = 0

    def name(self, prefix):
        self.count += 1
        return f"{prefix}{self.count}"

    def texts(self, texts):
        if not texts:
            return "{}"
        name = self.name("texts")
        self.lines.append(f"constexpr std::string_view {name}[] = {{{', '.join(quoted(t) for t in texts)}}};")
        return name

    def entry(self, entry):
        if entry is None:
            return "nullptr"
        parts = [
            quoted(entry.get("added_by", "")),
            quoted(entry.get("removed_by", "")),
            "true" if entry.get("first", "removed") == "added" else "false",
            "true" if entry.get("leading_zeros") else "false",
            EFFECTS[entry.get("otherwise", "changed")],
            self.texts(entry.get("added_kinds")),
            self.texts(entry.get("columns")),
            self.texts(entry.get("together")),
        ]
        name = self.name("entry")
        self.lines.append(f"constexpr EntryDescription {name} = {{{', '.join(parts)}}};")
        return "&" + name

    def keys(self, keys, under):
        rows = []
        for path, key in keys.items():
            if parent(path) != under:
                continue
            children = self.keys(keys, path)
            rules = " | ".join(RULES[rule] for rule in key.get("rules", [])) or "0"
            changes = " | ".join(EFFECTS[effect] for effect in key.get("for", EFFECTS))
            rows.append(f"{{{quoted(split(path)[-1])}, KeyType::{key['type']}, {rules}, {changes}, "
                        f"{self.texts(key.get('with'))}, {children}, {self.entry(key.get('entry'))}}}")
        if not rows:
            return "{}"
        name = self.name("keys")
        self.lines.append(f"constexpr KeyDescription {name}[] = {{\n    " + ",\n    ".join(rows) + ",\n};")
        return name

    def commands(self, commands):
        rows = []
        for name, command in commands.items():
            described = describe(name, command)
            flags = ", ".join("true" if command.get(flag) else "false" for flag in ("shows_revision", "takes_revision"))
            rows.append(f"{{{quoted(name)}, {quoted(described['summary'])}, adminhost::Access::{command['access']}, {flags}, "
                        f"{self.texts(command.get('needs'))}, {command.get('deadline_seconds', 0)}, "
                        f"{self.keys(command['all_keys'], '')}}}")
        self.lines.append("constexpr CommandDescription table[] = {\n    " + ",\n    ".join(rows) + ",\n};")

    def tokens(self, value, key=""):
        def token(kind, text="", number=0):
            return f"{{DescriptionToken::Kind::{kind}, {quoted(key)}, {quoted(text)}, {number}}}"
        if isinstance(value, dict):
            return [token("dictionary", number=len(value))] + [t for k, v in value.items() for t in self.tokens(v, k)]
        if isinstance(value, list):
            return [token("list", number=len(value))] + [t for v in value for t in self.tokens(v)]
        if isinstance(value, bool):
            return [token("boolean", number=int(value))]
        if isinstance(value, int):
            return [token("integer", number=value)]
        if isinstance(value, datetime.datetime):
            return [token("date", number=int(value.timestamp()))]
        need(isinstance(value, str), f"a description cannot carry {value!r}")
        return [token("text", value)]


def table(commands):
    out = Table()
    out.commands(commands)
    tokens = out.tokens([describe(name, command) for name, command in commands.items()])
    out.lines.append("constexpr DescriptionToken tokens[] = {\n    " + ",\n    ".join(tokens) + ",\n};")
    return (
        "// Generated from commands/*.toml by commands/generate.py.\n\n"
        '#include "commands/CommandTable.h"\n\n'
        "namespace lumio {\nnamespace {\n\n" + "\n".join(out.lines) + "\n\n}  // namespace\n\n"
        "std::span<const CommandDescription> commands() noexcept { return table; }\n"
        "std::span<const DescriptionToken> descriptionTokens() noexcept { return tokens; }\n\n"
        "}  // namespace lumio\n"
    )


# Documentation

TYPE_TEXTS = {"any": "anything", "scalar": "single value", "integer": "whole number", "real": "number", "boolean": "yes or no"}


def cell(text):
    return text.replace("|", "\\|").replace("\n", " ")


def key_rows(keys):
    rows = []
    for key in keys:
        notes = [key["help"]]
        if key.get("allowed"):
            notes.append("One of " + ", ".join(f"`{word}`" for word in key["allowed"]) + ".")
        if key.get("required"):
            notes.append("Required.")
        if key.get("secret"):
            notes.append("Secret.")
        for rule in key.get("rules", []):
            notes.append(f"Check: {RULE_TEXTS[rule]}.")
        if "minimum" in key:
            notes.append(f"Sensible: {key['minimum']} to {key['maximum']}." if "maximum" in key
                         else f"Sensible: {key['minimum']} or more.")
        kind = TYPE_TEXTS.get(key["type"], key["type"])
        if key.get("unit") and key["unit"] != "people":
            kind += f", {key['unit']}"
        rows.append(f"| `{key['path']}` | {kind} | {cell(' '.join(notes))} |")
    return rows


def to_json(value):
    if isinstance(value, datetime.datetime):
        return {"$date": value.strftime("%Y-%m-%dT%H:%M:%SZ")}
    raise TypeError(value)


def docs(commands):
    out = [
        "# Commands", "",
        "Generated from `commands/*.toml` by `commands/generate.py docs docs/commands.md`; change those, not this page.", "",
        "Lists are written `name[]`; a dictionary's keys follow after a dot. If a required key is missing, the command",
        "itself returns an error. A request that fails one of the checks named here is rejected as a whole, before anything",
        "is changed.", "",
        "| command | what it does |", "|---|---|",
    ]
    out += [f"| [`{name}`](#{name.lower()}) | {cell(command['summary'])} |" for name, command in commands.items()]
    for name, command in commands.items():
        described = describe(name, command)
        out += ["", f"## {name}", "", command.get("description", command["summary"]).strip(), ""]
        notes = [text for flag, text in (
            ("shows_revision", "The answer has the revision of the settings."),
            ("takes_revision", "A client can make it depend on the revision that it has read."),
        ) if command.get(flag)]
        notes.insert(0, f"Access: {command['access']}. {ACCESS[command['access']]}")
        if command.get("needs"):
            notes.append(f"It needs the service's {' and '.join(command['needs'])}.")
        if command.get("deadline_seconds"):
            notes.append(f"Time limit: {command['deadline_seconds']} seconds.")
        out += [" ".join(notes), ""]
        if described["keys"]:
            out += ["| key | type | |", "|---|---|---|"] + key_rows(described["keys"]) + [""]
        if described["answer"]:
            out += ["| answer | type | |", "|---|---|---|"] + key_rows(described["answer"]) + [""]
        else:
            out += ["The answer is empty.", ""]
        if described["errors"]:
            out += ["| error | meaning |", "|---|---|"]
            out += [f"| `{error.get('key', error.get('code'))}` | {cell(error['meaning'])} |" for error in described["errors"]]
            out.append("")
        out += ["Example:", "", "```json"]
        out += [json.dumps(described["example"][what], default=to_json, indent=2, ensure_ascii=False)
                for what in ("request", "answer") if what in described["example"]]
        out.append("```")
    return "\n".join(out) + "\n"


def main(arguments):
    if len(arguments) != 2 or arguments[0] not in ("table", "docs", "check"):
        print(__doc__, file=sys.stderr)
        return 2
    what, path = arguments[0], pathlib.Path(arguments[1])
    try:
        commands = load(pathlib.Path(__file__).resolve().parent)
        text = table(commands) if what == "table" else docs(commands)
    except Wrong as error:
        print(f"commands: {error}", file=sys.stderr)
        return 1
    if what == "check":
        if path.read_text(encoding="utf-8") != text:
            print(f"{path} is stale: run commands/generate.py docs {path}", file=sys.stderr)
            return 1
        return 0
    path.parent.mkdir(parents=True, exist_ok=True)
    path.write_text(text, encoding="utf-8")
    return 0


sys.exit(main(sys.argv[1:]))
