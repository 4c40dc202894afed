"""Which files arrive in several folders, in one order over all of them."""

import ctypes
import os
import select
import struct
from pathlib import Path

from harness import scale

_IN_MOVED_TO = 0x80
_IN_NONBLOCK = os.O_NONBLOCK
_HEADER = struct.Struct("iIII")


class Arrivals:
    """Records the names that files are moved to, from the moment it is made."""

    def __init__(self, *folders: Path):
        libc = ctypes.CDLL(None, use_errno=True)
        self._fd = libc.inotify_init1(_IN_NONBLOCK)
        for folder in folders:
            if libc.inotify_add_watch(self._fd, os.fsencode(folder), _IN_MOVED_TO) < 0:
                raise OSError(ctypes.get_errno(), f"can't watch {folder}")

    def take(self, count: int) -> list[str]:
        """The next names, at least so many of them."""
        names: list[str] = []
        while len(names) < count:
            if not select.select([self._fd], [], [], 10 * scale())[0]:
                raise TimeoutError(f"only {names} arrived")
            data = os.read(self._fd, 65536)
            while data:
                length = _HEADER.unpack_from(data)[3]
                data = data[_HEADER.size:]
                names.append(os.fsdecode(data[:length].rstrip(b"\0")))
                data = data[length:]
        return names

    def __enter__(self) -> "Arrivals":
        return self

    def __exit__(self, *_exception) -> None:
        os.close(self._fd)
