"""The root's own account files: /etc/passwd and /etc/group."""

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


def write(root, count):
    etc = root / "etc"
    etc.mkdir(parents=True, exist_ok=True)
    with open(etc / "passwd", "w", encoding="utf-8") as out:
        for name, uid, gid, full_name in users(count):
            out.write(f"{name}:x:{uid}:{gid}:{full_name},,,:/home/{name}:/bin/sh\n")
    with open(etc / "group", "w", encoding="utf-8") as out:
        for name, gid, members in groups(count):
            out.write(f"{name}:x:{gid}:{','.join(members)}\n")
