"""Converters of supervised inputs: kernel attribute files, FIFOs and plain files around a device."""

import os
import struct
import subprocess
from pathlib import Path
from typing import Any, Callable, Optional

from gpio_tree import GpioTree
from harness import DBusError, Device, hwdesc, port, wait_for

SUPERVISED = "com.kelv.IOSupervised.Supervised"
SUPERVISED_PATH = "/com/kelv/IOSupervised/Supervised"
ERROR = "com.kelv.IOSupervised."

FOLDER = "/run/converters"
INPUT, IO_CTRL, SIO_CTRL, OUTPUT = 11, 12, 13, 14
PINS = f'<input pin="{INPUT}"/><io_ctrl pin="{IO_CTRL}"/><sio_ctrl pin="{SIO_CTRL}"/>'
OUTPUT_PIN = f'<output pin="{OUTPUT}"/>'

_SHIM = Path(__file__).with_name("shim.c")
_EVENT = struct.Struct("=Qq")


def supervised(
    device: Device, method: str, signature: str = "", *args: Any
) -> Any:
    """Calls a method of the supervised-input interface."""
    return device.bus.call(SUPERVISED, SUPERVISED_PATH, SUPERVISED, method, signature, *args)


def expect_supervised_error(
    device: Device, name: str, message: str, method: str, signature: str = "", *args: Any
) -> None:
    try:
        reply = supervised(device, method, signature, *args)
    except DBusError as caught:
        assert (caught.name, caught.message) == (ERROR + name, message)
    else:
        raise AssertionError(f"{method} answered {reply} instead of the error {name}")


def readout(device: Device, number: int = 0) -> tuple[str, int]:
    return supervised(device, "GetSupervisedReadout", "u", number)


def wait_readout(device: Device, state: str, level: Optional[int] = None, number: int = 0) -> None:
    def matches() -> bool:
        now = readout(device, number)
        return now[0] == state and level in (None, now[1])

    wait_for(matches, f"the readout {state} {level}")


def supervise(device: Device, on: bool = True, number: int = 0) -> None:
    supervised(device, "SetSupervised", "ub", number, on)


def range_element(state: str, lower: int, upper: int) -> str:
    return f'<range state="{state}" lower="{lower}" upper="{upper}"/>'


def supervised_port(
    backend: str, elements: str, number: int = 0, kind: str = "input", optional: bool = False,
    flags: str = "ioport", name: Optional[str] = None, event: str = "",
) -> str:  # fmt: skip
    """A port with the usual pins."""
    pins = PINS + (OUTPUT_PIN if kind == "io_ctrl" else "")
    section = f'<backend name="{backend}">{pins}{elements}</backend>{event}'
    return port(
        name or f"line{number}", number, kind, backend=None, extra=section, optional=optional,
        flags=flags,
    )  # fmt: skip


def start(device: Device, *ports: str) -> Device:
    device.conf(hwdesc(*ports))
    device.start()
    device.wait_name(SUPERVISED)
    return device


def come_back_fifty_times(
    device: Device, converters: "Converters", come_back: Callable[[int], None], first: int = 100
) -> None:
    """Drops the port and lets `come_back` refresh it at a level at which its line is closed."""
    files = converters.open_files()
    descriptors = len(device.descriptors())
    for level in range(first, first + 50):
        device.call("DropIOPorts", "as", ["line0"])
        assert converters.open_files() == []
        come_back(level)
        wait_readout(device, "closed", level)
    assert converters.open_files() == files
    assert len(device.descriptors()) == descriptors


def restart_supervised(device: Device, converters: "Converters") -> None:
    """Supervision outlives the restart, or the line would be led to the plain input."""
    device.restart()
    wait_for(lambda: device.bus.has_owner(SUPERVISED), "the interface")
    assert converters.control_pins() == "01"


def processor_time(device: Device) -> float:
    """What the daemon has used so far, in seconds."""
    fields = Path(f"/proc/{device.pid}/stat").read_text().rpartition(")")[2].split()
    return (int(fields[11]) + int(fields[12])) / os.sysconf("SC_CLK_TCK")


class Converters:
    """To be made before the device starts."""

    def __init__(self, device: Device, tree: GpioTree, folder: Path):
        self.device = device
        self.tree = tree
        self.iio = tree.sys / "bus/iio/devices"
        self.iio.mkdir(parents=True)
        self.folder = device.mkdir(FOLDER)
        self._writers: dict[str, int] = {}
        for number in (INPUT, IO_CTRL, SIO_CTRL, OUTPUT):
            # Ports come back after the daemon gave up its privileges.
            for file in tree.line(number).iterdir():
                file.chmod(0o666)
        self._preload(folder)

    def _preload(self, folder: Path) -> None:
        library = folder / "shim.so"
        subprocess.run(
            ["cc", "-shared", "-fPIC", "-O1", "-o", str(library), str(_SHIM)], check=True
        )
        self.device.write("/run/shim.so", "")
        self.device.sandbox.bind("/run/shim.so", library)
        plain, sanitized = self.device._environment, self.device.sanitized

        def environment() -> dict[str, str]:
            env = plain()
            env["LD_PRELOAD"] = "/run/shim.so"
            if sanitized:
                env["ASAN_OPTIONS"] = env.get("ASAN_OPTIONS", "") + ":verify_asan_link_order=0"
            return env

        self.device._environment = environment  # type: ignore[method-assign]

    def control_pins(self) -> str:
        """io_ctrl and sio_ctrl as they are driven."""
        return "".join(self.tree.read(pin, "value")[0] for pin in (IO_CTRL, SIO_CTRL))

    def open_files(self) -> list[str]:
        """What the daemon holds open of converters and lines."""
        return sorted(
            path for path in self.device.descriptors()
            if path.startswith(FOLDER) or "/sys/" in path
        )  # fmt: skip

    def close(self) -> None:
        """The daemon ends first: for it the devices would go away."""
        if self.device.running:
            self.device.stop()
        for fd in self._writers.values():
            os.close(fd)
        self._writers.clear()

    # spidev

    def spidev(self, name: str = "spidev0") -> str:
        for suffix in ("", ".answer", ".calls"):
            path = self.folder / (name + suffix)
            path.write_text("")
            path.chmod(0o666)
        return f"{FOLDER}/{name}"

    def answer(self, level: int, name: str = "spidev0") -> None:
        self._answer(f"{level << 4:04x}", name)

    def fail(self, errno: int, name: str = "spidev0") -> None:
        self._answer(f"error {errno}", name)

    def _answer(self, text: str, name: str) -> None:
        """In one step: the daemon may read at any time."""
        fresh = self.folder / "answer.new"
        fresh.write_text(text)
        fresh.chmod(0o666)
        fresh.rename(self.folder / f"{name}.answer")

    def spi_calls(self, name: str = "spidev0") -> list[str]:
        return (self.folder / f"{name}.calls").read_text().splitlines()

    # Industrial I/O

    def attribute(self, entry: str, name: str, text: Optional[str] = None) -> Path:
        path = self.iio / entry / name
        if text is not None:
            path.parent.mkdir(parents=True, exist_ok=True)
            path.write_text(text)
            path.chmod(0o666)
        return path

    def keep_from_account(self, entry: str) -> None:
        """The rights that the kernel gives the device by itself: only root may open and write."""
        for file in (self.iio / entry).rglob("*"):
            if file.is_file():
                file.chmod(0o644)
        for node in self.folder.glob(f"{entry}*"):
            node.chmod(0o600)

    def level(self, entry: str, name: str, level: int) -> None:
        """In one step: the daemon may read at any time."""
        fresh = self.attribute(entry, "level.new", f"{level}\n")
        fresh.rename(self.attribute(entry, name))

    def read(self, entry: str, name: str) -> str:
        return self.attribute(entry, name).read_text()

    def fifo(self, name: str) -> None:
        """One that the test holds open, as a device that is there."""
        path = self.folder / name
        path.unlink(missing_ok=True)
        os.mkfifo(path)
        path.chmod(0o666)
        self._writers[name] = os.open(path, os.O_RDWR | os.O_NONBLOCK | os.O_CLOEXEC)

    def send(self, name: str, data: bytes) -> None:
        assert os.write(self._writers[name], data) == len(data)

    def hang_up(self, name: str) -> None:
        os.close(self._writers.pop(name))

    def send_event(self, device: int, channel: int, count: int = 1) -> None:
        record = _EVENT.pack(channel & 0xFFFF, 0)
        for _ in range(count):
            self.send(f"iio:device{device}.events", record)
