"""An older configuration tool, and what it finds on the device."""

import itertools
import re
from contextlib import contextmanager
from pathlib import Path
from typing import Any, Iterator

import pytest
from gi.repository import GLib

from harness import DBusError, hwdesc, port, wait_for
from harness.device import SETTINGS

SERVICE = "com.kelv.Configuration.Legacy.IOControl1.IOPort"
BASE = SERVICE
INPUT = "com.kelv.Configuration.Legacy.IOControl1.Input"
OUTPUT = "com.kelv.Configuration.Legacy.IOControl1.Output"
PATH = "/com/kelv/Configuration/Legacy/IOControl/IOPort"
PROPERTIES = "org.freedesktop.DBus.Properties"
INVALID = "org.freedesktop.DBus.Error.InvalidArgs"
NO_PORT = "com.kelv.IOControl.Error.No_port"
DISABLED = "--disable_legacy_interface"

REGISTRY = "/etc/service_registry/services.d/portd_service_registry.conf"
MAPPINGS = "/etc/legacyconfig/legacymappings.d/portd.xml"
TEMPORARY = "/etc/portd.d/legacy.tmp"
EXPORT = "/tmp/portd_ioport.conf"
EARLIER = "/etc/dynamic/portd/params.conf"
GOLDEN = Path(__file__).resolve().parents[1] / "unit/legacy/golden"

READABLE = {
    BASE: ("NbrOfIOPorts", "NbrOfInputs", "NbrOfOutputs", "Configurable", "Direction"),
    INPUT: ("Name", "Trig"),
    OUTPUT: ("Name", "Active", "Button", "PulseTime", "Mode", "DelayTime"),
}
WRITABLE = {
    BASE: ("Direction",),
    INPUT: READABLE[INPUT],
    OUTPUT: READABLE[OUTPUT],
}
NUMBERS = ("PulseTime", "DelayTime")

GROUPS = ("in0", "out1", "io2", "virt3")


def four_ports(*more: str) -> str:
    """An input, an output, a configurable and a virtual port."""
    return hwdesc(
        port("in0", 0),
        port("out1", 1, kind="output"),
        port("io2", 2, kind="io_ctrl"),
        port("virt3", 3, kind="output", backend="virtual", flags="virtual"),
        *more,
    )


def count_of_ports(count: int) -> str:
    return f'<first_virtual_input nbr="{count}"/>'


class Tool:
    """An older configuration tool."""

    def __init__(self, device):
        self.device = device

    def _call(self, number: int, method: str, signature: str, *args: Any) -> Any:
        return self.device.bus.call(
            SERVICE, f"{PATH}/{number}", PROPERTIES, method, signature, *args
        )

    def get(self, number: int, interface: str, name: str) -> Any:
        return self._call(number, "Get", "ss", interface, name)

    def get_all(self, number: int, interface: str) -> dict[str, Any]:
        return self._call(number, "GetAll", "s", interface)

    def set_variant(self, number: int, interface: str, name: str, value: GLib.Variant) -> None:
        self._call(number, "Set", "ssv", interface, name, value)

    def set(self, number: int, interface: str, name: str, value: Any) -> None:
        if isinstance(value, int):
            variant = GLib.Variant("i", value)
        else:
            variant = text(value.encode() + b"\0")
        self.set_variant(number, interface, name, variant)

    def numbers(self) -> list[int]:
        """The ports that have an object."""
        return sorted(int(node) for node in re.findall(r'<node name="(\d+)"', self.introspect("")))

    def interfaces(self, number: int) -> list[str]:
        names = re.findall(r'<interface name="([^"]*)"', self.introspect(f"/{number}"))
        return [name for name in (BASE, INPUT, OUTPUT) if name in names]

    def introspect(self, below: str) -> str:
        return self.device.bus.call(
            SERVICE, PATH + below, "org.freedesktop.DBus.Introspectable", "Introspect"
        )


def text(raw: bytes) -> GLib.Variant:
    """A byte string as it stands."""
    return GLib.Variant.new_from_bytes(GLib.VariantType("ay"), GLib.Bytes.new(raw), True)


def tool_fixture(device) -> Tool:
    device.conf(four_ports())
    device.start()
    return Tool(device)


def fails(name: str, action, *args: Any) -> str:
    """The message of the error that the action must give."""
    with pytest.raises(DBusError) as caught:
        action(*args)
    assert caught.value.name == name
    return caught.value.message


_markers = itertools.count()


def settle(tool: Tool) -> None:
    """Everything that was asked for earlier is stored when the name of port 3 is."""
    name = f"Marker {next(_markers)}"
    tool.set(3, OUTPUT, "Name", name)
    settings = tool.device.path(SETTINGS)
    wait_for(lambda: settings.exists() and name in settings.read_text(), "the marker")


@contextmanager
def saved_groups(tool: Tool) -> Iterator[set[str]]:
    """Collects the groups of the ports that are saved meanwhile: a save brings a port's group back
    into a file that went away, also where nothing has changed."""
    settle(tool)
    tool.device.path(SETTINGS).unlink()
    groups: set[str] = set()
    yield groups
    settle(tool)
    groups |= set(re.findall(r"^\[(.*)\]$", tool.device.read_settings(), re.MULTILINE)) - {"virt3"}


def saves(tool: Tool, number: int, *request: Any) -> bool:
    with saved_groups(tool) as groups:
        tool.set(number, *request)
    assert groups <= {GROUPS[number]}
    return bool(groups)


def changes(device):
    return device.signals("Changed", "com.kelv.Configuration.Event", "/com/kelv/Configuration/Event")


def announcement(inputs: int, outputs: int) -> list[tuple]:
    return [
        (BASE, f"{PATH}/0", f"NbrOfInputs={inputs}"),
        (BASE, f"{PATH}/0", f"NbrOfOutputs={outputs}"),
    ]


def golden(name: str) -> str:
    return (GOLDEN / name).read_text()
