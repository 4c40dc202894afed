"""The supervised event as any service sees it, from ports that are really measured."""

from typing import Any

import pytest

from converters import (
    Converters,
    range_element,
    start,
    supervise,
    supervised_port,
)
from gpio_tree import device_on_lines
from harness import Signals, wait_for
from producer import SUPERVISED as EVENT
from producer import Producer

RANGES = "".join(
    range_element(state, lower, lower + 0xFF)
    for state, lower in (("closed", 0x100), ("open", 0x200), ("short", 0x300), ("cut", 0xA00))
)
COMPARATOR = "iio:device6"


device = pytest.fixture(device_on_lines)


@pytest.fixture
def converters(converters) -> Converters:
    converters.spidev()
    converters.attribute(COMPARATOR, "name", "comparator\n")
    converters.level(COMPARATOR, "in_voltage0_raw", 0x150)
    for name in ("rising_value", "falling_value", "either_en"):
        converters.attribute(COMPARATOR, f"events/in_voltage0_thresh_{name}", "")
    converters.fifo(COMPARATOR)
    converters.fifo(f"{COMPARATOR}.events")
    return converters


def with_event(backend: str, settings: str, **options) -> str:
    """A port whose event is for supervised inputs alone."""
    event = f'<event declaration="{EVENT}" input="false" output="false" supervised_input="true"/>'
    text = supervised_port(backend, f"<device {settings}/>{RANGES}", **options)
    return text.replace("</backend>", f"</backend>{event}")


def spi(**options) -> str:
    return with_event("spi", 'path="/run/converters/spidev0"', **options)


def told(signal: tuple[int, dict[str, Any]]) -> tuple[str, bool]:
    _number, values = signal
    return values["state"], values["tampered"]


def wait_told(sent: Signals, state: str, tampered: bool) -> None:
    """The next event, which says this and nothing else."""
    sent.wait()
    assert [told(signal) for signal in sent.take()] == [(state, tampered)]


def test_the_event_is_declared_while_the_port_is_supervised(device, converters):
    converters.answer(0xA00)
    start(device, spi())
    producer = Producer(device)
    assert producer.declarations() == {}
    supervise(device)
    entry = producer.only("", port=0)
    assert entry["keys"]["topic2"] == "SupervisedPort"
    assert entry["keys"]["tampered"] is True
    assert entry["tags"]["tampered"] == "onvif-data"
    supervise(device, False)
    assert producer.declarations() == {}


def test_the_event_follows_the_role_of_the_port(device, converters):
    converters.answer(0x150)
    start(device, spi(kind="io_ctrl"))
    producer = Producer(device)
    supervise(device)
    assert len(producer.ids("", port=0)) == 1
    device.call("SetDirection", "us", 0, "output")
    assert producer.declarations() == {}
    device.call("SetDirection", "us", 0, "input")
    assert len(producer.ids("", port=0)) == 1


def test_short_and_cut_are_tampering(device, converters):
    converters.answer(0x150)
    start(device, spi())
    with Producer(device).signals("Sent") as sent:
        supervise(device)
        wait_told(sent, "closed", False)
        for level, state, tampered in (
            (0x300, "short", True),
            (0x250, "open", False),
            (0xAFF, "cut", True),
            (0x50, "undefined", False),
        ):
            converters.answer(level)
            wait_told(sent, state, tampered)


def test_without_supervision_nothing_is_sent(device, converters):
    converters.answer(0x150)
    start(device, spi())
    with Producer(device).signals("Sent") as sent:
        supervise(device)
        wait_told(sent, "closed", False)
        supervise(device, False)
        converters.answer(0x300)
        device.call("SetActive", "ubs", 0, True, "open")
        supervise(device)
        wait_told(sent, "short", True)


def test_a_line_that_cannot_be_read_is_told_as_undefined(device, converters):
    for text in ("Failed to read sysfs path", "Readout failed", "Couldn't read adc value"):
        device.allow_critical(text)
    start(device, with_event("iio-interrupt", 'driver="comparator" cache_ad_value="false"'))
    with Producer(device).signals("Sent") as sent:
        supervise(device)
        converters.send_event(6, 0)
        wait_told(sent, "closed", False)
        converters.attribute(COMPARATOR, "in_voltage0_raw").unlink()
        converters.send_event(6, 0)
        wait_told(sent, "undefined", False)
        converters.level(COMPARATOR, "in_voltage0_raw", 0xA00)
        wait_told(sent, "cut", True)


def test_switching_supervision_while_a_sequence_sends_events_loses_none(device, converters):
    """The line stays undefined, so that nothing but the sequence has an event to send."""
    converters.answer(0x50)
    event = '<event declaration="IOPort" supervised_input="true"/>'
    text = supervised_port("spi", f'<device path="/run/converters/spidev0"/>{RANGES}', event=event)
    start(device, text)
    steps = [(index % 2 == 0, 1) for index in range(800)]
    switched = 0
    with (
        device.signals("ActionSequenceDone") as done,
        Producer(device).signals("Sent") as sent,
    ):
        device.call("StartActionSequence", "uba(bi)", 0, True, steps)
        while not done.received:
            switched += 1
            supervise(device, switched % 2 == 1)
            wait_for(lambda: True, "signals that have come")
        assert (len(sent.received), switched > 1) == (len(steps), True)
