"""Edits access lists and removes cameras: lumioconfig.py ROOT ARGUMENTS (see usage below).

Statuses: 0 done, 2 no such resource or person (nothing is changed), 64 usage, 74 database trouble.
"""

import os
import re
import sqlite3
import sys

import names

USAGE = """usage: lumioconfig --add_access|--remove_access --resource_type camera|workflow --resource_uuid UUID
                   --record_type user|group --shortname NAME [--shortname NAME]...
       lumioconfig --remove_camera UUID"""
TABLES = {"camera": "cameras", "workflow": "workflows"}


def fail(status, text):
    print(text, file=sys.stderr)
    sys.exit(status)


def database_path(root):
    """The production database that the location file names, below the root."""
    tokens = open(root + "/var/lumio/server/database.yml", encoding="utf-8").read().split()
    after = tokens[tokens.index("production:"):]
    path = after[after.index("database:") + 1].strip('"')
    return root + os.path.normpath("/" + path.lstrip("/"))


def is_account(root, record_type, name):
    file = root + ("/etc/passwd" if record_type == "user" else "/etc/group")
    with open(file, encoding="utf-8") as lines:
        if any(line.split(":", 1)[0] == name for line in lines):
            return True
    try:  # people of a directory server
        with open(root + "/etc/demo/directory", encoding="utf-8") as lines:
            return any(line.rstrip("\n") == f"{record_type}:{name}" for line in lines)
    except FileNotFoundError:
        return False


def resource_id(database, resource_type, uuid):
    row = database.execute(f"SELECT id FROM {TABLES[resource_type]} WHERE uuid = ?", (uuid,)).fetchone()
    if row is None:
        fail(2, f"lumioconfig: no {resource_type} {uuid}")
    return row[0]


def remove_camera(database, uuid):
    row = resource_id(database, "camera", uuid)
    database.execute("DELETE FROM access_control_entries WHERE resource_type = 'Camera' AND resource_id = ?", (row,))
    database.execute("DELETE FROM cameras WHERE id = ?", (row,))


def change_access(database, root, command, options):
    row = resource_id(database, options["--resource_type"], options["--resource_uuid"])
    record_type = options["--record_type"]
    resource = options["--resource_type"].capitalize()
    for name in options["--shortname"]:
        if command == "--add_access" and not is_account(root, record_type, name):
            fail(2, f"lumioconfig: no {record_type} {name}")
    for name in options["--shortname"]:
        # An account that is gone is named by its UUID.
        is_uuid = command == "--remove_access" and re.fullmatch(r"[0-9A-Fa-f]{8}(-[0-9A-Fa-f]{4}){3}-[0-9A-Fa-f]{12}", name)
        entry = (name.upper() if is_uuid else names.uuid_of(record_type, name), resource, row)
        if command == "--remove_access":
            database.execute("DELETE FROM access_control_entries WHERE upper(record_uuid) = ?"
                             " AND resource_type = ? AND resource_id = ?", entry)
        else:
            database.execute("INSERT INTO access_control_entries (record_uuid, record_type, resource_type, resource_id)"
                             " SELECT ?1, ?4, ?2, ?3 WHERE NOT EXISTS (SELECT 1 FROM access_control_entries"
                             " WHERE upper(record_uuid) = ?1 AND resource_type = ?2 AND resource_id = ?3)",
                             entry + (record_type,))


def parse(arguments):
    if len(arguments) % 2 != 0:
        fail(64, USAGE)
    options = {"--shortname": []}
    for key, value in zip(arguments[::2], arguments[1::2]):
        if key == "--shortname":
            options[key].append(value)
        else:
            options[key] = value
    if (set(options) != {"--resource_type", "--resource_uuid", "--record_type", "--shortname"} or not options["--shortname"]
            or options["--resource_type"] not in TABLES or options["--record_type"] not in ("user", "group")):
        fail(64, USAGE)
    return options


def main():
    root, arguments = sys.argv[1], sys.argv[2:]
    command = arguments[0] if arguments else ""
    try:
        database = sqlite3.connect(f"file:{database_path(root)}?mode=rw", uri=True, timeout=3)
        with database:
            if command == "--remove_camera" and len(arguments) == 2:
                remove_camera(database, arguments[1])
            elif command in ("--add_access", "--remove_access"):
                change_access(database, root, command, parse(arguments[1:]))
            else:
                fail(64, USAGE)
    except (OSError, ValueError, sqlite3.Error) as error:
        fail(74, f"lumioconfig: {error}")


main()
