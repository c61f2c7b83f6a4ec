"""What is installed on this device."""

import ctypes
from typing import Any, Optional

from . import _library as c


def version() -> str:
    """The version that the installed library declares."""
    return _read(c.load().vesk_version).decode("utf-8", "replace")


def persistent_identifier(respects_consent: bool = True) -> str:
    """A stable identifier of this device (UUID text): the one that respects the user's diagnostics consent, or not.

    A process that runs as neither the daemon's user nor root gets its own.
    """
    return _read(c.load().vesk_persistent_identifier, int(respects_consent)).decode("utf-8", "replace")


def public_key() -> Optional[bytes]:
    """The RSA public key (DER) that verifies storebags; None if none is installed."""
    return _read(c.load().vesk_public_key) or None


def _read(function: Any, *arguments: int) -> bytes:
    size = 4096
    while True:
        buffer = ctypes.create_string_buffer(size)
        length: int = function(*arguments, buffer, size)
        if length <= size:
            return buffer.raw[:length]
        size = length
