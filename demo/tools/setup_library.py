"""Creates a library: setup_library.py ROOT. Files that exist already are not changed."""

import os
import plistlib
import sys

import names
import protect


def make(path, value, mode):
    if not os.path.exists(path):
        with open(path, "wb") as out:
            plistlib.dump(value, out)
        os.chmod(path, mode)


def main():
    root = sys.argv[1]
    try:
        with open(root + "/Library/Preferences/com.brenn.lumioserverd.plist", "rb") as file:
            shared = plistlib.load(file)["shared_filesystem"]
    except (OSError, ValueError, KeyError) as error:
        sys.exit(f"setup_lumioserverd_library: no shared file system: {error!r}")
    library = root + os.path.normpath("/" + shared.lstrip("/"))  # a relative path or ".." leads nowhere but below the root
    try:
        os.makedirs(library + "/Server/Secrets", exist_ok=True)
        make(library + "/lumioserverd.plist", {"library_version": "2.4", "server_uuid": names.uuid_of("server", shared)}, 0o644)
        make(library + "/Server/Secrets/kek.plist", {"lumio_secret": protect.secret()}, 0o600)
    except OSError as error:
        sys.exit(f"setup_lumioserverd_library: {error}")


main()
