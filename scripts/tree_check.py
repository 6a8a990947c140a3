"""The program around each check of this directory: which tree it looks at, and how it ends."""

import pathlib
import sys


def run(findings):
    """Prints the findings about the tree that the argument names, by default the one that this file is in. Fails if there are any."""
    root = pathlib.Path(sys.argv[1]) if len(sys.argv) > 1 else pathlib.Path(__file__).resolve().parent.parent
    found = list(findings(root))
    for finding in found:
        print(finding)
    sys.exit(1 if found else 0)
