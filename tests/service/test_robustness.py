"""Nothing that a client, a neighbour or long use does may harm the daemon."""

import pytest
from gi.repository import Gio, GLib

from control import METHODS, ODD_NUMBERS, call_everything
from harness import DBusError, Device, hwdesc, is_real_root, port, wait_for
from harness.device import CONTROL, CONTROL_PATH

PROPERTIES = "org.freedesktop.DBus.Properties"


@pytest.fixture
def full(device) -> Device:
    """A running device with every backend in every role that it can have."""
    device.write("/run/flag", "0\n")
    polled = {"path": "/run/flag", "timeout": "10"}
    kinds = ("input", "output", "io_ctrl")
    backends = ("check", "virtual", "null")
    ports = [
        port(f"p{n}", n, kinds[n % 3], backends[n // 3], optional=n % 2 == 0) for n in range(9)
    ]
    ports.append(port("polled", 9, backend="sysfs", device=polled, optional=True))
    device.conf(hwdesc(*ports))
    return device.start()


OPTIONAL = ["p0", "p2", "p4", "p6", "p8", "polled"]


def test_every_method_for_every_number(full):
    call_everything(full, [*range(10), *ODD_NUMBERS])
    full.call("DropIOPorts", "as", OPTIONAL)
    call_everything(full, [*range(10), *ODD_NUMBERS])
    assert full.call("GetPortProps")[0] == 10


# Signatures that are not the method's own, with arguments for each.
BAD_CALLS = {
    "": (),
    "u": (0,),
    "i": (-1,),
    "s": ("x",),
    "ub": (0, True),
    "us": (0, "x"),
    "ubs": (0, True, "x"),
    "ubb": (0, True, True),
    "uba(bi)": (0, True, []),
    "as": ([],),
    "v": (GLib.Variant("s", "x"),),
    "a{sv}": ({},),
    "t": (2**64 - 1,),
    "x": (-(2**63),),
}


@pytest.mark.parametrize("method, signature, _out", METHODS)
def test_wrong_signatures_are_refused(full, method, signature, _out):
    for bad in BAD_CALLS.keys() - {signature}:
        with pytest.raises(DBusError) as caught:
            full.call(method, bad, *BAD_CALLS[bad])
        assert caught.value.name == "org.freedesktop.DBus.Error.InvalidArgs"
    assert full.running


def test_unknown_members_are_refused(full):
    unknown = "org.freedesktop.DBus.Error.Unknown"
    calls = [
        (CONTROL_PATH, CONTROL, "NoSuchMethod", ""),
        (CONTROL_PATH, "com.kelv.NoSuchInterface", "GetState", ""),
        ("/com/kelv/Nowhere", CONTROL, "GetNbrPorts", ""),
        ("/", CONTROL, "GetNbrPorts", ""),
    ]
    for path, interface, method, signature in calls:
        with pytest.raises(DBusError) as caught:
            full.bus.call(CONTROL, path, interface, method, signature)
        assert caught.value.name.startswith(unknown)


def test_there_are_no_properties(full):
    assert full.bus.call(CONTROL, CONTROL_PATH, PROPERTIES, "GetAll", "s", CONTROL) == {}
    for method, signature, arguments in [
        ("Get", "ss", (CONTROL, "State")),
        ("Set", "ssv", (CONTROL, "State", GLib.Variant("b", True))),
        ("GetAll", "s", ("com.kelv.NoSuchInterface",)),
    ]:
        with pytest.raises(DBusError):
            full.bus.call(CONTROL, CONTROL_PATH, PROPERTIES, method, signature, *arguments)
    assert full.running


def test_huge_arguments(full):
    assert full.call("DropIOPorts", "as", ["nobody"] * 20_000) == []
    assert full.call("DropIOPorts", "as", ["x" * 10_000_000]) == []
    with pytest.raises(DBusError):
        full.call("StartActionSequence", "uba(bi)", 0, False, [(True, 2**31 - 1)] * 20_000)
    with pytest.raises(DBusError):
        full.call("SetDirection", "us", 2, "output" * 500_000)
    assert full.running


def test_a_flood_of_calls_without_waiting(full):
    # Each of the first two thousand saves to storage, and the last reply waits for all of them.
    timeout = 120
    pending = [
        full.begin_call("SetState", "ub", 1, number % 2 == 0, timeout=timeout)
        for number in range(2000)
    ] + [full.begin_call("GetPortProps", timeout=timeout) for _ in range(500)]
    wait_for(lambda: all(call.done for call in pending), "all replies", timeout)
    for call in pending:
        call.result()
    assert full.call("GetState", "u", 1) is False


def test_clients_that_leave_without_their_reply(full):
    for _ in range(30):
        connection = full.bus.connect()
        message = Gio.DBusMessage.new_method_call(CONTROL, CONTROL_PATH, CONTROL, "GetPortProps")
        connection.send_message(message, Gio.DBusSendMessageFlags.NONE)
        connection.flush_sync(None)
        connection.close_sync(None)
    assert full.call("GetPortProps")[0] == 10


def test_calls_that_want_no_reply(full):
    calls = [("SetState", "(ub)", (1, True)), ("GetState", "(u)", (77,)), ("Nonsense", "()", ())]
    for method, signature, arguments in calls:
        message = Gio.DBusMessage.new_method_call(CONTROL, CONTROL_PATH, CONTROL, method)
        message.set_flags(Gio.DBusMessageFlags.NO_REPLY_EXPECTED)
        message.set_body(GLib.Variant(signature, arguments))
        full.bus.connection.send_message(message, Gio.DBusSendMessageFlags.NONE)
    wait_for(lambda: full.call("GetState", "u", 1), "the state set without a reply")


def test_a_forged_signal_is_no_request(full):
    full.bus.connection.emit_signal(
        None, CONTROL_PATH, CONTROL, "SetState", GLib.Variant("(ub)", (1, True))
    )
    assert full.call("GetState", "u", 1) is False


def test_only_the_service_account_may_have_its_names(full):
    """Asked as an ordinary account; where there is none but root, for a name that nobody may have."""
    account = ["setpriv", "--reuid=65534", "--regid=65534", "--clear-groups"]
    name = CONTROL if is_real_root() else "com.kelv.PCD.NotListed"
    request = full.sandbox.spawn(
        [*(account if is_real_root() else []), "gdbus", "call", "--system",
         "--dest=org.freedesktop.DBus", "--object-path=/org/freedesktop/DBus",
         "--method=org.freedesktop.DBus.RequestName", name, "4"],
        {"PATH": "/usr/sbin:/usr/bin:/sbin:/bin",
         "DBUS_SYSTEM_BUS_ADDRESS": "unix:path=/run/dbus/system_bus_socket"}, -1, -1,
    )  # fmt: skip
    _, errors = request.communicate()
    assert request.returncode != 0 and b"AccessDenied" in errors


def resident_kib(device: Device) -> int:
    return int(device.status("VmRSS").split()[0])


def drop_and_refresh(device: Device) -> None:
    assert sorted(device.call("DropIOPorts", "as", OPTIONAL)) == OPTIONAL
    device.call("RefreshIOPorts")


def test_dropping_and_refreshing_leaks_nothing(full):
    for _ in range(100):
        drop_and_refresh(full)
    descriptors, resident = len(full.descriptors()), resident_kib(full)
    for _ in range(100):
        drop_and_refresh(full)
    assert len(full.descriptors()) == descriptors
    # A sanitizer keeps freed memory for a while, and looks for leaks itself.
    assert resident_kib(full) - resident < (128 * 1024 if full.sanitized else 512)
    with full.signals() as signals:
        full.write("/run/flag", "1\n")
        wait_for(lambda: full.call("GetState", "u", 9), "the polled change")
        full.call("SetState", "ub", 1, True)
        signals.wait(lambda change: change.port == 1)
        assert [change.port for change in signals.received] == [9, 1]


def test_long_use_leaks_nothing(full):
    for warm_up_or_measured in range(2):
        descriptors, resident = len(full.descriptors_at_rest()), resident_kib(full)
        for _ in range(10):
            call_everything(full, range(10))
    wait_for(lambda: len(full.descriptors()) == descriptors, "what storing opens to be closed")
    assert resident_kib(full) - resident < (128 * 1024 if full.sanitized else 512)


def test_refreshing_does_not_repeat_signals(full):
    with full.signals() as signals:
        for _ in range(20):
            drop_and_refresh(full)
        for state in (True, False):
            full.call("SetState", "ub", 1, state)
        signals.wait(lambda change: change.port == 1 and not change.state)
        assert [(change.port, change.state) for change in signals.received] == [
            (1, True),
            (1, False),
        ]
