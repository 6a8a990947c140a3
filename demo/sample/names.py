"""UUIDs of the sample service: name-based (RFC 4122, version 5), so that every root of one size is the same.

A user or a group of the root's own account files has the UUID of "user:NAME" or "group:NAME" in NAMESPACE, the rule by
which the service's configuration tool writes access lists. Upper-case text, as the service stores it.
"""

import uuid

NAMESPACE = uuid.UUID("3f0e2a54-8c5b-5d0e-9a41-6d1f0c7b2e90")


def uuid_of(kind, name):
    return str(uuid.uuid5(NAMESPACE, f"{kind}:{name}")).upper()


def user(name):
    return uuid_of("user", name)


def group(name):
    return uuid_of("group", name)
