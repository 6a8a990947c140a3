"""The sample service's accounts: in the root's /etc/passwd and /etc/group, or its people in LDIF for a directory server."""

import base64

import names

SUFFIX = "dc=academy,dc=example"
FIRST_PERSON = 1000  # ids below belong to the system and are never in the directory server

# name, uid, gid, full name
USERS = [
    ("root", 0, 0, "root"),
    ("daemon", 1, 1, "daemon"),
    ("lumio", 240, 240, "Lumio Service"),
    ("lumiogrid", 241, 240, "Lumio Grid Client"),
    ("anna", 1001, 1001, "Anna Lindqvist"),
    ("ben", 1002, 1001, "Ben Okafor"),
    ("carla", 1003, 1001, "Carla Moreau"),
    ("dmitri", 1004, 1001, "Dmitri Volkov"),
    ("elif", 1005, 1002, "Elif Yıldız"),
    ("juergen", 1006, 1002, "Jürgen Weiß"),
    ("kiosk", 1007, 1002, ""),
]

# name, gid, members
GROUPS = [
    ("root", 0, []),
    ("daemon", 1, []),
    ("lumio", 240, ["lumiogrid"]),
    ("staff", 1001, ["elif"]),
    ("students", 1002, []),
    ("editors", 1003, ["anna", "carla"]),
    ("lecturers", 1004, ["anna", "ben", "dmitri"]),
    ("studio", 1005, ["carla", "elif", "juergen"]),
]

PEOPLE = ["anna", "ben", "carla", "dmitri", "elif", "juergen", "kiosk"]
TEAMS = ["editors", "lecturers", "studio", "students"]


def users(count):
    """The first `count` users: the named ones, then numbered people; None means the named ones."""
    count = len(USERS) if count is None else count
    extra = [(f"user{n:06d}", 20000 + n, 1002, f"Person Number {n}") for n in range(1, count - len(USERS) + 1)]
    return USERS[:count] + extra


def groups(count):
    """The named groups, and one more for every hundred numbered people."""
    extra_users = 0 if count is None else max(0, count - len(USERS))
    extra = []
    for n in range(1, extra_users // 100 + 1):
        members = [f"user{m:06d}" for m in range((n - 1) * 100 + 1, n * 100 + 1)]
        extra.append((f"course{n:04d}", 20000 + n, members))
    return GROUPS + extra


def entry(dn, attributes):
    """One entry in LDIF; texts that are not plain ASCII are in base64."""
    lines = []
    for name, value in [("dn", dn), *attributes]:
        text = str(value)
        plain = text.isascii() and not text.startswith((" ", ":", "<"))
        lines.append(f"{name}: {text}" if plain else f"{name}:: {base64.b64encode(text.encode()).decode()}")
    return "\n".join(lines) + "\n\n"


def write_ldif(path, count):
    """People and groups by RFC 2307, with the UUIDs that they have in the account files."""
    with open(path, "w", encoding="utf-8") as out:
        out.write(entry(SUFFIX, [("objectClass", "domain"), ("dc", "academy")]))
        for unit in ("people", "groups"):
            out.write(entry(f"ou={unit},{SUFFIX}", [("objectClass", "organizationalUnit"), ("ou", unit)]))
        for name, uid, gid, full_name in users(count):
            if uid >= FIRST_PERSON:
                out.write(entry(f"uid={name},ou=people,{SUFFIX}", [
                    ("objectClass", "inetOrgPerson"), ("objectClass", "posixAccount"), ("entryUUID", names.user(name).lower()),
                    ("uid", name), ("cn", full_name or name), ("sn", (full_name or name).split()[-1]), ("uidNumber", uid),
                    ("gidNumber", gid), ("homeDirectory", f"/home/{name}"), ("loginShell", "/bin/sh")]))
        for name, gid, members in groups(count):
            if gid >= FIRST_PERSON:
                out.write(entry(f"cn={name},ou=groups,{SUFFIX}", [
                    ("objectClass", "posixGroup"), ("entryUUID", names.group(name).lower()), ("cn", name), ("gidNumber", gid),
                    *(("memberUid", member) for member in members)]))


def write(root, count, system_only=False):
    """With system_only, people and groups are only in the list in which the configuration tool looks them up."""
    bound = FIRST_PERSON if system_only else float("inf")
    etc = root / "etc"
    etc.mkdir(parents=True, exist_ok=True)
    with open(etc / "passwd", "w", encoding="utf-8") as out:
        for name, uid, gid, full_name in users(count):
            if uid < bound:
                out.write(f"{name}:x:{uid}:{gid}:{full_name},,,:/home/{name}:/bin/sh\n")
    with open(etc / "group", "w", encoding="utf-8") as out:
        for name, gid, members in groups(count):
            if gid < bound:
                out.write(f"{name}:x:{gid}:{','.join(members)}\n")
    if system_only:
        (etc / "demo").mkdir(exist_ok=True)
        with open(etc / "demo" / "directory", "w", encoding="utf-8") as out:
            out.writelines(f"user:{user[0]}\n" for user in users(count))
            out.writelines(f"group:{group[0]}\n" for group in groups(count))
