"""Device nodes whose ioctls a test answers, through umockdev's preload library."""

import struct
import threading
import time
from pathlib import Path
from typing import Callable, NamedTuple

import gi

from harness import Device, wait_for

gi.require_version("UMockdev", "1.0")
from gi.repository import GLib, UMockdev  # noqa: E402

_FOLDER = "/run/umockdev"
_TRANSFER = struct.Struct("=QQIIHBBBBBB")
_RX_POINTER = 8  # its offset in a transfer


def preload_library() -> Path:
    """The loader's cache is of another system inside a device, so the library is named in full."""
    return next(Path("/usr/lib").glob("*/libumockdev-preload.so.0"))


class MockedDevices:
    """The nodes of one device. To be made before the device starts."""

    def __init__(self, device: Device):
        self.testbed = UMockdev.Testbed.new()
        self._context = GLib.MainContext.new()
        self._loop = GLib.MainLoop.new(self._context, False)
        self._thread = threading.Thread(target=self._serve, daemon=True)
        self._thread.start()
        self._root = Path(self.testbed.get_root_dir())
        self._root.chmod(0o755)  # the daemon comes here after it gave up its privileges, too
        device.sandbox.bind(_FOLDER, self._root)
        device.mkdir(_FOLDER)
        self._plain_environment = device._environment
        self._sanitized = device.sanitized
        device._environment = self._environment  # type: ignore[method-assign]

    def _environment(self) -> dict[str, str]:
        env = self._plain_environment()
        env["LD_PRELOAD"] = str(preload_library())
        env["UMOCKDEV_DIR"] = _FOLDER
        if self._sanitized:
            env["ASAN_OPTIONS"] = env.get("ASAN_OPTIONS", "") + ":verify_asan_link_order=0"
        return env

    def _serve(self) -> None:
        """Calls are answered while the test itself waits for the daemon."""
        self._context.push_thread_default()
        self._loop.run()
        self._context.pop_thread_default()

    def _in_thread(self, call: Callable[[], None]) -> None:
        done = threading.Event()

        def run() -> bool:
            call()
            done.set()
            return GLib.SOURCE_REMOVE

        source = GLib.idle_source_new()
        source.set_callback(lambda _data: run())
        source.attach(self._context)
        assert done.wait(10)

    def add(self, node: str, description: str, handler: UMockdev.IoctlBase) -> None:
        self.testbed.add_from_string(description)
        self._in_thread(lambda: self.testbed.attach_ioctl(node, handler))
        for path in (f"ioctl{node}", node.lstrip("/")):
            (self._root / path).chmod(0o666)

    def close(self) -> None:
        self._loop.quit()
        self._thread.join()


class SpiMessage(NamedTuple):
    """One SPI_IOC_MESSAGE of two transfers, the first of which sends and the second receives."""

    request: int
    sent: bytes
    receive_buffer: bytes  # as it was before
    first: tuple  # the fields of the transfers in the kernel's order, pointers as booleans
    second: tuple
    time: float


class Spidev(UMockdev.IoctlBase):
    """A converter that answers with the sample that the test wants, and records every message."""

    def __init__(self) -> None:
        super().__init__()
        self.bytes = b"\0\0"
        self.errno = 0
        self._messages: list[SpiMessage] = []
        self._lock = threading.Lock()

    def answer(self, sample: int) -> None:
        """A 12-bit sample, high eight bits first."""
        self.answer_bytes(bytes([sample >> 4, sample << 4 & 0xF0]))

    def answer_bytes(self, answer: bytes) -> None:
        """From the next message on; returns once one got it."""
        with self._lock:
            self.bytes, self.errno = answer, 0
        self.wait_messages(1)

    def fail(self, errno: int) -> None:
        with self._lock:
            self.errno = errno
        self.wait_messages(1)

    def take(self) -> list[SpiMessage]:
        with self._lock:
            messages, self._messages = self._messages, []
        return messages

    def wait_messages(self, count: int) -> list[SpiMessage]:
        """That many messages from now on."""
        self.take()
        wait_for(lambda: len(self._messages) >= count, f"{count} messages")
        return self.take()

    def do_handle_ioctl(self, client: UMockdev.IoctlClient) -> bool:
        transfers = client.get_arg().resolve(0, 2 * _TRANSFER.size)
        raw = transfers.retrieve()
        first, second = (
            (bool(fields[0]), bool(fields[1]), *fields[2:])
            for fields in _TRANSFER.iter_unpack(raw)
        )
        sent = transfers.resolve(0, first[2])
        received = transfers.resolve(_TRANSFER.size + _RX_POINTER, second[2])
        with self._lock:
            self._messages.append(
                SpiMessage(
                    client.get_request(), sent.retrieve(), received.retrieve(), first, second,
                    time.monotonic(),
                )
            )  # fmt: skip
            if self.errno == 0:
                received.update(0, self.bytes)
            client.complete(-1 if self.errno else 4, self.errno)
        return True


def add_spidev(devices: MockedDevices, name: str) -> Spidev:
    spidev = Spidev()
    description = f"P: /devices/spi0/{name}\nN: {name}\nE: DEVNAME=/dev/{name}\nE: SUBSYSTEM=spidev\n"
    devices.add(f"/dev/{name}", description, spidev)
    return spidev
