"""Objects that go and come back while older configuration tools write to them."""

import os

import pytest
from gi.repository import GLib

from harness import wait_for
from harness.device import CONTROL, CONTROL_PATH
from harness.documents import hwdesc, port
from legacy_tool import BASE, INPUT, OUTPUT, PATH, PROPERTIES, SERVICE, text

ROUNDS = int(os.environ.get("PORTD_TEST_ROUNDS", "250"))
CLIENTS = 3
# Rounds whose replies may be open at a time: enough for a write to wait behind every drop.
WINDOW = 20

# What a tool is told while the objects and their name are being renewed, or when the port has gone.
GONE = (
    "org.freedesktop.DBus.Error.ServiceUnknown",
    "org.freedesktop.DBus.Error.UnknownMethod",
    "org.freedesktop.DBus.Error.UnknownObject",
    "com.kelv.IOControl.Error.No_port",
)


class Client:
    """A connection of its own, whose calls go out without waiting for replies."""

    def __init__(self, device):
        self._connection = device.bus.connect()
        self.open = 0
        self.done = 0
        self.errors: dict[str, int] = {}

    def call(self, name: str, path: str, interface: str, method: str, arguments) -> None:
        self.open += 1
        self._connection.call(name, path, interface, method, arguments, None, 0, -1, None, self._take)

    def _take(self, connection, result) -> None:
        self.open -= 1
        try:
            connection.call_finish(result)
            self.done += 1
        except GLib.Error as error:
            name = error.message.removeprefix("GDBus.Error:").partition(": ")[0]
            self.errors[name] = self.errors.get(name, 0) + 1

    def write(self, interface: str, name: str, value: GLib.Variant) -> None:
        arguments = GLib.Variant("(ssv)", (interface, name, value))
        self.call(SERVICE, f"{PATH}/2", PROPERTIES, "Set", arguments)

    def read(self, interface: str) -> None:
        self.call(SERVICE, f"{PATH}/2", PROPERTIES, "GetAll", GLib.Variant("(s)", (interface,)))

    def control(self, method: str, arguments=None) -> None:
        self.call(CONTROL, CONTROL_PATH, CONTROL, method, arguments)


@pytest.fixture
def gate(device):
    """A port that can be dropped, beside one that can't."""
    device.conf(hwdesc(port("in0", 0), port("gate", 2, kind="io_ctrl", optional=True)))
    device.start()
    device.wait_name(SERVICE)
    return device


def storm(client: Client, number: int) -> None:
    """One round: a drop and a refresh with writes and reads right behind each."""
    client.control("DropIOPorts", GLib.Variant("(as)", (["gate"],)))
    client.write(INPUT, "Name", text(f"Gate {number}".encode() + b"\0"))
    client.write(BASE, "Direction", text(b"output\0" if number % 2 else b"input\0"))
    client.read(OUTPUT)
    client.control("RefreshIOPorts")
    client.write(OUTPUT, "PulseTime", GLib.Variant("i", number))
    client.read(BASE)


def test_writes_drops_and_refreshes_of_several_clients(gate):
    clients = [Client(gate) for _ in range(CLIENTS)]
    for number in range(ROUNDS):
        client = clients[number % CLIENTS]
        wait_for(lambda: client.open < 7 * WINDOW, "replies", 60)
        assert gate.running, "a call behind a drop ended the daemon"
        storm(client, number)
    wait_for(lambda: not any(client.open for client in clients) or not gate.running, "replies", 60)
    assert gate.running
    for client in clients:
        assert set(client.errors) <= set(GONE), client.errors
    assert sum(client.done for client in clients) >= 2 * ROUNDS
    gate.call("RefreshIOPorts")
    assert gate.call("GetDirection", "u", 2) in ("input", "output")


def test_a_write_behind_a_drop_is_told_that_the_object_has_gone(gate):
    client = Client(gate)
    client.control("DropIOPorts", GLib.Variant("(as)", (["gate"],)))
    client.write(INPUT, "Name", text(b"Late\0"))
    wait_for(lambda: client.open == 0, "both replies")
    assert client.done == 1 and set(client.errors) <= set(GONE) and len(client.errors) == 1
    gate.call("RefreshIOPorts")
    assert gate.call("GetNames", "u", 2)[0] != "Late"
