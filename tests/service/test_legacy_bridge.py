"""What older configuration tools see: the objects of the ports, and the files that lead there."""

import os
import random
import re
import signal
import subprocess
from pathlib import Path
from typing import Any

import pytest
from gi.repository import Gio, GLib

from arrivals import Arrivals
from harness import DBusError, hwdesc, is_real_root, port, wait_for

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


@pytest.fixture
def tool(device) -> Tool:
    device.conf(four_ports())
    device.start()
    return Tool(device)


def fails(name: str, action, *args: Any) -> str:
    """The message of the error that the action must give."""
    with pytest.raises(DBusError) as caught:
        action(*args)
    assert caught.value.name == name
    return caught.value.message


def settings_identity(device) -> tuple[int, int]:
    """Changes with every save, since a save replaces the file."""
    status = device.path("/etc/portd/portd.conf").stat()
    return status.st_ino, status.st_mtime_ns


def saves(tool: Tool, *request: Any) -> bool:
    before = settings_identity(tool.device)
    tool.set(*request)
    return settings_identity(tool.device) != before


# Objects


def test_objects_by_type(tool):
    assert tool.numbers() == [0, 1, 2, 3]
    assert [tool.interfaces(n) for n in range(4)] == [
        [BASE, INPUT],
        [BASE, OUTPUT],
        [BASE, INPUT, OUTPUT],
        [BASE, OUTPUT],
    ]


def test_introspection_is_the_declared_one(tool):
    info = Gio.DBusNodeInfo.new_for_xml(tool.introspect("/2"))
    for interface in (BASE, INPUT, OUTPUT):
        found = info.lookup_interface(interface)
        assert not found.methods and not found.signals
        assert tuple(p.name for p in found.properties) == READABLE[interface]
        for found_property in found.properties:
            name = found_property.name
            writable = name in WRITABLE[interface]
            assert bool(found_property.flags & Gio.DBusPropertyInfoFlags.WRITABLE) == writable
            if name.startswith("Nbr") or name in NUMBERS:
                assert found_property.signature == "i"
            else:
                assert found_property.signature == ("b" if name == "Configurable" else "ay")


def test_there_are_no_methods(tool):
    with pytest.raises(DBusError) as caught:
        tool.device.bus.call(SERVICE, f"{PATH}/0", BASE, "Anything")
    assert caught.value.name == "org.freedesktop.DBus.Error.UnknownMethod"


def test_every_property_of_every_object(tool):
    counts = {"NbrOfIOPorts": 3, "NbrOfInputs": 2, "NbrOfOutputs": 1}
    output = {
        "Active": "closed", "Button": "none", "PulseTime": 0, "Mode": "bistable", "DelayTime": 0,
    }  # fmt: skip
    expected = {
        (0, BASE): {**counts, "Configurable": False, "Direction": "input"},
        (0, INPUT): {"Name": "Input 1", "Trig": "closed"},
        (1, BASE): {**counts, "Configurable": False, "Direction": "output"},
        (1, OUTPUT): {"Name": "Output 1", **output},
        (2, BASE): {**counts, "Configurable": True, "Direction": "input"},
        (2, INPUT): {"Name": "Input 2", "Trig": "closed"},
        (2, OUTPUT): {"Name": "Output 2", **output},
        # Not one of the device's own ports: it has no direction that anybody could choose.
        (3, BASE): counts,
        (3, OUTPUT): {"Name": "Output 3", **output},
    }
    for (number, interface), values in expected.items():
        assert tool.get_all(number, interface) == values
        for name in READABLE[interface]:
            if name in values:
                assert tool.get(number, interface, name) == values[name]
            else:
                fails(INVALID, tool.get, number, interface, name)


def test_text_is_answered_as_a_string(tool):
    reply = tool.device.bus.connection.call_sync(
        SERVICE, f"{PATH}/2", PROPERTIES, "Get", GLib.Variant("(ss)", (INPUT, "Name")),
        GLib.VariantType("(v)"), Gio.DBusCallFlags.NONE, -1, None,
    )  # fmt: skip
    assert reply.get_child_value(0).get_variant().get_type_string() == "s"


def test_unknown_properties_and_interfaces(tool):
    fails(INVALID, tool.get, 0, BASE, "Name")
    fails(INVALID, tool.get, 0, INPUT, "Active")
    fails(INVALID, tool.get, 0, OUTPUT, "Name")
    fails(INVALID, tool.get_all, 0, OUTPUT)
    for name in ("NbrOfIOPorts", "NbrOfInputs", "NbrOfOutputs", "Configurable"):
        fails(INVALID, tool.set, 0, BASE, name, 1)


def test_count_comes_from_the_hardware_description(device):
    device.conf(four_ports(count_of_ports(2)))
    device.start()
    assert Tool(device).numbers() == [0, 1]


def test_without_a_count_there_are_five(device):
    ports = [port(f"p{n}", n) for n in range(7)]
    device.conf(hwdesc(*ports))
    device.start()
    assert Tool(device).numbers() == [0, 1, 2, 3, 4]


def test_a_count_without_bounds(device):
    far = 2000000000
    device.conf(four_ports(port("far", far, kind="io_ctrl"), count_of_ports(2147483647)))
    device.start()
    tool = Tool(device)
    assert tool.numbers() == [0, 1, 2, 3, far]
    # Beyond the count of ports nobody gave it names.
    for interface in (INPUT, OUTPUT):
        assert tool.get(far, interface, "Name") == "<NULL>"
        tool.set(far, interface, "Name", f"by {interface}")
        assert tool.get(far, interface, "Name") == f"by {interface}"


def test_numbers_used_twice_have_one_object(device):
    device.conf(hwdesc(port("first", 0), port("second", 0, kind="output")))
    device.start()
    assert Tool(device).interfaces(0) == [BASE, INPUT]


@pytest.mark.parametrize("ports", [[], [port("two", 2)], [port("none", 0, flags="")]])
def test_object_zero_is_always_there(device, ports):
    device.conf(hwdesc(*ports))
    device.start()
    tool = Tool(device)
    assert tool.interfaces(0) == [BASE]
    inputs = sum('nbr="2"' in text for text in ports)
    assert tool.get_all(0, BASE) == {"NbrOfInputs": inputs, "NbrOfOutputs": 0}
    assert tool.get(0, BASE, "NbrOfInputs") == inputs
    for name in ("NbrOfIOPorts", "Configurable", "Direction"):
        assert fails(NO_PORT, tool.get, 0, BASE, name) == "No such port."
    assert fails(NO_PORT, tool.set, 0, BASE, "Direction", "input") == "No such port."


# Setters


def test_name(tool):
    assert saves(tool, 2, INPUT, "Name", "Gate")
    assert saves(tool, 2, OUTPUT, "Name", "Sirène €")
    assert tool.get(2, INPUT, "Name") == "Gate"
    assert tool.get(2, OUTPUT, "Name") == "Sirène €"
    assert tool.device.call("GetNames", "u", 2) == ("Gate", "Sirène €")
    settings = tool.device.read_settings()
    assert "input_name=Gate\n" in settings and "output_name=Sirène €\n" in settings
    assert saves(tool, 2, INPUT, "Name", "Gate"), "a name is saved although it was there"


def test_an_empty_name(tool):
    tool.set(0, INPUT, "Name", "")
    assert tool.get(0, INPUT, "Name") == ""


def test_trig_and_active(tool):
    assert saves(tool, 2, INPUT, "Trig", "open")
    assert (tool.get(2, INPUT, "Trig"), tool.get(2, OUTPUT, "Active")) == ("open", "closed")
    assert saves(tool, 2, OUTPUT, "Active", "open")
    assert saves(tool, 2, INPUT, "Trig", "closed")
    assert (tool.get(2, INPUT, "Trig"), tool.get(2, OUTPUT, "Active")) == ("closed", "open")
    assert tool.device.call("GetActive", "u", 2) == ("closed", "open")
    settings = tool.device.read_settings()
    assert "output_activelow=true" in settings.partition("[io2]")[2]
    for word in ("Open", "", "open "):
        assert fails(INVALID, tool.set, 2, INPUT, "Trig", word) == "Incorrect value for Trig"
        assert fails(INVALID, tool.set, 2, OUTPUT, "Active", word) == "Incorrect value for Active"


def test_direction_of_fixed_ports(tool):
    assert not saves(tool, 0, BASE, "Direction", "input")
    assert not saves(tool, 1, BASE, "Direction", "output")
    for number, word in ((0, "output"), (1, "input")):
        message = fails(INVALID, tool.set, number, BASE, "Direction", word)
        assert message == "Port Direction is not settable"


def test_direction_of_a_configurable_port(tool):
    assert not saves(tool, 2, BASE, "Direction", "input"), "it is an input already"
    assert saves(tool, 2, BASE, "Direction", "output")
    assert tool.get(2, BASE, "Direction") == "output"
    assert (tool.get(0, BASE, "NbrOfInputs"), tool.get(0, BASE, "NbrOfOutputs")) == (1, 2)
    assert tool.device.call("GetDirection", "u", 2) == "output"
    assert "input=false" in tool.device.read_settings().partition("[io2]")[2]


def test_a_direction_that_is_none(tool):
    before = settings_identity(tool.device)
    assert fails(INVALID, tool.set, 2, BASE, "Direction", "Input") == "Bad Direction 'Input'"
    tool.device.wait_log("Undefined input: Input, for property: Direction")
    assert settings_identity(tool.device) == before


def test_output_behaviour(tool):
    for name, values in (
        ("Button", ("pulse", "actinact", "none")),
        ("PulseTime", (500, -1, 2147483647, -2147483648, 0)),
        ("DelayTime", (500, -1, 2147483647, -2147483648, 0)),
        ("Mode", ("monostable", "bistable")),
    ):
        for value in values:
            assert saves(tool, 1, OUTPUT, name, value)
            assert tool.get(1, OUTPUT, name) == value
    assert fails(INVALID, tool.set, 1, OUTPUT, "Mode", "") == "Incorrect value for Mode"


def test_an_unknown_button_is_saved_unchanged(tool):
    tool.set(1, OUTPUT, "Button", "pulse")
    assert saves(tool, 1, OUTPUT, "Button", "toggle")
    assert tool.get(1, OUTPUT, "Button") == "pulse"


def test_refused_values_are_not_saved(tool):
    before = settings_identity(tool.device)
    for request in ((2, INPUT, "Trig", "x"), (2, OUTPUT, "Active", "x"), (1, OUTPUT, "Mode", "x"),
                    (0, BASE, "Direction", "output"), (2, BASE, "Direction", "x")):  # fmt: skip
        fails(INVALID, tool.set, *request)
    assert settings_identity(tool.device) == before


def test_settings_outlive_a_restart(tool):
    tool.set(2, BASE, "Direction", "output")
    tool.set(2, OUTPUT, "Name", "Lock")
    tool.set(2, OUTPUT, "DelayTime", -1)
    tool.set(2, OUTPUT, "PulseTime", -1)
    assert "delay_time=18446744073709551615" in tool.device.read_settings()
    assert "pulse_time=4294967295" in tool.device.read_settings()
    before = tool.get_all(2, OUTPUT)
    tool.device.restart()
    assert tool.get(2, BASE, "Direction") == "output"
    assert tool.get_all(2, OUTPUT) == before
    assert (before["Name"], before["DelayTime"], before["PulseTime"]) == ("Lock", -1, -1)


@pytest.mark.parametrize("number", range(4))
def test_byte_strings_that_are_no_text(tool, number):
    before = {i: tool.get_all(number, i) for i in tool.interfaces(number)}
    saved = settings_identity(tool.device)
    for interface in tool.interfaces(number):
        for name in set(WRITABLE[interface]) - set(NUMBERS):
            for raw in (b"", b"open", b"output", b"pulse", b"\xff\xfe\0", b"Caf\xe9\0", b"\xc0\x80\0"):
                message = fails(INVALID, tool.set_variant, number, interface, name, text(raw))
                expected = "Bad Direction ''" if name == "Direction" else f"Incorrect value for {name}"
                assert message == expected
    assert {i: tool.get_all(number, i) for i in tool.interfaces(number)} == before
    assert settings_identity(tool.device) == saved


def test_wrong_types(tool):
    before = {(n, i): tool.get_all(n, i) for n in range(4) for i in tool.interfaces(n)}
    saved = settings_identity(tool.device)
    for number, interface in before:
        for name in READABLE[interface]:
            for value in ("'open'", "true", "uint32 1", "int64 1", "1.0", "['a']", "<'a'>", "b'open'",
                          "1", "(1,)", "@a{sv} {}", "[true]", "@as []"):  # fmt: skip
                variant = GLib.Variant.parse(None, value, None, None)
                wanted = "i" if name in NUMBERS else "ay"
                if name in WRITABLE[interface] and variant.get_type_string() == wanted:
                    continue
                fails(INVALID, tool.set_variant, number, interface, name, variant)
    assert {(n, i): tool.get_all(n, i) for n, i in before} == before
    assert settings_identity(tool.device) == saved


def random_variant(chance: random.Random, depth: int = 0) -> GLib.Variant:
    kind = chance.choice("ybnqiuxtdsog" + ("va(" if depth < 3 else ""))
    if kind == "a":
        if chance.random() < 0.7:
            raw = bytes(chance.choices(range(256), k=chance.randrange(12)))
            return text(raw + b"\0" * chance.randrange(2))
        element = random_variant(chance, depth + 1)
        return GLib.Variant.new_array(element.get_type(), [element] * chance.randrange(3))
    if kind == "(":
        members = [random_variant(chance, depth + 1) for _ in range(chance.randrange(1, 4))]
        return GLib.Variant.new_tuple(*members)
    if kind == "v":
        return GLib.Variant.new_variant(random_variant(chance, depth + 1))
    return GLib.Variant(kind, _random_basic(chance, kind))


def _random_basic(chance: random.Random, kind: str) -> Any:
    sizes = {"y": (0, 8), "n": (1, 16), "q": (0, 16), "i": (1, 32), "u": (0, 32), "x": (1, 64),
             "t": (0, 64)}  # fmt: skip
    if kind in sizes:
        signed, bits = sizes[kind]
        low = -(1 << (bits - 1)) if signed else 0
        return chance.choice((low, low + (1 << bits) - 1, chance.randrange(low, low + (1 << bits))))
    words = ("open", "closed", "input", "output", "pulse", "bistable", "", "ÿ\n[x]", "a" * 300)
    return {"b": chance.random() < 0.5, "d": chance.random(), "s": chance.choice(words), "o": "/a/b",
            "g": "a{sv}"}[kind]  # fmt: skip


def words_now_and_then(chance: random.Random, name: str) -> GLib.Variant:
    """Random, but often enough of the type that is asked for to get past the first check."""
    if chance.random() < 0.5:
        return random_variant(chance)
    if name in NUMBERS:
        return GLib.Variant("i", _random_basic(chance, "i"))
    word = chance.choice(("open", "closed", "input", "output", "none", "pulse", "actinact", "bistable",
                          "monostable", "Tür", "%s%n", "a\nb=c\n[out1]", "\x7f", "ю" * 200))  # fmt: skip
    return text(word.encode() + b"\0" * chance.randrange(3))


def test_random_values_leave_the_daemon_answering(tool):
    chance = random.Random(20240607)
    targets = [(n, i, p) for n in range(4) for i in READABLE for p in READABLE[i]]
    accepted = 0
    for _ in range(3000):
        number, interface, name = chance.choice(targets)
        try:
            tool.set_variant(number, interface, name, words_now_and_then(chance, name))
            accepted += 1
        except DBusError as error:
            assert error.name in (INVALID, "org.freedesktop.DBus.Error.UnknownInterface")
        if chance.random() < 0.1:
            tool.get_all(number, BASE)
    assert accepted > 100, "hardly anything got through, so little was tried"
    before = {(n, i): tool.get_all(n, i) for n in range(4) for i in tool.interfaces(n)}
    tool.device.restart()
    assert {key: tool.get_all(*key) for key in before} == before


# Announcements


def changes(device):
    return device.signals("Changed", "com.kelv.Configuration.Event", "/com/kelv/Configuration/Event")


def announcement(inputs: int, outputs: int) -> list[tuple]:
    return [
        (BASE, f"{PATH}/0", f"NbrOfInputs={inputs}"),
        (BASE, f"{PATH}/0", f"NbrOfOutputs={outputs}"),
    ]


def test_counts_are_announced_at_the_start(device):
    device.conf(four_ports())
    with changes(device) as announced:
        device.start()
        assert announced.wait_count(2) == announcement(2, 1)


def test_counts_are_announced_when_a_direction_changes(tool):
    with changes(tool.device) as announced:
        tool.set(2, BASE, "Direction", "input")
        tool.set(1, BASE, "Direction", "output")
        tool.set(2, BASE, "Direction", "output")
        assert announced.wait_count(2) == announcement(1, 2)


# Files


def golden(name: str) -> str:
    return (GOLDEN / name).read_text()


def test_files(tool):
    assert tool.device.read(REGISTRY) == golden("registry.conf")
    assert tool.device.read(MAPPINGS) == golden("mapping.xml")
    assert not tool.device.path(TEMPORARY).exists()
    for path in (REGISTRY, MAPPINGS):
        subprocess.run(["xmllint", "--noout", tool.device.path(path)], check=True)


def test_files_without_ports(device):
    device.conf(hwdesc(port("virt0", 0, kind="output", backend="virtual", flags="virtual")))
    device.start()
    assert device.read(REGISTRY) == golden("registry-no-ports.conf")
    assert device.read(MAPPINGS) == golden("mapping-no-ports.xml")


def test_files_are_written_after_the_settings_and_as_root(device):
    device.conf(four_ports())
    written = [device.path(path) for path in ("/etc/portd/portd.conf", REGISTRY, MAPPINGS)]
    with Arrivals(*(path.parent for path in written)) as arrivals:
        device.start()
        assert arrivals.take(3) == [path.name for path in written]
    for path in written[1:]:
        assert path.stat().st_uid == os.geteuid()


def test_a_count_of_no_ports_leaves_the_object_of_the_counts(device):
    device.conf(four_ports(count_of_ports(0)))
    device.start()
    tool = Tool(device)
    assert tool.get(0, BASE, "NbrOfInputs") == 2
    with pytest.raises(DBusError):
        tool.get(0, INPUT, "Name")
    with pytest.raises(DBusError):
        tool.get(1, BASE, "NbrOfInputs")


def test_old_files_are_replaced(device):
    device.write(REGISTRY, "old")
    device.write(MAPPINGS, "old")
    device.conf(four_ports())
    device.start()
    assert device.read(REGISTRY) == golden("registry.conf")
    assert device.read(MAPPINGS) == golden("mapping.xml")


def test_a_mapping_that_cannot_be_written(device):
    device.path(MAPPINGS).parent.rmdir()
    device.conf(four_ports())
    device.start()
    device.wait_log("Couldn't write to legacy mappings")
    assert device.read(REGISTRY) == golden("registry.conf")
    assert not device.path(TEMPORARY).exists()


@pytest.mark.parametrize("path", [REGISTRY, MAPPINGS])
def test_a_folder_on_a_mount_of_its_own(make_device, path):
    device = make_device(tmpfs={str(Path(path).parent): "64k"})
    device.conf(four_ports())
    device.start()
    assert device.read(REGISTRY) == golden("registry.conf")
    assert device.read(MAPPINGS) == golden("mapping.xml")
    assert not device.path(TEMPORARY).exists()


def test_a_mapping_without_room_leaves_the_new_registry(make_device):
    device = make_device(tmpfs={str(Path(MAPPINGS).parent): "4k"})
    device.write(REGISTRY, "old")
    device.write(f"{MAPPINGS}.more", "x" * 4096)
    device.conf(four_ports())
    device.start()
    device.wait_log("Couldn't write to legacy mappings")
    assert device.read(REGISTRY) == golden("registry.conf")
    assert not device.path(MAPPINGS).exists()


@pytest.mark.parametrize("left_over", [TEMPORARY, f"{TEMPORARY}.XB3F0A"])
def test_what_a_power_failure_left_over_is_no_hardware_description(device, left_over):
    device.conf(four_ports())
    device.write(left_over, "<mapping><group")
    for number in range(4, 8):
        device.fragment(f"{number}.xml", hwdesc(port(f"more{number}", number)))
    device.start()
    assert sorted(props.number for props in device.port_props()) == list(range(8))
    assert not device.path(left_over).exists()


def test_other_fragments_with_a_name_like_it_stay(device):
    device.conf(four_ports())
    device.fragment("legacy.tmp.xml", hwdesc(port("more", 4)))
    device.start()
    assert len(device.port_props()) == 5


def test_no_room_for_the_temporary_file(device):
    device.path("/etc/portd.d").rmdir()
    device.write(REGISTRY, "old")
    device.conf(four_ports())
    device.start()
    device.wait_log("Couldn't write to service registry")
    device.wait_log("Couldn't write to legacy mappings")
    assert device.read(REGISTRY) == "old"


# Dropped and refreshed ports


def optional_port(fragment: str = "") -> str:
    return port("opt", 2, kind="io_ctrl", optional=True, device={"setup": fragment or "ok"})


def give_folders_to_pcd(device) -> None:
    for path in (REGISTRY, MAPPINGS):
        os.chown(device.path(path).parent, 990, 990)


def test_drop_and_refresh_renew_objects_and_files(device):
    device.conf(hwdesc(port("in0", 0), port("out1", 1, kind="output"), optional_port()))
    if is_real_root():
        give_folders_to_pcd(device)
    device.start()
    tool = Tool(device)
    full = device.read(REGISTRY), device.read(MAPPINGS)
    assert full == (golden("registry.conf"), golden("mapping.xml"))
    with changes(device) as announced:
        assert device.call("DropIOPorts", "as", ["opt"]) == ["opt"]
        assert tool.numbers() == [0, 1]
        assert announced.wait_count(2) == announcement(1, 1)
        assert "IOPort/2" not in device.read(REGISTRY)
        assert "IOPort/2" not in device.read(MAPPINGS)
        announced.take()
        device.call("RefreshIOPorts")
        assert tool.numbers() == [0, 1, 2]
        assert announced.wait_count(2) == announcement(2, 1)
    assert (device.read(REGISTRY), device.read(MAPPINGS)) == full
    assert device.bus.has_owner(SERVICE)


def test_nothing_is_renewed_without_a_change(device):
    device.conf(hwdesc(port("in0", 0), port("opt", 1, optional=True)))
    device.start()
    before = device.path(REGISTRY).stat().st_ino
    with changes(device) as announced:
        assert device.call("DropIOPorts", "as", ["in0", "unknown"]) == []
        device.call("RefreshIOPorts")
        assert announced.received == []
    assert device.path(REGISTRY).stat().st_ino == before


def test_folders_that_the_account_may_not_write(device):
    device.conf(hwdesc(port("in0", 0), port("opt", 1, optional=True)))
    device.start()
    if not is_real_root():
        # The daemon is still the one user who may write everything.
        for path in (REGISTRY, MAPPINGS):
            device.sandbox.make_read_only(str(Path(path).parent))
    before = device.read(REGISTRY), device.read(MAPPINGS)
    assert device.call("DropIOPorts", "as", ["opt"]) == ["opt"]
    device.wait_log("Couldn't write to service registry")
    device.wait_log("Couldn't write to legacy mappings")
    assert (device.read(REGISTRY), device.read(MAPPINGS)) == before
    assert Tool(device).numbers() == [0]
    assert not device.path(TEMPORARY).exists()


# The switch


def test_switched_off(device):
    device.conf(hwdesc(port("in0", 0), port("opt", 1, optional=True)))
    device.start(DISABLED)
    assert not device.bus.has_owner(SERVICE)
    assert device.call("DropIOPorts", "as", ["opt"]) == ["opt"]
    device.call("RefreshIOPorts")
    assert not device.bus.has_owner(SERVICE)
    assert not device.path(REGISTRY).exists() and not device.path(MAPPINGS).exists()
    device.stop()


@pytest.mark.parametrize("arguments", [("x", DISABLED), (DISABLED + "x",), ("--verbose",), ("",)])
def test_other_arguments_leave_it_on(device, arguments):
    device.conf(four_ports())
    device.start(*arguments)
    assert Tool(device).numbers() == [0, 1, 2, 3]
    assert device.path(REGISTRY).exists()


# Failures that end the daemon


def ends_with(device, message: str) -> None:
    device.start(wait=False)
    status = device.wait_exit()
    assert status in (-signal.SIGTRAP, -signal.SIGABRT), status
    assert device.log_count(f"ERROR: portd: {message}") == 1


def test_no_bus(device):
    device.conf(four_ports())
    device.bus.start()
    device.bus.kill()
    ends_with(device, "Failed to connect to system bus: ")


def test_name_refused(device):
    device.conf(four_ports())
    device.bus.start()
    policy = device.path("/etc/dbus-1/system.d/com.kelv.portd.conf")
    allowed = policy.read_text()
    policy.write_text(allowed.replace(f'<allow own="{SERVICE}"/>', ""))
    device.bus.bus_call("ReloadConfig")
    ends_with(device, "Could not request name: ")
    policy.write_text(allowed)
    device.bus.bus_call("ReloadConfig")
    device.start()
    assert Tool(device).numbers() == [0, 1, 2, 3]


def test_no_bus_does_not_matter_when_switched_off(device):
    device.conf(four_ports())
    device.bus.start()
    device.bus.kill()
    device.start(DISABLED, wait=False)
    wait_for(device.path("/etc/portd/portd.conf").exists, "the stored settings")
    device.stop()


# Settings of older firmware


def test_export_is_imported(device):
    device.conf(four_ports())
    device.write(EXPORT, """[IOPort.I2]
Direction=output
Usage=Door
[IOPort.I0.Input]
Name="Gate"
Trig=open
[IOPort.I2.Output]
Name=Lock
Active=open
Button=pulse
PulseTime=250
DelayTime=70
Mode=monostable
""")  # fmt: skip
    device.start()
    tool = Tool(device)
    assert tool.get_all(0, INPUT) == {"Name": "Gate", "Trig": "open"}
    assert tool.get(2, BASE, "Direction") == "output"
    assert tool.get_all(2, OUTPUT) == {
        "Name": "Lock", "Active": "open", "Button": "pulse", "PulseTime": 250, "Mode": "monostable",
        "DelayTime": 70,
    }  # fmt: skip
    settings = device.read_settings()
    assert "input_name=Gate\n" in settings and "output_name=Lock\n" in settings


def test_export_wins_over_settings_win_over_earlier_ones(device):
    group = "[in0]\ninput_name={}\ninput_activelow=false\n[in1]\ninput_name={}\ninput_activelow=false\n"
    device.conf(hwdesc(*(port(f"in{n}", n) for n in range(3))))
    device.write(EARLIER, group.format("earlier0", "earlier1") + "[in2]\ninput_name=earlier2\n")
    device.settings(group.format("stored0", "stored1"))
    device.write(EXPORT, "[IOPort.I1.Input]\nName=export1\n")
    device.start()
    names = [Tool(device).get(n, INPUT, "Name") for n in range(3)]
    assert names == ["stored0", "export1", "earlier2"]
    assert not device.path(EARLIER).exists()
    assert device.path(EXPORT).exists()


def test_earlier_settings_wait_for_an_export(device):
    device.conf(four_ports())
    device.write(EARLIER, "[in0]\ninput_name=earlier\ninput_activelow=true\n")
    device.start()
    assert device.path(EARLIER).exists()
    assert Tool(device).get(0, INPUT, "Name") == "Input 1"


def test_an_export_that_is_no_file(device):
    device.conf(four_ports())
    device.mkdir(EXPORT)
    device.write(EARLIER, "[in0]\ninput_name=earlier\ninput_activelow=true\n")
    device.start()
    assert device.path(EARLIER).exists()
    assert Tool(device).get(0, INPUT, "Name") == "Input 1"


def test_earlier_settings_that_cannot_be_read_stay(device):
    device.conf(four_ports())
    device.write(EXPORT, "")
    device.write(EARLIER, "no key file\n")
    device.start()
    assert device.path(EARLIER).exists()
    assert "Could not read key file: " in device.stderr()


def test_an_export_for_a_port_that_is_not_there(device):
    device.conf(four_ports())
    device.write(EXPORT, "[IOPort.I9.Input]\nName=nine\n[IOPort.I0.Input]\nName=zero\n")
    device.start()
    assert "No port 9 to write parhand data to.\n" in device.stderr()
    assert Tool(device).get(0, INPUT, "Name") == "Input 1"


@pytest.mark.parametrize("seed", range(5))
def test_exports_of_rubbish(device, seed):
    chance = random.Random(seed)
    groups = ("IOPort.I0", "IOPort.I2.Input", "IOPort.I2.Output", "IOPort.I1.Output", "Input", "XInput",
              "IOPort.Ix.Input", "IOPort.I99999999999999999999.Output", "IOPort.I-1.Output", "")  # fmt: skip
    keys = ("Name", "Trig", "Active", "Button", "PulseTime", "DelayTime", "Mode", "Direction")
    values = (b'"', b'"x', b"open", b"\xff\xfe", b"99999999999999999999", b"-1", b"", b"\\n\\", b"a;b")
    lines = []
    for _ in range(60):
        if chance.random() < 0.3:
            group = chance.choice(groups)
            lines.append(b"[" + group.encode() + b"]" if group else b"[a\xffInput]")
        else:
            lines.append(chance.choice(keys).encode() + b"=" + chance.choice(values))
    start = next(i for i, line in enumerate(lines) if line.startswith(b"["))
    device.conf(four_ports())
    device.write(EXPORT, "").write_bytes(b"\n".join(lines[start:]))
    device.start()
    tool = Tool(device)
    before = {(n, i): tool.get_all(n, i) for n in range(4) for i in tool.interfaces(n)}
    device.path(EXPORT).unlink()
    device.restart()
    assert {key: tool.get_all(*key) for key in before} == before
