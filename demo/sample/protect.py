"""The protected form of property values and of the grid password, as docs/protected-values.md describes it."""

import base64
import functools
import subprocess

# The sample service's key: fixed, so that roots of one size are the same. A real service creates a random one.
KEY = b"lumio-sample-key"
VECTOR = b"LumioPropertyIV1"


def secret():
    """The text under "lumio_secret" of the key file."""
    return base64.b64encode(KEY).decode()


def wrapped(data):
    """base64 with a line feed after every full line of 76 characters, the last one included."""
    text = base64.b64encode(data).decode()
    lines = [text[i:i + 76] for i in range(0, len(text), 76)]
    last = "\n" if lines and len(data) % 57 == 0 else ""
    return "\n".join(lines) + last


@functools.lru_cache(maxsize=None)
def protected(value):
    command = ["openssl", "enc", "-aes-128-cbc", "-K", KEY.hex(), "-iv", VECTOR.hex()]
    done = subprocess.run(command, input=value.encode(), stdout=subprocess.PIPE, check=True)
    return wrapped(done.stdout)
