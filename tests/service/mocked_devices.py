"""Device nodes whose ioctls a test answers, through umockdev's preload library."""

import errno
import struct
import threading
from pathlib import Path
from typing import Callable

import gi

from harness import Device

gi.require_version("UMockdev", "1.0")
from gi.repository import GLib, UMockdev  # noqa: E402

_FOLDER = "/run/umockdev"


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
        self.root = Path(self.testbed.get_root_dir())
        self.root.chmod(0o755)  # the daemon comes here after it gave up its privileges, too
        device.sandbox.bind(_FOLDER, self.root)
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
            (self.root / path).chmod(0o666)

    def close(self) -> None:
        self._loop.quit()
        self._thread.join()


# The kernel has a second form of the call for a line, which libgpiod 2 makes.
_CHIP_INFO, _LINE_INFO, _LINE_INFO_2 = 0x8044B401, 0xC048B402, 0xC100B405
_CHIP = struct.Struct("=32s32sI")
_LINE = struct.Struct("=II32s32s")
_LINE_2 = struct.Struct("=32s32sIIQ176s")


class GpioChip(UMockdev.IoctlBase):
    """A chip's character device, as far as finding lines by name needs it."""

    def __init__(self, name: str, label: str, line_names: list[str]):
        super().__init__()
        self._info = _CHIP.pack(name.encode(), label.encode(), len(line_names))
        self._line_names = [line.encode() for line in line_names]

    def do_handle_ioctl(self, client: UMockdev.IoctlClient) -> bool:
        request = client.get_request() & 0xFFFFFFFF
        if request == _CHIP_INFO:
            client.get_arg().resolve(0, _CHIP.size).update(0, self._info)
        elif request == _LINE_INFO:
            info = client.get_arg().resolve(0, _LINE.size)
            offset = _LINE.unpack(info.retrieve())[0]
            info.update(0, _LINE.pack(offset, 0, self._line_names[offset], b""))
        elif request == _LINE_INFO_2:
            info = client.get_arg().resolve(0, _LINE_2.size)
            offset = _LINE_2.unpack(info.retrieve())[2]
            info.update(0, _LINE_2.pack(self._line_names[offset], b"", offset, 0, 0, b""))
        known = request in (_CHIP_INFO, _LINE_INFO, _LINE_INFO_2)
        client.complete(0 if known else -1, 0 if known else errno.EINVAL)
        return True


def add_gpiochip(
    devices: MockedDevices, number: int, label: str, line_names: list[str], base: int
) -> GpioChip:
    """A chip as character device and, under another number, in sysfs. Both belong to one device."""
    name, owner = f"gpiochip{number}", f"/devices/platform/{label}"
    chip = GpioChip(name, label, line_names)
    devices.add(
        f"/dev/{name}",
        f"P: {owner}/{name}\nN: {name}\nE: DEVNAME=/dev/{name}\nE: MAJOR=254\nE: MINOR={number}\n"
        f"E: SUBSYSTEM=chips\nA: dev=254:{number}\\n\n",
        chip,
    )
    sys = devices.root / "sys"
    on_bus = sys / "bus/gpio/devices"
    on_bus.mkdir(parents=True, exist_ok=True)
    (on_bus / name).symlink_to(f"../../..{owner}/{name}")
    by_number = sys / f"dev/char/254:{number}"
    if not by_number.is_symlink():
        by_number.parent.mkdir(parents=True, exist_ok=True)
        by_number.symlink_to(f"../..{owner}/{name}")
    subsystem = sys / f"{owner[1:]}/{name}/subsystem"
    subsystem.unlink()
    subsystem.symlink_to("../../../../bus/gpio")
    in_class = sys / f"class/gpio/gpiochip{base}"
    in_class.mkdir(parents=True)
    for attribute, text in {"base": base, "label": label, "ngpio": len(line_names)}.items():
        (in_class / attribute).write_text(f"{text}\n")
    (in_class / "device").symlink_to(f"../../..{owner}")
    return chip
