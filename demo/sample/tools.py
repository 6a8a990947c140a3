"""Tools below the root: stand-ins for the service's own at their real places, and the real sqlite3."""

import pathlib
import shutil

HERE = pathlib.Path(__file__).resolve().parent
SCRIPTS = "usr/share/sorvaneproducer/lumioserverd/script/"
PLACES = {
    "setup_lumioserverd_preferences": SCRIPTS + "setup_lumioserverd_preferences",
    "setup_lumioserverd_library": SCRIPTS + "setup_lumioserverd_library",
    "lumioctl": "usr/sbin/lumioctl",
    "lumioserverd": "usr/sbin/lumioserverd",
    "lumioconfig": "usr/bin/lumioconfig",
    "nimbo": "usr/bin/nimbo",
}
SUPPORT = "usr/share/sorvaneproducer/demo"


def copy(source, target, mode):
    target.parent.mkdir(parents=True, exist_ok=True)
    shutil.copyfile(source, target)
    target.chmod(mode)


def write(root):
    for name, place in PLACES.items():
        copy(HERE.parent / "tools" / name, root / place, 0o755)
    for source in ("tools/tool.sh", "tools/lumioconfig.py", "tools/setup_library.py", "sample/names.py", "sample/protect.py"):
        copy(HERE.parent / source, root / SUPPORT / pathlib.Path(source).name, 0o644)
    (root / "usr/bin/sqlite3").symlink_to(shutil.which("sqlite3") or "/usr/bin/sqlite3")
