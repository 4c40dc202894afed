"""The kernel's GPIO files as a folder that a device sees as its /sys, and a record of what is written."""

import ctypes
import os
import select
import struct
import threading
from pathlib import Path
from typing import Optional

from harness import Device, wait_for

_IN_MODIFY, _IN_CLOSE_WRITE = 0x02, 0x08
_LIMIT = "/proc/sys/fs/inotify/max_user_instances"
_EVENT = struct.Struct("iIII")
_ATTRIBUTES = {"direction": "in\n", "edge": "none\n", "active_low": "0\n", "value": "0\n"}


class GpioTree:
    """Lines are there from the start, or appear when the daemon exports them.

    Each write of the daemon is one record such as "gpio12/direction high". A file that is written
    twice in a row may show the second text for both, so tests look after each step.
    """

    def __init__(self, folder: Path):
        self.sys = folder / "sys"
        self.gpio = self.sys / "class/gpio"
        self._unborn = self.sys / "unborn"
        self.gpio.mkdir(parents=True, exist_ok=True)
        self._unborn.mkdir()
        self._records: list[str] = []
        self._names: dict[int, str] = {}
        self._libc = ctypes.CDLL(None, use_errno=True)
        self._inotify = self._libc.inotify_init1(os.O_CLOEXEC | os.O_NONBLOCK)
        if self._inotify < 0:
            number = ctypes.get_errno()
            raise OSError(number, f"no inotify instance: {os.strerror(number)}; {_LIMIT} is the limit")
        self._lock = threading.Lock()
        for name in ("export", "unexport"):
            (self.gpio / name).write_text("")
            # The daemon gives lines back after it gave up its privileges.
            (self.gpio / name).chmod(0o666)
        self._watch(self.gpio, "")
        self._end = threading.Event()
        self._thread = threading.Thread(target=self._kernel, daemon=True)
        self._thread.start()

    def line(self, number: int, exported: bool = True, **attributes: Optional[str]) -> Path:
        """A line, with other attributes than a fresh one's; those that are None are missing."""
        folder = (self.gpio if exported else self._unborn) / f"gpio{number}"
        folder.mkdir()
        for name, text in {**_ATTRIBUTES, **attributes}.items():
            if text is not None:
                (folder / name).write_text(text)
        self._watch(folder, f"{folder.name}/")
        return folder

    def read(self, number: int, attribute: str) -> str:
        return (self.gpio / f"gpio{number}" / attribute).read_text()

    def set_value(self, number: int, level: int) -> None:
        (self.gpio / f"gpio{number}/value").write_text(f"{level}\n")
        self._settle()
        self.take()

    def take(self) -> list[str]:
        """What was written since the last time."""
        self._settle()
        with self._lock:
            records, self._records = self._records, []
        return records

    def wait(self, *records: str) -> None:
        """Waits until exactly this was written, and forgets it."""
        wait_for(lambda: len(self._records) >= len(records), f"{records} in {self._records}")
        assert self.take() == list(records)

    def close(self) -> None:
        self._end.set()
        self._thread.join()
        os.close(self._inotify)

    def _watch(self, folder: Path, prefix: str) -> None:
        watch = self._libc.inotify_add_watch(
            self._inotify, os.fsencode(folder), _IN_MODIFY | _IN_CLOSE_WRITE
        )
        assert watch >= 0, os.strerror(ctypes.get_errno())
        self._names[watch] = prefix

    def _settle(self) -> None:
        """Events are queued when a write returns, so an empty queue means that all were taken in."""
        wait_for(lambda: not self._readable(0) and self._lock.acquire(False), "the event queue")
        self._lock.release()

    def _readable(self, timeout: float) -> bool:
        return bool(select.select([self._inotify], [], [], timeout)[0])

    def _kernel(self) -> None:
        while not self._end.is_set():
            if self._readable(0.05):
                with self._lock:
                    self._take_in(os.read(self._inotify, 65536))

    def _take_in(self, events: bytes) -> None:
        offset = 0
        while offset < len(events):
            watch, mask, _cookie, length = _EVENT.unpack_from(events, offset)
            start = offset + _EVENT.size
            offset = start + length
            name = events[start:offset].rstrip(b"\0").decode()
            # The value file stays open; every other one is opened for one write.
            if mask & (_IN_MODIFY if name == "value" else _IN_CLOSE_WRITE):
                self._on_write(self._names[watch] + name)

    def _on_write(self, file: str) -> None:
        text = (self.gpio / file).read_text().strip()
        self._records.append(f"{file} {text}")
        unborn = self._unborn / f"gpio{text}"
        if file == "export" and unborn.exists():
            unborn.rename(self.gpio / unborn.name)


def device_on_lines(make_device, tree: GpioTree) -> Device:
    """A device that has the lines for its /sys."""
    return make_device(binds={"/sys": tree.sys})
