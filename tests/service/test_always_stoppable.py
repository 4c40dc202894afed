"""SIGTERM ends the daemon within seconds and with status 0, whatever hangs around it."""

import fcntl
import os
import signal

import pytest
from gi.repository import GLib

from harness import hwdesc, port, wait_for
from harness.device import CONTROL, CONTROL_PATH
from legacy_tool import DISABLED, SERVICE

DEADLINE = 5
F_SETPIPE_SZ = 1031


@pytest.fixture
def gate(device):
    device.conf(hwdesc(port("in0", 0), port("gate", 2, kind="io_ctrl", optional=True)))
    return device


def ends_in_time(device) -> None:
    device.send_signal(signal.SIGTERM)
    assert device.wait_exit(DEADLINE) == 0
    assert "did not stop in time" not in device.stderr(), "it had to be ended by force"


def renew_without_waiting(device, connection, rounds: int) -> None:
    """Drops and refreshes: each has the objects and the name of the legacy bridge renewed."""
    for _ in range(rounds):
        for method, arguments in (
            ("DropIOPorts", GLib.Variant("(as)", (["gate"],))),
            ("RefreshIOPorts", None),
        ):
            connection.call(CONTROL, CONTROL_PATH, CONTROL, method, arguments, None, 0, -1, None, None)


@pytest.mark.parametrize("arguments", [(), (DISABLED,)], ids=["with bridge", "without bridge"])
def test_a_bus_that_answers_nothing(gate, arguments):
    gate.start(*arguments)
    gate.call("GetNbrPorts")
    gate.bus.pause()
    ends_in_time(gate)


@pytest.mark.parametrize("arguments", [(), (DISABLED,)], ids=["with bridge", "without bridge"])
def test_a_bus_that_answers_nothing_at_the_start(gate, arguments):
    gate.bus.start()
    gate.bus.pause()
    gate.start(*arguments, wait=False)
    # The settings are stored before the bus is looked for.
    wait_for(lambda: gate.path("/etc/portd/portd.conf").exists(), "the settings")
    ends_in_time(gate)


def test_a_bus_that_stops_answering_while_ports_are_dropped(gate):
    gate.start()
    gate.wait_name(SERVICE)
    connection = gate.bus.connect()
    renew_without_waiting(gate, connection, 200)
    with gate.signals("NameOwnerChanged", "org.freedesktop.DBus", "/org/freedesktop/DBus") as names:
        names.wait(lambda change: change[0] == SERVICE)
        gate.bus.pause()
        ends_in_time(gate)


def test_a_bus_that_goes_away_while_ports_are_dropped(make_device):
    for _ in range(3):
        device = make_device()
        device.conf(hwdesc(port("in0", 0), port("gate", 2, kind="io_ctrl", optional=True)))
        device.start()
        device.wait_name(SERVICE)
        connection = device.bus.connect()
        renew_without_waiting(device, connection, 100)
        with device.signals("NameOwnerChanged", "org.freedesktop.DBus", "/org/freedesktop/DBus") as names:
            names.wait(lambda change: change[0] == SERVICE)
            device.bus.kill()
        assert device.wait_exit() == 0


def test_a_reader_of_the_log_that_does_not_read(gate):
    reader, writer = os.pipe()
    fcntl.fcntl(writer, F_SETPIPE_SZ, 8192)
    gate.start(stdout=writer)
    os.close(writer)
    for _ in range(300):
        # Each is refused with a warning in the log.
        pending = gate.begin_call("StartActionSequence", "uba(bi)", 0, False, [(True, 0)])
    wait_for(lambda: pending.done, "the last answer")
    read = os.read(reader, 65536)
    gate.send_signal(signal.SIGHUP)
    os.set_blocking(reader, False)

    def told() -> bool:
        nonlocal read
        try:
            read += os.read(reader, 65536)
        except BlockingIOError:
            pass
        return b"Got SIGHUP" in read

    wait_for(told, "a line after the lost ones")
    lines = read.decode().splitlines()
    (lost,) = [line for line in lines if line.endswith("log lines were lost: standard output was blocked")]
    refused = sum("Set action seq on incorrect port" in line for line in lines)
    assert refused + int(lost.split()[2]) >= 300
    for _ in range(300):
        gate.begin_call("StartActionSequence", "uba(bi)", 0, False, [(True, 0)])
    gate.call("GetNbrPorts")
    ends_in_time(gate)
    os.close(reader)


def test_standard_descriptors_that_are_closed(gate):
    closed = ["sh", "-c", 'exec "$0" "$@" <&- >&- 2>&-']
    gate.start(launcher=closed)
    opened = [os.stat(f"/proc/{gate.pid}/fd/{number}").st_rdev for number in range(3)]
    assert opened == [os.stat("/dev/null").st_rdev] * 3
    gate.call("StartActionSequence", "uba(bi)", 2, True, [(True, 0)])
    ends_in_time(gate)
