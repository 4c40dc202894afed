"""Ports on GPIO lines, by what the daemon writes to the kernel's files. Edges need a real kernel."""

import pytest

from control import call_everything
from gpio_tree import GpioTree, device_on_lines
from harness import Device, DBusError, hwdesc, port, wait_for

INPUT, OUTPUT, CONTROL = 11, 12, 13
COULD_NOT_SET = "Failed to set state on port!"
COULD_NOT_TURN = "Couldn't change direction on port!"

# What the set-up of each kind of port writes when its lines were exported before.
INPUT_WRITES = ("gpio11/direction in", "gpio11/edge both", "gpio11/active_low 0")
LOW_OUTPUT_WRITES = ("gpio12/direction low", "gpio12/active_low 0")


def gpio(kind: str, optional: bool = False, number: int = 0, **sections: str) -> str:
    """A port whose backend sections have these attributes, as text."""
    elements = "".join(f"<{name} {text}/>" for name, text in sections.items())
    backend = f'<backend name="gpio">{elements}</backend>'
    return port("terminal", number, kind, backend=None, extra=backend, optional=optional)


def configurable(**other: str) -> str:
    sections = {"input": 'pin="11"', "output": 'pin="12"', "io_ctrl": 'pin="13"'}
    return gpio("io_ctrl", **{**sections, **other})


device = pytest.fixture(device_on_lines)


@pytest.fixture
def lines(tree) -> GpioTree:
    """The three lines that most tests use, exported already."""
    for number in (INPUT, OUTPUT, CONTROL):
        tree.line(number)
    return tree


def start(device: Device, *ports: str) -> Device:
    device.conf(hwdesc(*ports))
    return device.start()


def state(device: Device) -> bool:
    return device.call("GetState", "u", 0)


# Set-up


def test_an_input_is_an_input_before_its_edges_and_its_sense(device, lines):
    start(device, gpio("input", input='pin="11"'))
    lines.wait(*INPUT_WRITES)


def test_an_output_gets_direction_and_level_in_one_step_and_then_its_sense(device, lines):
    start(device, gpio("output", output='pin="12"'))
    lines.wait(*LOW_OUTPUT_WRITES)


def test_an_active_low_output_comes_up_inactive_again(device, lines):
    start(device, gpio("output", output='pin="12"'))
    device.call("SetActive", "ubs", 0, False, "open")
    device.stop()
    lines.take()
    device.start()
    lines.wait("gpio12/direction high", "gpio12/active_low 0")
    lines.set_value(OUTPUT, 1)  # what the kernel shows for a high line
    assert state(device) is False


def test_an_active_low_output_on_an_inverted_line_comes_up_low(device, lines):
    start(device, gpio("output", output='pin="12" inverted="true"'))
    device.call("SetActive", "ubs", 0, False, "open")
    device.stop()
    lines.take()
    device.start()
    lines.wait("gpio12/direction low", "gpio12/active_low 1")


def test_a_configurable_input_has_its_output_and_its_driver_low(device, lines):
    start(device, configurable())
    lines.wait(
        *INPUT_WRITES, *LOW_OUTPUT_WRITES, "gpio13/direction low", "gpio13/active_low 0"
    )  # fmt: skip


def test_a_configurable_output_comes_up_with_its_driver_high(device, lines):
    start(device, configurable())
    device.call("SetDirection", "us", 0, "output")
    device.stop()
    lines.take()
    device.start()
    lines.wait(
        *INPUT_WRITES, *LOW_OUTPUT_WRITES, "gpio13/direction high", "gpio13/active_low 0"
    )  # fmt: skip


# Exporting


def test_a_fresh_line_is_exported_and_set_up_as_soon_as_it_appears(device, tree):
    tree.line(OUTPUT, exported=False)
    start(device, gpio("output", output='pin="12"'))
    tree.wait("export 12", *LOW_OUTPUT_WRITES)


def test_a_fresh_line_is_given_back_at_the_end(device, tree):
    tree.line(OUTPUT, exported=False)
    start(device, gpio("output", output='pin="12"'))
    device.stop()
    assert tree.take() == ["export 12", *LOW_OUTPUT_WRITES, "unexport 12"]


def test_a_line_exported_before_is_not_given_back(device, lines):
    start(device, gpio("output", output='pin="12"'))
    device.stop()
    assert lines.take() == list(LOW_OUTPUT_WRITES)


# Levels


def test_an_input_reads_its_line(device, lines):
    start(device, gpio("input", input='pin="11"'))
    for level in (0, 1, 0):
        lines.set_value(INPUT, level)
        assert state(device) is bool(level)


def test_an_output_is_driven_and_reported(device, lines):
    start(device, gpio("output", output='pin="12"'))
    lines.wait(*LOW_OUTPUT_WRITES)
    with device.signals() as signals:
        for active in (True, False):
            device.call("SetState", "ub", 0, active)
            lines.wait(f"gpio12/value {int(active)}")
            assert state(device) is active
        assert [change.state for change in signals.wait_count(2)] == [True, False]


def test_an_active_low_output_keeps_its_state_when_its_line_flips(device, lines):
    start(device, gpio("output", output='pin="12"'))
    lines.wait(*LOW_OUTPUT_WRITES)
    device.call("SetActive", "ubs", 0, False, "open")
    lines.wait("gpio12/value 1")
    assert state(device) is False
    device.call("SetState", "ub", 0, True)
    lines.wait("gpio12/value 0")


def test_a_sequence_drives_the_line(device, lines):
    start(device, gpio("output", output='pin="12"'))
    lines.wait(*LOW_OUTPUT_WRITES)
    with device.signals("ActionSequenceDone") as done:
        device.call("StartActionSequence", "uba(bi)", 0, False, [(True, 20), (False, 20), (True, 0)])
        done.wait()
    assert len(lines.take()) == 3
    assert lines.read(OUTPUT, "value") == "1\n"


# Direction


def test_becoming_an_output_turns_the_driver_on_before_the_inactive_level(device, lines):
    start(device, configurable())
    lines.take()
    device.call("SetDirection", "us", 0, "output")
    lines.wait("gpio13/value 1", "gpio12/value 0")


def test_becoming_an_active_low_output_starts_at_high_level(device, lines):
    start(device, configurable())
    device.call("SetActive", "ubs", 0, False, "open")
    lines.take()
    device.call("SetDirection", "us", 0, "output")
    lines.wait("gpio13/value 1", "gpio12/value 1")
    assert state(device) is False


def test_becoming_an_input_turns_the_output_off_before_the_driver(device, lines):
    start(device, configurable())
    device.call("SetDirection", "us", 0, "output")
    device.call("SetState", "ub", 0, True)
    lines.take()
    device.call("SetDirection", "us", 0, "input")
    lines.wait("gpio12/value 0", "gpio13/value 0")


def test_a_configurable_port_reads_the_line_of_its_direction(device, lines):
    start(device, configurable())
    lines.set_value(INPUT, 1)
    assert state(device) is True
    device.call("SetDirection", "us", 0, "output")
    assert state(device) is False
    device.call("SetDirection", "us", 0, "input")
    assert state(device) is True


def test_any_number_of_directions_and_announcements_takes_no_more_descriptors(device, lines):
    def turn_and_announce() -> None:
        device.call("SetDirection", "us", 0, "output")
        device.call("SetDirection", "us", 0, "input")
        device.call("RefreshIOPorts")

    start(device, configurable())
    turn_and_announce()  # what is made once is there from now on
    before = sorted(device.descriptors_at_rest())
    for _ in range(20):
        turn_and_announce()
    wait_for(lambda: sorted(device.descriptors()) == before, "what storing opens to be closed")


# Lines that can't be had


@pytest.mark.parametrize("what", ["no sysfs", "export refused", "no value", "no direction"])
def test_ports_without_their_lines_live_on(make_device, tree, what):
    if what == "no value":
        for number in (INPUT, OUTPUT, CONTROL):
            tree.line(number, value=None)
    elif what == "no direction":
        for number in (INPUT, OUTPUT, CONTROL):
            tree.line(number, direction=None)
    else:
        (tree.gpio / "export").unlink()
        if what == "export refused":
            (tree.gpio / "export").mkdir()
    device = make_device(binds={"/sys": tree.sys})
    start(device, configurable())
    message = "Failed to open pin fd!" if what == "no value" else "Failed to allocate pin 1"
    assert device.log_count(message) == 3
    assert state(device) is True
    device.call("SetDirection", "us", 0, "output")
    device.wait_log(COULD_NOT_TURN)
    device.call("SetState", "ub", 0, True)
    device.wait_log(COULD_NOT_SET, 2)
    call_everything(device, numbers=(0,))


def test_a_document_that_forgets_the_lines(device, tree):
    start(device, gpio("io_ctrl"))
    assert device.log_count("Port terminal has no") == 3
    call_everything(device, numbers=(0,))


# Optional ports


def test_an_optional_port_gives_its_lines_back_and_takes_them_again(device, lines):
    start(device, configurable(optional=True))
    before = sorted(device.descriptors())
    assert device.call("DropIOPorts", "as", ["terminal"]) == ["terminal"]
    assert not any("/gpio1" in target for target in device.descriptors())
    with pytest.raises(DBusError):
        state(device)
    lines.take()
    for number in (INPUT, OUTPUT, CONTROL):
        for file in (lines.gpio / f"gpio{number}").iterdir():
            file.chmod(0o666)
    device.call("RefreshIOPorts")
    assert state(device) is False
    assert sorted(device.descriptors()) == before
    lines.wait(
        *INPUT_WRITES, *LOW_OUTPUT_WRITES, "gpio13/direction low", "gpio13/active_low 0"
    )  # fmt: skip
