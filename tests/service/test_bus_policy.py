"""Who may call what, by the stock rules of a system bus and the shipped policy."""

import json
import os
import re
import subprocess
import xml.etree.ElementTree as ElementTree
from pathlib import Path

import pytest

from harness import hwdesc, is_real_root, port, wait_for
from harness.device import REPOSITORY
from legacy_tool import BASE, INPUT, OUTPUT, PATH, PROPERTIES, READABLE, SERVICE, WRITABLE

STOCK_RULES = Path("/usr/share/dbus-1/system.conf")
DENIED = "org.freedesktop.DBus.Error.AccessDenied"

# A method that is missing here fails the test: somebody has to decide whom it is for.
EVERYBODY = {
    "com.kelv.IOControl.State": {
        "GetActive", "GetDirection", "GetNames", "GetNbrPorts", "GetPortProps", "GetState",
        "IsConfigurable",
    },
    "com.kelv.PCD.Connector": {"GetConnectorStates", "GetNumConnectors"},
    "com.kelv.IOSupervised.Supervised": {
        "GetNumberOfPorts", "GetSupervised", "GetSupervisedPortNumbers", "GetSupervisedRanges",
        "GetSupervisedReadout", "GetSupervisedStates", "IsSupervisable",
    },
}  # fmt: skip
MEMBERS = {
    "com.kelv.IOControl.State": {
        "DropIOPorts", "RefreshIOPorts", "SetActive", "SetDirection", "SetName", "SetState",
        "SetVirtual", "StartActionSequence",
    },
    "com.kelv.PCD.Connector": {"EmitSNMPEvent"},
    "com.kelv.IOSupervised.Supervised": {"SetSupervised", "SetSupervisedRanges"},
}  # fmt: skip

# The least value of each type of argument.
ARGUMENTS = {"u": "uint32 0", "i": "0", "b": "false", "s": "''", "as": "@as []", "a(bi)": "@a(bi) []"}

# Makes the calls as another account, which needs a process of its own.
CALLER = """
import json, sys
from gi.repository import Gio, GLib
bus = Gio.bus_get_sync(Gio.BusType.SYSTEM, None)
answers = []
for name, path, interface, method, arguments in json.load(sys.stdin):
    message = Gio.DBusMessage.new_method_call(name, path, interface or None, method)
    message.set_body(GLib.Variant.parse(None, arguments, None, None))
    reply, _serial = bus.send_message_with_reply_sync(message, 0, 20000, None)
    answers.append(reply.get_error_name() or "")
json.dump(answers, sys.stdout)
"""

PORTD_GROUP = 991
ACCOUNTS = {
    "root": [],
    "service account": ["--reuid=990", "--regid=990", "--clear-groups"],
    "member": ["--reuid=1000", "--regid=1000", f"--groups={PORTD_GROUP}"],
    "nobody": ["--reuid=65534", "--regid=65534", "--clear-groups"],
}
# Where only one user id exists, all calls are root's.
REAL_ACCOUNTS = ACCOUNTS if is_real_root() else {"root": ACCOUNTS["root"]}


def methods_of_the_interfaces() -> dict[str, dict[str, str]]:
    """Arguments in GVariant's text form by interface and method."""
    found: dict[str, dict[str, str]] = {}
    for document in sorted((REPOSITORY / "src/dbus/interfaces").glob("*.xml")):
        for interface in ElementTree.parse(document).getroot().iter("interface"):
            methods = found.setdefault(interface.get("name", ""), {})
            for method in interface.iter("method"):
                values = [
                    ARGUMENTS[arg.get("type", "")]
                    for arg in method.iter("arg")
                    if arg.get("direction") == "in"
                ]
                methods[method.get("name", "")] = f"({', '.join(values)}{',' * (len(values) == 1)})"
    return found


@pytest.fixture
def guarded(device):
    """A device whose bus has the rules that the distribution ships."""
    device.write("/etc/passwd", device.read("/etc/passwd") + "operator:x:1000:1000::/:/bin/false\n")
    device.write("/etc/group", device.read("/etc/group") + f"portd:x:{PORTD_GROUP}:operator\n")
    # The account that the bus daemon becomes, and its way to start services, are not part of this.
    rules = re.sub(r"<user>.*?</user>|<syslog/>", "", STOCK_RULES.read_text())
    device.bus.use_config(rules)
    device.conf(hwdesc(port("in0", 0), port("out1", 1, kind="output"), port("io2", 2, kind="io_ctrl")))
    device.start()
    device.wait_name(SERVICE)
    return device


def answers(device, account: str, calls: list[tuple[str, ...]]) -> list[str]:
    """What an account is told: nothing, or the name of the error."""
    switch = ACCOUNTS[account]
    process = device.sandbox.spawn(
        [*(["setpriv", *switch] if switch else []), "/usr/bin/python3", "-c", CALLER],
        {"PATH": os.environ["PATH"],
         "DBUS_SYSTEM_BUS_ADDRESS": "unix:path=/run/dbus/system_bus_socket"},
        subprocess.PIPE, subprocess.PIPE, stdin=subprocess.PIPE,
    )  # fmt: skip
    output, errors = process.communicate(json.dumps(calls).encode())
    assert process.returncode == 0, errors.decode()
    return json.loads(output)


def denied(device, account: str, calls: list[tuple[str, ...]]) -> list[tuple[str, ...]]:
    told = answers(device, account, calls)
    assert len(told) == len(calls)
    return [call for call, error in zip(calls, told) if error == DENIED]


def calls_of(decisions: dict[str, set[str]]) -> list[tuple[str, ...]]:
    arguments = methods_of_the_interfaces()
    return [
        (name, "/" + name.replace(".", "/"), name, method, arguments[name][method])
        for name in decisions
        for method in sorted(decisions[name])
    ]


def reads() -> list[tuple[str, ...]]:
    everywhere = [("/com/kelv/IOControl/State", name) for name in EVERYBODY] + [(f"{PATH}/2", SERVICE)]
    calls = calls_of(EVERYBODY)
    calls.append(("com.kelv.IOControl.State", "/com/kelv/Event/pcd", "com.kelv.Event.Producer", "List", "()"))
    for path, name in everywhere:
        calls.append((name, path, "org.freedesktop.DBus.Introspectable", "Introspect", "()"))
        calls.append((name, path, "org.freedesktop.DBus.Peer", "Ping", "()"))
    for interface, names in READABLE.items():
        calls.append((SERVICE, f"{PATH}/2", PROPERTIES, "GetAll", f"('{interface}',)"))
        calls += [(SERVICE, f"{PATH}/2", PROPERTIES, "Get", f"('{interface}', '{n}')") for n in names]
    return calls


def changes() -> list[tuple[str, ...]]:
    writes = [
        (name, f"{PATH}/2", PROPERTIES, "Set", f"('{interface}', '{property}', <0>)")
        for name in (SERVICE, "com.kelv.IOControl.State")
        for interface in (BASE, INPUT, OUTPUT)
        for property in WRITABLE[interface]
    ]
    return calls_of(MEMBERS) + writes


def test_every_method_has_a_decision():
    found = {name: set(methods) for name, methods in methods_of_the_interfaces().items()}
    assert found.keys() == EVERYBODY.keys() == MEMBERS.keys()
    for name, methods in found.items():
        assert not EVERYBODY[name] & MEMBERS[name]
        assert methods == EVERYBODY[name] | MEMBERS[name]


@pytest.mark.parametrize("account", REAL_ACCOUNTS)
def test_reading_is_for_everybody(guarded, account):
    assert denied(guarded, account, reads()) == []


@pytest.mark.parametrize("account", REAL_ACCOUNTS)
def test_changing_is_for_the_group(guarded, account):
    expected = changes() if account == "nobody" else []
    assert denied(guarded, account, changes()) == expected


def test_the_interface_cannot_be_left_out_to_slip_through(guarded):
    account = "nobody" if is_real_root() else "root"
    call = ("com.kelv.IOControl.State", "/com/kelv/IOControl/State", "com.kelv.IOControl.State",
            "SetState", "(uint32 1, true)")  # fmt: skip
    unnamed = (*call[:2], "", *call[3:])
    refused = denied(guarded, account, [unnamed])
    assert refused == ([unnamed] if account == "nobody" else [])
    assert guarded.call("GetState", "u", 1) is False


def test_signals_reach_everybody(guarded):
    account = ACCOUNTS["nobody" if is_real_root() else "root"]
    listener = guarded.sandbox.spawn(
        [*(["setpriv", *account] if account else []), "gdbus", "monitor", "--system",
         "--dest=com.kelv.IOControl.State"],
        {"PATH": os.environ["PATH"],
         "DBUS_SYSTEM_BUS_ADDRESS": "unix:path=/run/dbus/system_bus_socket"},
        subprocess.PIPE, subprocess.DEVNULL,
    )  # fmt: skip
    os.set_blocking(listener.stdout.fileno(), False)
    heard = b""

    def hears(what: bytes) -> bool:
        nonlocal heard
        heard += listener.stdout.read() or b""
        return what in heard

    wait_for(lambda: hears(b"is owned by"), "the listener")
    guarded.call("SetState", "ub", 1, True)
    wait_for(lambda: hears(b"PortChanged"), "the signal")
    listener.kill()
    listener.wait()
