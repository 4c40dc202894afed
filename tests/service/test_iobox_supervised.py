"""Supervised inputs of an external I/O box, which judges their lines by itself."""

import pytest

from converters import (
    SUPERVISED, SUPERVISED_PATH, expect_supervised_error, readout, supervise, supervised,
)  # fmt: skip
from harness import Device, hwdesc, port, wait_for
from neighbours import IoBox, neighbourhood_fixture
from producer import Producer

neighbourhood = pytest.fixture(neighbourhood_fixture)

INPUT, EITHER = 1, 3
EVENT = (
    '<event declaration="com.kelv.Event.Pcd.SupervisedPort" input="false" output="false"'
    ' supervised_input="true"/>'
)


@pytest.fixture
def device(make_device) -> Device:
    device = make_device()
    device.conf(hwdesc(
        port("input", INPUT, backend="iobox", extra=EVENT),
        port("either", EITHER, kind="io_ctrl", backend="iobox"),
    ))  # fmt: skip
    return device


@pytest.fixture
def box(device, neighbourhood) -> IoBox:
    box = IoBox(neighbourhood, device)
    device.start()
    device.wait_name("com.kelv.IOSupervised.Supervised")
    return box


def report(device: Device, box: IoBox, word: str) -> bool:
    """The state that the port is said to have, once it follows the report."""
    with device.signals() as changes:
        box.report(INPUT, word)
        return changes.wait(lambda change: change.port == INPUT).state


def test_supervision_is_told_to_the_box_and_lets_the_states_of_the_line_through(device, box):
    report(device, box, "cut")
    assert readout(device, INPUT) == ("open", 0)
    supervise(device, number=INPUT)
    assert box.modes() == [(INPUT, 0, "supervised_in")]
    assert readout(device, INPUT) == ("cut", 0)
    assert supervised(device, "GetSupervised", "u", INPUT) is True
    assert "supervised_input=true" in device.read_settings()
    supervise(device, on=False, number=INPUT)
    assert box.modes() == [(INPUT, 0, "supervised_in"), (INPUT, 0, "in")]
    assert readout(device, INPUT) == ("open", 0)
    assert "supervised_input=true" not in device.read_settings()


def test_supervision_that_is_on_already_is_not_told_again(device, box):
    supervise(device, number=INPUT)
    supervise(device, number=INPUT)
    assert box.modes() == [(INPUT, 0, "supervised_in")]


def test_supervision_of_an_output_waits_until_it_is_an_input(device, box):
    device.call("SetDirection", "us", EITHER, "output")
    supervise(device, number=EITHER)
    assert {mode for _port, _level, mode in box.modes()} == {"out"}
    device.call("SetDirection", "us", EITHER, "input")
    assert box.modes()[-1] == (EITHER, 0, "supervised_in")


@pytest.mark.parametrize("word, active", [("short", False), ("cut", False), ("closed", True)])
def test_each_state_of_the_line_is_read_without_a_level(device, box, word, active):
    supervise(device, number=INPUT)
    assert report(device, box, word) is active
    assert readout(device, INPUT) == (word, 0)
    assert report(device, box, "open") is False
    assert readout(device, INPUT) == ("open", 0)


def test_an_unlisted_word_is_the_undefined_state(device, box):
    supervise(device, number=INPUT)
    report(device, box, "cut")
    with Producer(device).signals("Sent") as sent:
        assert report(device, box, "ajar") is False
        _id, event = sent.wait()
    assert readout(device, INPUT) == ("undefined", 0)
    assert (event["state"], event["tampered"]) == ("undefined", False)
    assert device.log_count("Unrecognized iobox supervised state: ajar") == 1


def test_ranges_are_kept_and_not_told_to_the_box(device, box):
    before = len(box.modes())
    supervised(device, "SetSupervisedRanges", "usuu", INPUT, "cut", 10, 20)
    supervised(device, "SetSupervisedRanges", "usuu", INPUT, "open", 1, 5)
    supervised(device, "SetSupervisedRanges", "usuu", INPUT, "cut", 30, 40)
    kept = [("open", 1, 5), ("cut", 30, 40)]
    assert supervised(device, "GetSupervisedRanges", "u", INPUT) == kept
    assert len(box.modes()) == before
    wait_for(
        lambda: "[('open', uint32 1, uint32 5), ('cut', 30, 40)]" in device.read_settings(),
        "the ranges to be stored",
    )


def test_ranges_do_not_judge_the_line(device, box):
    supervised(device, "SetSupervisedRanges", "usuu", INPUT, "short", 0, 4095)
    supervise(device, number=INPUT)
    report(device, box, "closed")
    assert readout(device, INPUT) == ("closed", 0)


def test_an_invalid_range_changes_nothing(device, box):
    supervised(device, "SetSupervisedRanges", "usuu", INPUT, "cut", 10, 20)
    for state, lower, upper, reason in (
        ("cut", 20, 10, "Invalid range."), ("ajar", 1, 2, "State is undefined."),
    ):  # fmt: skip
        expect_supervised_error(
            device, "Bad_supervised_range", reason,
            "SetSupervisedRanges", "usuu", INPUT, state, lower, upper,
        )  # fmt: skip
    assert supervised(device, "GetSupervisedRanges", "u", INPUT) == [("cut", 10, 20)]


def test_supervision_is_stored_though_the_port_is_dropped_before_the_box_answers(
    make_device, neighbourhood
):
    device = make_device()
    device.conf(hwdesc(port("loop", INPUT, backend="iobox", optional=True)))
    box = IoBox(neighbourhood, device)
    device.start()
    device.wait_name(SUPERVISED)
    box.service.hang()
    asked = device.bus.begin_call(
        SUPERVISED, SUPERVISED_PATH, SUPERVISED, "SetSupervised", "ub", INPUT, True
    )
    assert device.call("DropIOPorts", "as", ["loop"]) == ["loop"]
    box.service.resume()
    asked.result()
    assert "supervised_input=true" in device.read_settings()
