"""Supervised inputs whose line is measured through an SPI converter."""

import os
import pytest

from converters import (
    IO_CTRL,
    OUTPUT,
    SIO_CTRL,
    Converters,
    come_back_fifty_times,
    expect_supervised_error,
    range_element,
    readout,
    start,
    supervise,
    supervised,
    supervised_port,
    wait_readout,
)
from gpio_tree import device_on_lines
from harness import wait_for

RANGES = (
    range_element("closed", 0x100, 0x1FF)
    + range_element("open", 0x200, 0x2FF)
    + range_element("cut", 0xA00, 0xFFF)
)
LOST = ("Error: ", "Readout failed: ")


device = pytest.fixture(device_on_lines)


@pytest.fixture
def converters(converters) -> Converters:
    converters.spidev()
    converters.answer(0)
    return converters


def spi(elements: str = RANGES, **options) -> str:
    device = '<device path="/run/converters/spidev0"/><address value="1f"/>'
    return supervised_port("spi", f"{device}{elements}", **options)


def test_the_speed_is_set_when_given(device, converters):
    start(device, spi('<speed value="0x1000"/>'))
    assert converters.spi_calls() == ["bits 8", "speed 4096"]


def test_changes_of_the_line_are_signalled(device, converters):
    start(device, spi())
    converters.answer(0x150)
    with device.signals() as signals:
        supervise(device)
        signals.wait(lambda change: change.state)
        signals.take()
        converters.answer(0x250)
        assert signals.wait().state is False
        converters.answer(0xA00)
        signals.wait(lambda change: change.state)


def test_the_control_pins_follow_supervision_and_direction(device, converters):
    start(device, spi(kind="io_ctrl"))
    assert converters.control_pins() == "10"
    supervise(device)
    assert converters.control_pins() == "01"
    device.call("SetDirection", "us", 0, "output")
    assert converters.control_pins() == "00"
    supervise(device, False)
    assert converters.control_pins() == "10"
    assert device.call("GetDirection", "u", 0) == "input"


def test_switching_an_output_to_supervision_makes_it_an_input(device, converters, tree):
    start(device, spi(kind="io_ctrl"))
    device.call("SetDirection", "us", 0, "output")
    device.call("SetState", "ub", 0, True)
    assert tree.read(OUTPUT, "value")[0] == "1"
    tree.take()
    supervise(device)
    assert device.call("GetDirection", "u", 0) == "input"
    # Some pins are driven more than once, never to anything else.
    assert list(dict.fromkeys(record for record in tree.take() if "/value" in record)) == [
        f"gpio{OUTPUT}/value 0",
        f"gpio{IO_CTRL}/value 0",
        f"gpio{SIO_CTRL}/value 1",
    ]


def test_a_stored_supervision_is_watched_from_the_start(device, converters):
    converters.answer(0x150)
    device.settings(
        "[line0]\ninput_name=Door\ninput_activelow=false\n"
        "supervised_input_ranges=[('closed', uint32 256, uint32 511)]\nsupervised_input=true\n"
    )
    start(device, spi())
    assert converters.control_pins() == "01"
    wait_for(lambda: len(converters.spi_calls()) > 1, "the watch")
    assert supervised(device, "GetSupervised", "u", 0) is True


def test_one_failed_transfer_costs_the_device_until_it_is_refreshed(device, converters):
    for text in LOST:
        device.allow_critical(text)
    start(device, spi(optional=True))
    converters.answer(0x150)
    supervise(device)
    wait_readout(device, "closed", 0x150)
    converters.fail(5)
    device.wait_log("Readout failed: Input/output error")
    converters.answer(0x150)
    expect_supervised_error(
        device, "Error.Generic", "Bad file descriptor", "GetSupervisedReadout", "u", 0
    )
    device.wait_log("Readout failed: Bad file descriptor", 2)
    assert device.call("DropIOPorts", "as", ["line0"]) == ["line0"]
    device.call("RefreshIOPorts")
    wait_readout(device, "closed", 0x150)


def test_ranges_change_while_a_sequence_sends_the_state_of_the_line(device, converters):
    event = '<event declaration="com.kelv.Event.Pcd.SupervisedPort" supervised_input="true"/>'
    start(device, spi(event=event))
    converters.answer(0x150)
    supervise(device)
    for _round in range(3):
        with device.signals("ActionSequenceDone") as done:
            steps = [(index % 2 == 0, 0) for index in range(3000)]
            device.call("StartActionSequence", "uba(bi)", 0, True, steps)
            for state in ("open", "closed", "cut") * 30:
                supervised(device, "SetSupervisedRanges", "usuu", 0, state, 0x100, 0x1FF)
            done.wait(timeout=30)
    assert readout(device) == ("cut", 0x150)


def test_a_missing_device_parks_an_optional_port_until_it_is_there(device, converters):
    device.allow_critical("Failed to open")
    node = converters.folder / "spidev0"
    node.unlink()
    start(device, spi(optional=True))
    assert device.port_props() == []
    converters.spidev()
    converters.answer(0x150)
    device.call("RefreshIOPorts")
    assert readout(device) == ("closed", 0x150)


def test_a_dropped_port_closes_its_device_and_comes_back_fifty_times(device, converters):
    def come_back(level: int) -> None:
        device.call("RefreshIOPorts")
        converters.answer(level)

    start(device, spi(optional=True))
    supervised(device, "SetSupervisedRanges", "usuu", 0, "short", 0x10, 0x20)
    supervise(device)
    come_back_fifty_times(device, converters, come_back, first=0x100)
    assert converters.control_pins() == "01"
    assert ("short", 0x10, 0x20) in supervised(device, "GetSupervisedRanges", "u", 0)
    reads = len(converters.spi_calls())
    wait_for(lambda: len(converters.spi_calls()) > reads, "the watch")


def test_a_pipe_in_place_of_a_device_does_not_hold_the_start(device, converters):
    os.mkfifo(device.mkdir("/run/pipes") / "spidev")
    start(device, supervised_port("spi", '<device path="/run/pipes/spidev"/>'))
    assert "/run/pipes/spidev" in device.descriptors()
