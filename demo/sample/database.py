"""The service database: its five tables, filled from the library."""

import datetime
import itertools
import sqlite3

import accounts
import library
import names
import protect

SCHEMA = """
CREATE TABLE cameras (
  id INTEGER PRIMARY KEY AUTOINCREMENT, name TEXT, uuid TEXT NOT NULL,
  create_user_uuid TEXT, created_at TEXT, update_user_uuid TEXT, updated_at TEXT,
  last_recording_uuid TEXT, use_user_uuid TEXT, used_at TEXT,
  recording_status TEXT, access_control_enabled TEXT, disabled TEXT);
CREATE TABLE workflows (
  id INTEGER PRIMARY KEY AUTOINCREMENT, uuid TEXT NOT NULL, bundle_path TEXT, bundle_version TEXT,
  create_user_uuid TEXT, created_at TEXT, updated_at TEXT, use_user_uuid TEXT, used_at TEXT,
  run_count INTEGER DEFAULT 0, disabled TEXT, access_control_enabled TEXT);
CREATE TABLE properties (
  id INTEGER PRIMARY KEY AUTOINCREMENT, name TEXT, value TEXT, protect TEXT, created_at TEXT, updated_at TEXT);
CREATE TABLE jobs (
  id INTEGER PRIMARY KEY AUTOINCREMENT, uuid TEXT NOT NULL, workflow_uuid TEXT,
  nimbo_job_id TEXT, nimbo_job_status TEXT, created_at TEXT, updated_at TEXT);
CREATE TABLE access_control_entries (
  id INTEGER PRIMARY KEY AUTOINCREMENT, record_uuid TEXT, record_type TEXT, resource_type TEXT, resource_id INTEGER);
CREATE INDEX cameras_uuid ON cameras (uuid);
CREATE INDEX workflows_uuid ON workflows (uuid);
CREATE INDEX access_control_entries_resource ON access_control_entries (resource_type, resource_id);
"""

NEWEST = datetime.datetime(2026, 1, 30, 16, 45)


def moment(days_ago, minutes=0):
    """Local time as the service writes it; always in daytime, where every zone has that time."""
    return (NEWEST - datetime.timedelta(days=days_ago, minutes=minutes % 480)).strftime("%Y-%m-%d %H:%M:%S")


def person(name):
    return None if name is None else names.user(name)


def access_rows(resource_type, resource_id, entries):
    for entry in entries:
        kind, name = entry.split(":", 1)
        yield (names.uuid_of(kind, name), kind, resource_type, resource_id)


def camera_rows(cameras):
    for n, (name, status, disabled, access, _, user) in enumerate(cameras, 1):
        uuid = names.uuid_of("camera", name)
        yield (name, uuid, names.user("anna"), moment(400, n), names.user("ben"), moment(n % 30, n),
               names.uuid_of("recording", name) if user else None, person(user), moment(n % 7, n) if user else None,
               status, access, disabled)


def workflow_rows(workflows):
    for n, (directory, disabled, access, _, user, _, _) in enumerate(workflows, 1):
        yield (names.uuid_of("workflow", directory), "Workflows/" + directory, "2.4", names.user("anna"), moment(300, n),
               moment(n % 20, n), person(user), moment(n % 5, n) if user else None, n * 3, disabled, access)


def property_rows(properties):
    for n, (name, value, is_protected) in enumerate(properties, 1):
        stored = protect.protected(value) if is_protected else value
        yield (name, stored, "t" if is_protected else "f", moment(200, n), moment(n % 40, n))


def job_rows(count, workflows):
    for n in range(1, count + 1):
        status = library.JOB_STATUSES[(n - 1) % len(library.JOB_STATUSES)]
        workflow = names.uuid_of("workflow", workflows[n % len(workflows)][0]) if workflows else None
        yield (names.uuid_of("job", str(n)), workflow, str(7000 + n) if status else None, status,
               moment(n % 90, n), moment(n % 90, n))


def table_rows(cameras, workflows, entries_per_resource):
    """The access lists: the library's own, or that many entries for each resource, users and groups in turn."""
    everyone = itertools.cycle([f"user:{n}" for n in accounts.PEOPLE] + [f"group:{n}" for n in accounts.TEAMS])
    for resource_type, rows, place in (("Camera", cameras, 4), ("Workflow", workflows, 3)):
        for n, row in enumerate(rows, 1):
            entries = row[place]
            if entries_per_resource is not None:
                entries = list(itertools.islice(everyone, entries_per_resource))
            yield from access_rows(resource_type, n, entries)


def write(path, cameras, workflows, properties, jobs, entries_per_resource):
    database = sqlite3.connect(path)
    database.execute("PRAGMA synchronous = OFF")  # a new file: nothing to lose
    database.executescript(SCHEMA)

    def insert(table, columns, rows):
        marks = ",".join("?" * len(columns.split(",")))
        database.executemany(f"INSERT INTO {table} ({columns}) VALUES ({marks})", rows)

    with database:
        insert("cameras", "name,uuid,create_user_uuid,created_at,update_user_uuid,updated_at,last_recording_uuid,"
               "use_user_uuid,used_at,recording_status,access_control_enabled,disabled", camera_rows(cameras))
        insert("workflows", "uuid,bundle_path,bundle_version,create_user_uuid,created_at,updated_at,use_user_uuid,"
               "used_at,run_count,disabled,access_control_enabled", workflow_rows(workflows))
        insert("properties", "name,value,protect,created_at,updated_at", property_rows(properties))
        insert("jobs", "uuid,workflow_uuid,nimbo_job_id,nimbo_job_status,created_at,updated_at",
               job_rows(jobs, workflows))
        insert("access_control_entries", "record_uuid,record_type,resource_type,resource_id",
               table_rows(cameras, workflows, entries_per_resource))
    database.close()
