"""The control interface, method by method, as its clients see it."""

import pytest
from gi.repository import Gio

from control import METHODS, ODD_NUMBERS, ERROR, expect_error, expect_no_port, numbered_calls
from harness import DBusError, Device, PortChanged, PortProps, hwdesc, port, wait_for
from harness.device import CONTROL, CONTROL_PATH, SETTINGS

IN, OUT, BOTH, VIRTUAL, HIDDEN, INTERNAL = range(6)


@pytest.fixture
def six(device) -> Device:
    """A running device with a port of each sort."""
    device.conf(
        hwdesc(
            port("in", IN),
            port("out", OUT, "output"),
            port("both", BOTH, "io_ctrl"),
            port("virtual", VIRTUAL, "output", "virtual", flags="ioport virtual"),
            port("hidden", HIDDEN, "output", "null", flags="ioport hidden"),
            port("internal", INTERNAL, "input", "virtual", flags="virtual"),
        )
    )
    return device.start()


def expect_save(device: Device) -> None:
    """Waits for the settings file, which the test removed before, to be written again."""
    wait_for(lambda: device.path(SETTINGS).exists(), "the save")


def introspect(device: Device) -> Gio.DBusInterfaceInfo:
    xml = device.bus.call(
        CONTROL, CONTROL_PATH, "org.freedesktop.DBus.Introspectable", "Introspect"
    )
    return Gio.DBusNodeInfo.new_for_xml(xml).lookup_interface(CONTROL)


def signature(arguments) -> str:
    return "".join(argument.signature for argument in arguments)


def test_introspection_shows_the_interface(six):
    interface = introspect(six)
    shown = [(m.name, signature(m.in_args), signature(m.out_args)) for m in interface.methods]
    assert shown == METHODS
    signals = {s.name: signature(s.args) for s in interface.signals}
    assert signals == {"PortChanged": "ibbbbbb", "ActionSequenceDone": "i"}
    assert not interface.properties


def test_introspection_names_the_arguments(six):
    interface = introspect(six)
    names = {m.name: [a.name for a in [*m.in_args, *m.out_args]] for m in interface.methods}
    assert names["SetActive"] == ["port", "input", "state"]
    assert names["GetPortProps"] == ["number", "properties"]
    assert names["StartActionSequence"] == ["port", "virtual", "seq"]
    changed = next(s for s in interface.signals if s.name == "PortChanged")
    assert [a.name for a in changed.args] == list(PortChanged._fields)


# Unknown ports


@pytest.mark.parametrize("number", [n for n in ODD_NUMBERS if n > INTERNAL])
def test_unknown_numbers(six, number):
    for call in numbered_calls(number):
        expect_no_port(six, *call)


def test_a_port_that_is_virtual_only_answers_to_set_virtual_alone(six):
    for call in numbered_calls(INTERNAL):
        if call[0] not in ("SetVirtual", "StartActionSequence"):
            expect_no_port(six, *call)
    with six.signals() as signals:
        six.call("SetVirtual", "ub", INTERNAL, True)
        assert signals.wait() == PortChanged(INTERNAL, True, False, True, True, True, False)


def test_a_port_with_neither_flag_is_listed_but_has_no_number(device):
    device.conf(hwdesc(port("plain", 3, flags="hidden"), port("other", 0)))
    device.start()
    assert [entry.id for entry in device.port_props()] == ["other", "plain"]
    assert device.call("GetNbrPorts") == (1, 0)
    for call in numbered_calls(3):
        expect_no_port(device, *call)


def test_the_port_declared_first_has_the_number(device):
    device.conf(
        hwdesc(
            port("plain", 3, "io_ctrl", flags="hidden"),
            port("first", 3, "output"),
            port("second", 3, "input"),
            port("last", 3, "io_ctrl"),
        )
    )
    device.start()
    assert device.call("GetDirection", "u", 3) == "output"
    assert device.call("IsConfigurable", "u", 3) is False


# Counting and listing


def test_counting_follows_the_direction(six):
    assert six.call("GetNbrPorts") == (2, 3)
    six.call("SetDirection", "us", BOTH, "output")
    assert six.call("GetNbrPorts") == (1, 4)


def test_listing_is_newest_first_and_whole(six):
    six.call("SetState", "ub", OUT, True)
    six.call("SetActive", "ubs", IN, True, "open")
    six.call("SetActive", "ubs", BOTH, False, "open")
    assert six.port_props() == [
        PortProps("internal", 5, False, True, False, False, {"virtual": True}),
        PortProps("hidden", 4, False, False, False, False, {"ioport": True, "hidden": True}),
        PortProps("virtual", 3, False, False, False, False, {"ioport": True, "virtual": True}),
        PortProps("both", 2, False, True, True, False, {"ioport": True}),
        PortProps("out", 1, True, False, False, False, {"ioport": True}),
        PortProps("in", 0, True, True, False, True, {"ioport": True}),
    ]


def test_listing_shows_the_side_in_use(six):
    six.call("SetActive", "ubs", BOTH, False, "open")
    six.call("SetDirection", "us", BOTH, "output")
    both = next(entry for entry in six.port_props() if entry.id == "both")
    assert (both.input, both.activelow) == (False, True)


def test_an_empty_device_lists_nothing(device):
    device.conf(hwdesc())
    device.start()
    assert device.call("GetPortProps") == (0, [])
    assert device.call("GetNbrPorts") == (0, 0)


# States


def test_an_output_is_switched_and_tells_once(six):
    with six.signals() as signals:
        six.call("SetState", "ub", OUT, True)
        assert six.call("GetState", "u", OUT) is True
        six.call("SetState", "ub", OUT, True)
        six.call("SetState", "ub", OUT, False)
        signals.wait(lambda change: not change.state)
        assert signals.received == [
            PortChanged(OUT, False, False, False, False, True, False),
            PortChanged(OUT, False, False, False, False, False, False),
        ]


@pytest.mark.parametrize("number", [IN, BOTH, VIRTUAL])
def test_inputs_and_virtual_ports_can_not_be_driven(six, number):
    six.path(SETTINGS).unlink()
    expect_error(six, "Not_output", "Port not output.", "SetState", "ub", number, True)
    # Saves happen in the order of the calls, so that this one would come after an earlier one.
    six.call("SetName", "ubs", OUT, False, "Marker")
    expect_save(six)
    assert "Marker" in six.read_settings()
    assert six.read_settings().count("[") == 1
    assert six.log_count("Set state on incorrect port") == 1


def test_a_null_output_takes_every_state_and_stays_inactive(six):
    six.call("SetState", "ub", HIDDEN, True)
    assert six.call("GetState", "u", HIDDEN) is False


def test_setting_a_state_saves(six):
    six.path(SETTINGS).unlink()
    six.call("SetState", "ub", OUT, True)
    expect_save(six)


def test_a_virtual_change_of_a_virtual_output_sets_it(six):
    with six.signals() as signals:
        six.call("SetVirtual", "ub", VIRTUAL, True)
        assert signals.wait() == PortChanged(VIRTUAL, True, False, False, True, True, False)
    assert six.call("GetState", "u", VIRTUAL) is True


def test_a_virtual_change_of_a_real_port_leaves_it_alone(six):
    with six.signals() as signals:
        six.call("SetVirtual", "ub", OUT, True)
        six.call("SetVirtual", "ub", IN, True)
        signals.wait_count(2)
        changes = [(change.port, change.virtual_trig, change.state) for change in signals.received]
    assert changes == [(OUT, True, True), (IN, True, True)]
    assert six.call("GetState", "u", OUT) is False
    assert six.call("GetState", "u", IN) is False


def test_a_virtual_change_saves(six):
    six.path(SETTINGS).unlink()
    six.call("SetVirtual", "ub", VIRTUAL, True)
    expect_save(six)


def test_the_signal_carries_the_flags(six):
    with six.signals() as signals:
        six.call("SetVirtual", "ub", HIDDEN, True)
        assert signals.wait() == PortChanged(HIDDEN, False, True, False, True, True, False)


# Directions


def test_directions(six):
    numbers = (IN, OUT, BOTH)
    directions = [six.call("GetDirection", "u", number) for number in numbers]
    assert directions == ["input", "output", "input"]
    assert [six.call("IsConfigurable", "u", number) for number in numbers] == [False, False, True]


def test_turning_a_configurable_port_round(six):
    with six.signals() as signals:
        six.call("SetDirection", "us", BOTH, "output")
        assert signals.wait() == PortChanged(BOTH, False, False, False, False, False, False)
    assert six.call("GetDirection", "u", BOTH) == "output"
    six.call("SetState", "ub", BOTH, True)
    assert six.call("GetState", "u", BOTH) is True
    six.call("SetDirection", "us", BOTH, "input")
    expect_error(six, "Not_output", "Port not output.", "SetState", "ub", BOTH, False)


@pytest.mark.parametrize("number", [IN, OUT])
@pytest.mark.parametrize("direction", ["input", "output"])
def test_fixed_directions_are_refused_and_saved(six, number, direction):
    six.path(SETTINGS).unlink()
    expect_error(
        six, "Not_configurable", "Port not configurable.", "SetDirection", "us", number, direction
    )
    expect_save(six)


@pytest.mark.parametrize("word", ["Input", "", "OUTPUT", "in", "input "])
def test_other_words_for_a_direction_are_refused_and_saved(six, word):
    six.path(SETTINGS).unlink()
    message = "Incorrect input to set_direction eiter use 'input' or 'output'"
    expect_error(six, "Generic", message, "SetDirection", "us", BOTH, word)
    expect_save(six)
    assert six.call("GetDirection", "u", BOTH) == "input"


# Active levels


def test_active_levels_in_words(six):
    assert six.call("GetActive", "u", BOTH) == ("closed", "closed")
    six.call("SetActive", "ubs", BOTH, True, "open")
    assert six.call("GetActive", "u", BOTH) == ("open", "closed")
    six.call("SetActive", "ubs", BOTH, False, "open")
    assert six.call("GetActive", "u", BOTH) == ("open", "open")
    six.call("SetActive", "ubs", BOTH, True, "closed")
    assert six.call("GetActive", "u", BOTH) == ("closed", "open")


def test_setting_an_active_level_saves(six):
    six.path(SETTINGS).unlink()
    six.call("SetActive", "ubs", IN, True, "open")
    expect_save(six)
    assert "input_activelow=true" in six.read_settings()


@pytest.mark.parametrize("number, side", [(IN, False), (OUT, True)])
@pytest.mark.parametrize("word", ["open", "closed"])
def test_the_other_sides_level_is_refused_and_saved(six, number, side, word):
    six.path(SETTINGS).unlink()
    message = f"Could not set port to {word}."
    expect_error(six, "Generic", message, "SetActive", "ubs", number, side, word)
    expect_save(six)


@pytest.mark.parametrize("word", ["Open", "", "low", "closed "])
def test_other_words_for_a_level_are_refused_and_saved(six, word):
    six.path(SETTINGS).unlink()
    message = "Incorrect input to set_active eiter use 'open' or 'closed'"
    expect_error(six, "Generic", message, "SetActive", "ubs", BOTH, True, word)
    expect_save(six)


def test_an_inputs_state_turns_with_its_level(six):
    with six.signals() as signals:
        six.call("SetActive", "ubs", IN, True, "open")
        assert six.call("GetState", "u", IN) is True
        six.call("SetActive", "ubs", IN, True, "open")
        six.call("SetActive", "ubs", IN, True, "closed")
        signals.wait(lambda change: not change.state)
        assert [(change.state, change.activelow) for change in signals.received] == [
            (True, True),
            (False, False),
        ]


@pytest.mark.parametrize("state", [False, True])
def test_an_outputs_state_stays_when_its_level_turns(six, state):
    six.call("SetState", "ub", OUT, state)
    for word in ("open", "closed", "closed", "open"):
        six.call("SetActive", "ubs", OUT, False, word)
        assert six.call("GetState", "u", OUT) is state
    six.call("SetState", "ub", OUT, not state)
    assert six.call("GetState", "u", OUT) is not state


# Names


def test_names_belong_to_the_sides_that_a_port_has(six):
    assert six.call("GetNames", "u", IN) == ("Input 1", "")
    assert six.call("GetNames", "u", OUT) == ("", "Output 1")
    assert six.call("GetNames", "u", BOTH) == ("Input 2", "Output 2")


def test_default_names_count_each_side(device):
    device.conf(
        hwdesc(
            port("a", 0),
            port("b", 1, "io_ctrl"),
            port("c", 2),
            port("pir_detector", 3),
            port("d", 4, names={"input": "Window"}),
            port("e", 5),
        )
    )
    device.start()
    names = [device.call("GetNames", "u", number) for number in range(6)]
    assert names == [
        ("Input 1", ""),
        ("Input 2", "Output 1"),
        ("Input 3", ""),
        ("PIR sensor", ""),
        ("Window", ""),
        ("Input 6", ""),
    ]


def test_default_names_end_at_the_number_of_ports(device):
    device.conf(hwdesc(port("a", 0), port("b", 1), port("c", 5)))
    device.start()
    assert [device.call("GetNames", "u", number) for number in (0, 1, 5)] == [
        ("Input 1", ""),
        ("Input 2", ""),
        ("", ""),
    ]


@pytest.mark.parametrize("number, side, word", [(OUT, True, "input"), (IN, False, "output")])
def test_a_name_for_the_other_side_is_refused_and_not_saved(six, number, side, word):
    six.path(SETTINGS).unlink()
    message = f"Could not set {word} name for the port."
    expect_error(six, "Generic", message, "SetName", "ubs", number, side, "x")
    six.call("SetName", "ubs", BOTH, True, "Marker")
    expect_save(six)
    assert six.read_settings().count("[") == 1 and "Marker" in six.read_settings()


@pytest.mark.parametrize(
    "name", ["Gate", "", "Tür 7 \N{DOOR}", " lead and trail ", "a;b=c#d", "\n[x]\n"]
)
def test_names_are_kept_as_given(six, name):
    six.call("SetName", "ubs", BOTH, True, name)
    six.call("SetName", "ubs", BOTH, True, name)
    six.call("SetName", "ubs", BOTH, False, name + "!")
    assert six.call("GetNames", "u", BOTH) == (name, name + "!")


# Sequences


def test_an_empty_sequence_is_refused(six):
    for number in (IN, OUT, BOTH, VIRTUAL):
        with pytest.raises(DBusError) as caught:
            six.call("StartActionSequence", "uba(bi)", number, False, [])
        assert caught.value.name == ERROR + "Generic"


def test_a_real_sequence_on_an_input_is_refused(six):
    call = ("StartActionSequence", "uba(bi)", IN, False, [(True, 10)])
    expect_error(six, "Not_output", "Port not output.", *call)


# Dropping and refreshing


@pytest.fixture
def optional(device) -> Device:
    """A running device with an optional port on each backend, and some that are not optional."""
    device.write("/run/flag", "1\n")
    flag = {"path": "/run/flag", "timeout": "20"}
    device.conf(
        hwdesc(
            port("fixed", 0, "output"),
            port("check", 1, "output", optional=True),
            port("virtual", 2, "output", "virtual", optional=True),
            port("null", 3, "output", "null", optional=True),
            port("sysfs", 4, backend="sysfs", device=flag, optional=True),
            port("second_output", 5, "output"),
        )
    )
    return device.start()


OPTIONAL = ["check", "virtual", "null", "sysfs"]


def test_dropping_what_can_not_be_dropped(optional):
    assert optional.call("DropIOPorts", "as", ["x", "", "fixed", "second_output"]) == []
    assert optional.call("DropIOPorts", "as", []) == []
    assert len(optional.port_props()) == 6


def test_dropped_ports_are_gone(optional):
    assert optional.call("DropIOPorts", "as", ["x", "sysfs", "fixed", "check", "check"]) == [
        "sysfs",
        "check",
    ]
    assert [entry.id for entry in optional.port_props()] == [
        "second_output", "null", "virtual", "fixed",
    ]  # fmt: skip
    assert optional.call("GetNbrPorts") == (0, 4)
    for number in (1, 4):
        for call in numbered_calls(number):
            expect_no_port(optional, *call)
    assert optional.call("DropIOPorts", "as", ["check"]) == []


def test_refreshed_ports_work_again(optional):
    wait_for(lambda: optional.call("GetState", "u", 4), "the first poll")
    assert optional.call("DropIOPorts", "as", OPTIONAL) == OPTIONAL
    optional.call("RefreshIOPorts")
    assert {entry.id for entry in optional.port_props()} == {*OPTIONAL, "fixed", "second_output"}
    optional.call("SetState", "ub", 1, True)
    assert optional.call("GetState", "u", 1) is True
    optional.call("SetVirtual", "ub", 2, True)
    assert optional.call("GetState", "u", 2) is True
    wait_for(lambda: optional.call("GetState", "u", 4), "the poll after the refresh")
    with optional.signals() as signals:
        optional.write("/run/flag", "0\n")
        assert signals.wait(lambda change: change.port == 4).state is False


def test_names_survive_a_drop(optional):
    optional.call("SetName", "ubs", 1, False, "Pump")
    optional.call("DropIOPorts", "as", ["check"])
    optional.call("RefreshIOPorts")
    assert optional.call("GetNames", "u", 1) == ("", "Pump")


def test_an_optional_port_waits_for_its_hardware(device):
    module = {"path": "/run/module", "timeout": "20"}
    device.conf(
        hwdesc(port("module", 0, backend="sysfs", device=module, optional=True), port("a", 1))
    )
    device.start()
    assert [entry.id for entry in device.port_props()] == ["a"]
    assert device.log_count("Failed to open") == 0
    device.call("RefreshIOPorts")
    expect_no_port(device, "GetState", "u", 0)
    device.write("/run/module", "1\n")
    with device.signals() as signals:
        device.call("RefreshIOPorts")
        assert signals.wait(lambda change: change.port == 0).state is True
    assert [entry.id for entry in device.port_props()] == ["module", "a"]


def test_an_optional_port_whose_setup_fails_stays_away(device):
    failing = {"setup": "fail"}
    device.conf(hwdesc(port("fails", 0, optional=True, device=failing), port("a", 1)))
    device.start()
    device.call("RefreshIOPorts")
    assert [entry.id for entry in device.port_props()] == ["a"]


def test_a_port_whose_setup_fails_is_listed_but_dead(device):
    device.conf(
        hwdesc(
            port("fails", 0, "output", device={"setup": "fail"}),
            port("works", 1, "output", device={"setup": "FAIL"}, optional=True),
        )
    )
    device.start()
    assert [entry.id for entry in device.port_props()] == ["works", "fails"]
    expect_error(device, "Not_output", "Port not output.", "SetState", "ub", 0, True)
    assert device.call("GetState", "u", 0) is False
    device.call("SetState", "ub", 1, True)
    assert device.call("GetState", "u", 1) is True


def test_optional_is_true_in_lower_case_only(device):
    text = port("a", 0, optional=True).replace('optional="true"', 'optional="TRUE"')
    device.conf(hwdesc(text))
    device.start()
    assert device.call("DropIOPorts", "as", ["a"]) == []
