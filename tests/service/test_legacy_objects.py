"""The objects of the ports, as older configuration tools read and set them."""

import random
from typing import Any

import pytest
from gi.repository import Gio, GLib

from harness import DBusError, hwdesc, port
from legacy_tool import (
    BASE,
    INPUT,
    INVALID,
    NO_PORT,
    NUMBERS,
    OUTPUT,
    PATH,
    PROPERTIES,
    READABLE,
    SERVICE,
    WRITABLE,
    Tool,
    count_of_ports,
    fails,
    four_ports,
    saved_groups,
    saves,
    settle,
    text,
    tool_fixture,
)

tool = pytest.fixture(tool_fixture)


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
    settle(tool)
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
    with saved_groups(tool) as saved:
        assert fails(INVALID, tool.set, 2, BASE, "Direction", "Input") == "Bad Direction 'Input'"
        tool.device.wait_log("Undefined input: Input, for property: Direction")
    assert not saved


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
    with saved_groups(tool) as saved:
        for request in ((2, INPUT, "Trig", "x"), (2, OUTPUT, "Active", "x"), (1, OUTPUT, "Mode", "x"),
                        (0, BASE, "Direction", "output"), (2, BASE, "Direction", "x")):  # fmt: skip
            fails(INVALID, tool.set, *request)
    assert not saved


def test_settings_outlive_a_restart(tool):
    tool.set(2, BASE, "Direction", "output")
    tool.set(2, OUTPUT, "Name", "Lock")
    tool.set(2, OUTPUT, "DelayTime", -1)
    tool.set(2, OUTPUT, "PulseTime", -1)
    settle(tool)
    assert "delay_time=18446744073709551615" in tool.device.read_settings()
    assert "pulse_time=4294967295" in tool.device.read_settings()
    before = tool.get_all(2, OUTPUT)
    tool.device.restart()
    assert tool.get(2, BASE, "Direction") == "output"
    assert tool.get_all(2, OUTPUT) == before
    assert (before["Name"], before["DelayTime"], before["PulseTime"]) == ("Lock", -1, -1)


@pytest.mark.parametrize("number", range(4))
def test_byte_strings_that_are_no_text(tool, number):
    with saved_groups(tool) as saved:
        before = {i: tool.get_all(number, i) for i in tool.interfaces(number)}
        for interface in tool.interfaces(number):
            for name in set(WRITABLE[interface]) - set(NUMBERS):
                for raw in (b"", b"open", b"output", b"pulse", b"\xff\xfe\0", b"Caf\xe9\0", b"\xc0\x80\0"):
                    message = fails(INVALID, tool.set_variant, number, interface, name, text(raw))
                    expected = "Bad Direction ''" if name == "Direction" else f"Incorrect value for {name}"
                    assert message == expected
        assert {i: tool.get_all(number, i) for i in tool.interfaces(number)} == before
    assert not saved


def test_wrong_types(tool):
    with saved_groups(tool) as saved:
        before = {(n, i): tool.get_all(n, i) for n in range(4) for i in tool.interfaces(n)}
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
    assert not saved


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
