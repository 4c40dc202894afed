"""Supervised inputs on a converter that raises events when its level crosses a threshold."""

import pytest

from converters import (
    Converters,
    come_back_fifty_times,
    expect_supervised_error,
    processor_time,
    range_element,
    readout,
    restart_supervised,
    start,
    supervise,
    supervised,
    supervised_port,
    wait_readout,
)
from gpio_tree import device_on_lines
from harness import wait_for

ENTRY = "iio:device6"
EVENTS = f"{ENTRY}.events"
RANGES = range_element("closed", 100, 200) + range_element("open", 201, 300)
FILES = ("rising_value", "falling_value", "rising_en", "falling_en")


device = pytest.fixture(device_on_lines)


@pytest.fixture
def converters(converters) -> Converters:
    converters.attribute(ENTRY, "name", "comparator\n")
    for channel in (0, 1):
        set_raw(converters, 150, channel)
        for name in FILES:
            converters.attribute(ENTRY, f"events/in_voltage{channel}_thresh_{name}", "")
    converters.fifo(ENTRY)
    converters.fifo(EVENTS)
    return converters


def set_raw(converters: Converters, level: int, channel: int = 0) -> None:
    converters.level(ENTRY, f"in_voltage{channel}_raw", level)


def armed(converters: Converters, channel: int = 0) -> list[str]:
    """Rising and falling threshold, and whether each is enabled."""
    return [
        converters.read(ENTRY, f"events/in_voltage{channel}_thresh_{name}") for name in FILES
    ]


def wait_armed(converters: Converters, *expected: str, channel: int = 0) -> None:
    wait_for(lambda: armed(converters, channel) == list(expected), f"the thresholds {expected}")


def interrupt(settings: str = "", elements: str = RANGES, **options) -> str:
    section = f'<device driver="comparator" {settings}/>'
    return supervised_port("iio-interrupt", section + elements, **options)


def test_thresholds_lie_around_the_level_while_supervised(device, converters):
    start(device, interrupt('hysteresis="5"'))
    assert armed(converters) == ["1", "0", "0", "0"]
    supervise(device)
    assert armed(converters) == ["205", "95", "1", "1"]
    assert readout(device) == ("closed", 150)
    assert converters.control_pins() == "01"
    supervise(device, False)
    assert armed(converters)[2:] == ["0", "0"]
    assert converters.control_pins() == "10"


def test_an_event_is_followed_by_a_signal_and_new_thresholds(device, converters):
    start(device, interrupt())
    supervise(device)
    with device.signals() as signals:
        converters.send_event(6, 0)
        signals.wait(lambda change: change.state)
        set_raw(converters, 250)
        converters.send_event(6, 0)
        signals.wait(lambda change: not change.state)
    wait_armed(converters, "300", "201", "1", "1")
    assert readout(device) == ("open", 250)
    assert device.call("GetState", "u", 0) is False


def test_a_burst_and_events_of_other_channels_do_no_harm(device, converters):
    start(device, interrupt(number=0), interrupt('channel="1"', number=1))
    supervise(device)
    set_raw(converters, 250)
    for _ in range(20):
        converters.send_event(6, 0, 100)
        converters.send_event(6, 1, 20)
        converters.send_event(6, 77, 20)
        assert readout(device)[0] in ("closed", "open")
    wait_readout(device, "open", 250)
    supervise(device, number=1)
    set_raw(converters, 250, 1)
    converters.send_event(6, 1)
    wait_readout(device, "open", 250, number=1)


def test_two_ports_share_one_descriptor(device, converters):
    start(device, interrupt(number=0), interrupt('channel="1"', number=1, optional=True))
    node = f"/run/converters/{EVENTS}"
    assert device.descriptors().count(node) == 1
    for number in (0, 1):
        supervise(device, number=number)
    supervise(device, False, number=1)
    set_raw(converters, 250)
    converters.send_event(6, 0)
    wait_readout(device, "open", 250)
    assert device.call("DropIOPorts", "as", ["line1"]) == ["line1"]
    assert device.descriptors().count(node) == 1
    set_raw(converters, 150)
    converters.send_event(6, 0)
    wait_readout(device, "closed", 150)


def test_a_short_record_costs_the_watch_for_a_second(device, converters):
    device.allow_critical("read Error: ")
    start(device, interrupt())
    supervise(device)
    used = processor_time(device)
    with device.signals() as signals:
        converters.send_event(6, 0)
        signals.wait(lambda change: change.state)
        converters.send(EVENTS, b"short")
        signals.wait_count(3)  # undefined, and closed again
        set_raw(converters, 250)
        converters.send_event(6, 0)
        signals.wait(lambda change: not change.state)
    assert processor_time(device) - used < 0.5
    assert device.log_count("read Error: Input/output error") == 1


def test_a_port_that_was_not_watched_when_its_device_failed_is_watched_anew(device, converters):
    device.allow_critical("read Error: ")
    start(device, interrupt(number=0), interrupt('channel="1"', number=1))
    supervise(device, number=0)
    converters.send(EVENTS, b"short")
    device.wait_log("read Error: Input/output error")
    supervise(device, False, number=0)
    supervise(device, number=1)
    with device.signals() as signals:
        set_raw(converters, 250, 1)
        converters.send_event(6, 1)
        signals.wait(lambda change: change.port == 1 and not change.state)
    assert readout(device, 1) == ("open", 250)
    assert readout(device, 0)[0] == "closed"


def test_a_lost_device_is_an_error_without_a_busy_loop_and_comes_back(device, converters):
    for text in ("read Error: ", "Failed to read sysfs path"):
        device.allow_critical(text)
    start(device, interrupt('cache_ad_value="false"'))
    supervise(device)
    with device.signals() as signals:
        converters.send_event(6, 0)
        signals.wait(lambda change: change.state)
        used = processor_time(device)
        converters.iio.joinpath(ENTRY).rename(converters.iio / "unplugged")
        converters.hang_up(EVENTS)
        signals.wait_count(2)
        path = f"/sys/bus/iio/devices/{ENTRY}/in_voltage0_raw"
        expect_supervised_error(
            device, "Error.Generic", f"Failed to read {path}", "GetSupervisedReadout", "u", 0
        )
        converters.fifo(EVENTS)
        converters.iio.joinpath("unplugged").rename(converters.iio / ENTRY)
        device.wait_log("Port line0: comparator is back")
        wait_armed(converters, "200", "100", "1", "1")
        assert processor_time(device) - used < 0.5
        set_raw(converters, 250)
        converters.send_event(6, 0)
        signals.wait(lambda change: not change.state)


# What was opened as root is all that the service account will ever get.
def test_a_read_that_fails_costs_the_account_neither_thresholds_nor_events(device, converters):
    for text in ("Failed to read sysfs path", "Readout failed", "Couldn't read adc value"):
        device.allow_critical(text)
    start(device, interrupt(number=0), interrupt('channel="1"', number=1))
    for number in (0, 1):
        supervise(device, number=number)
    converters.keep_from_account(ENTRY)
    files = converters.open_files()
    for channel in (0, 1):
        converters.attribute(ENTRY, f"in_voltage{channel}_raw").unlink()
        converters.send_event(6, channel)
        device.wait_log("Couldn't read adc value", channel + 1)
        assert readout(device, channel) == ("closed", 150)  # the one that is stored
        set_raw(converters, 250, channel)
        wait_armed(converters, "300", "201", "1", "1", channel=channel)
    assert converters.open_files() == files
    set_raw(converters, 150)
    converters.send_event(6, 0)
    wait_readout(device, "closed", 150)


def test_switched_off_and_on_a_port_that_could_not_be_read_is_back(device, converters):
    for text in ("Failed to read sysfs path", "Couldn't read adc value"):
        device.allow_critical(text)
    start(device, interrupt('cache_ad_value="false"'))
    converters.keep_from_account(ENTRY)
    converters.attribute(ENTRY, "in_voltage0_raw").unlink()
    supervise(device)
    set_raw(converters, 250)
    supervise(device, False)
    supervise(device)
    assert armed(converters) == ["300", "201", "1", "1"]
    assert readout(device) == ("open", 250)


def test_beyond_a_limit_the_level_is_read_after_a_while(device, converters):
    set_raw(converters, 105)
    start(device, interrupt('lower_limit="110" limit_timeout="20"'))
    supervise(device)
    assert armed(converters) == ["1", "0", "0", "0"]
    set_raw(converters, 150)
    wait_armed(converters, "200", "100", "1", "1")


def test_an_adc_port_is_watched_without_supervision(device, converters):
    start(device, interrupt('mode="adc"'))
    assert supervised(device, "IsSupervisable", "u", 0) == (False, False)
    wait_armed(converters, "200", "100", "1", "1")
    assert device.call("GetState", "u", 0) is True
    with device.signals() as signals:
        set_raw(converters, 250)
        converters.send_event(6, 0)
        signals.wait(lambda change: not change.state)
    assert "supervised_input" not in device.read_settings()


def test_the_integration_time_is_given_in_seconds(device, converters):
    converters.attribute(ENTRY, "in_proximity_integration_time", "")
    converters.attribute(ENTRY, "sampling_frequency", "")
    start(device, interrupt('integration_time="185000" shared_samplefreq="860"'))
    assert converters.read(ENTRY, "in_proximity_integration_time") == "0.185000"
    assert converters.read(ENTRY, "sampling_frequency") == "860"


def test_a_dropped_port_holds_nothing_and_comes_back_fifty_times(device, converters):
    def come_back(level: int) -> None:
        assert armed(converters)[2:] == ["0", "0"]
        set_raw(converters, level)
        device.call("RefreshIOPorts")
        assert armed(converters) == ["190", "110", "1", "1"]

    start(device, interrupt(optional=True))
    supervised(device, "SetSupervisedRanges", "usuu", 0, "closed", 110, 190)
    supervise(device)
    come_back_fifty_times(device, converters, come_back, first=120)


def test_supervision_and_ranges_outlive_a_restart(device, converters):
    start(device, interrupt())
    supervised(device, "SetSupervisedRanges", "usuu", 0, "closed", 110, 190)
    supervise(device)
    restart_supervised(device, converters)
    wait_armed(converters, "190", "110", "1", "1")
    assert readout(device) == ("closed", 150)
