"""Clients that set states without waiting for answers: nobody else pays for it, and nothing is lost."""

import os
import socket
import time
from pathlib import Path

import pytest
from gi.repository import Gio, GLib

from control import expect_error
from converters import processor_time
from harness import Device, hwdesc, port, scale, wait_for
from harness.bus import SOCKET
from harness.device import CONTROL, CONTROL_PATH

SETTINGS = "/etc/portd/portd.conf"
SIREN, LAMP, DOOR = 0, 1, 2


@pytest.fixture
def device(device) -> Device:
    device.conf(hwdesc(port("siren", SIREN, "output"), port("lamp", LAMP, "output"),
                       port("door", DOOR)))  # fmt: skip
    return device.start()


def set_state(number: int, active: bool) -> Gio.DBusMessage:
    """A call that wants no answer."""
    message = Gio.DBusMessage.new_method_call(CONTROL, CONTROL_PATH, CONTROL, "SetState")
    message.set_flags(Gio.DBusMessageFlags.NO_REPLY_EXPECTED)
    message.set_body(GLib.Variant("(ub)", (number, active)))
    return message


def nobody_listens(device: Device) -> Gio.DBusMessage:
    """What the library reads as it reads a call, and then throws away."""
    message = Gio.DBusMessage.new_signal(CONTROL_PATH, CONTROL, "SetState")
    message.set_destination(CONTROL)
    message.set_body(GLib.Variant("(ub)", (SIREN, True)))
    return message


def send(device: Device, message: Gio.DBusMessage) -> None:
    device.bus.connection.send_message(message, Gio.DBusSendMessageFlags.NONE)


class RawClient:
    """A connection that writes far faster than anybody can serve what it writes."""

    def __init__(self, device: Device):
        self._socket = socket.socket(socket.AF_UNIX)
        self._socket.connect(f"/proc/{device.sandbox.pid}/root{SOCKET}")
        self._socket.sendall(b"\0AUTH EXTERNAL " + str(os.getuid()).encode().hex().encode() + b"\r\n")
        assert self._socket.recv(256).startswith(b"OK ")
        self._socket.sendall(b"BEGIN\r\n")
        bus = "org.freedesktop.DBus"
        self._send(Gio.DBusMessage.new_method_call(bus, "/org/freedesktop/DBus", bus, "Hello"))
        assert self._socket.recv(4096)

    def _send(self, message: Gio.DBusMessage, count: int = 1) -> None:
        message.set_serial(1)
        self._socket.sendall(bytes(message.to_blob(Gio.DBusCapabilityFlags.NONE)) * count)

    def flood(self, message: Gio.DBusMessage, count: int) -> None:
        self._send(message, count)

    def ping(self) -> None:
        """Returns when the daemon has read what was sent so far."""
        peer = "org.freedesktop.DBus.Peer"
        self._send(Gio.DBusMessage.new_method_call(CONTROL, CONTROL_PATH, peer, "Ping"))
        self._socket.settimeout(120 * scale())
        assert self._socket.recv(65536)


def cost(device: Device, client: RawClient, message: Gio.DBusMessage, count: int) -> float:
    """Seconds of processor that the daemon spends on as many of them."""
    before = processor_time(device)
    client.flood(message, count)
    client.ping()
    device.call("GetState", "u", DOOR, timeout=120 * scale())
    return processor_time(device) - before


def resident_kib(device: Device) -> int:
    return int(device.status("VmRSS").split()[0])


def test_a_flood_costs_hardly_more_than_the_reading_of_it(device):
    """What others wait depends on the machine, too; what the daemon spends on each call does not."""
    count = 30_000
    client = RawClient(device)
    cost(device, client, set_state(SIREN, True), 1000)
    resident = resident_kib(device)
    spent = read = 0.0
    for _ in range(2):
        read += cost(device, client, nobody_listens(device), count)
        spent += cost(device, client, set_state(SIREN, True), count)
    assert spent < read * (3 if device.sanitized else 1.6), f"{spent:.2f} s against {read:.2f} s"
    if not device.sanitized:
        assert resident_kib(device) - resident < 2048


def test_no_call_of_a_flood_is_lost(device):
    calls = 4000
    with device.signals() as changes:
        for number in range(calls):
            send(device, set_state(SIREN, number % 2 == 0))
        changes.wait_count(calls, timeout=60)
        assert [change.state for change in changes.received] == [True, False] * (calls // 2)
    assert device.call("GetState", "u", SIREN) is False


@pytest.mark.parametrize("answered", [False, True])
def test_calls_are_served_in_the_order_in_which_they_came(device, answered):
    pending = []
    for number in range(300):
        for state in (number % 2 == 1, number % 2 == 0):
            if answered:
                device.begin_call("SetState", "ub", SIREN, state)
            else:
                send(device, set_state(SIREN, state))
        pending.append(device.begin_call("GetState", "u", SIREN))
        pending.append(device.begin_call("GetNames", "u", LAMP))
    states = [call.result() for call in pending[::2]]
    assert states == [number % 2 == 0 for number in range(300)]


def test_each_call_that_wants_an_answer_gets_its_own(device):
    numbers = [SIREN, DOOR, 77, LAMP] * 100
    pending = [device.begin_call("SetState", "ub", number, True) for number in numbers]
    for number, call in zip(numbers, pending):
        wait_for(lambda waiting=call: waiting.done, "an answer")
        if number in (SIREN, LAMP):
            assert call.result() is None
    expect_error(device, "No_port", "No such port.", "SetState", "ub", 77, True)
    expect_error(device, "Not_output", "Port not output.", "SetState", "ub", DOOR, True)


def test_a_call_that_nobody_waits_for_is_served_soon(device):
    for state in (True, False, True):
        send(device, set_state(SIREN, state))
    begun = time.monotonic()
    with device.signals() as changes:
        send(device, set_state(LAMP, True))
        changes.wait(lambda change: change.port == LAMP)
    assert time.monotonic() - begun < 5 * scale()


def stored(device: Device) -> Path:
    path = device.path(SETTINGS)
    wait_for(path.exists, "the settings file")
    return path


def test_the_end_of_a_burst_is_stored_too(device):
    """The second call comes while the daemon still waits whether there will be more."""
    device.call("SetState", "ub", SIREN, True)
    device.call("SetName", "ubs", LAMP, False, "Marker")
    wait_for(lambda: "Marker" in device.read_settings(), "the first one to be stored")
    stored(device).unlink()
    device.call("SetState", "ub", SIREN, False)
    assert "output_name=Output 1" in stored(device).read_text()


def test_what_a_burst_left_to_store_is_stored_when_the_daemon_ends(device):
    device.call("SetState", "ub", SIREN, True)
    device.call("SetName", "ubs", LAMP, False, "Marker")
    wait_for(lambda: "Marker" in device.read_settings(), "the first one to be stored")
    stored(device).unlink()
    device.call("SetState", "ub", SIREN, False)
    device.stop()
    assert "output_name=Output 1" in device.read_settings()
