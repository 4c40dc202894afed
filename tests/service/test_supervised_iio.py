"""Supervised inputs whose line is sampled into a buffer. The character device is a FIFO."""

import struct
import pytest

from converters import (
    Converters,
    come_back_fifty_times,
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
from harness.sandbox import is_real_root

NODE = "iio:device2"
RANGES = range_element("closed", 100, 200) + range_element("cut", 3000, 4000)
DEVICE = '<device name="buffer" adc="adc" hrtimer="pulse" freq="50" channel="3"/>'
LOST = ("read Error: ", "Readout failed: ")


device = pytest.fixture(device_on_lines)


@pytest.fixture
def converters(converters, tree) -> Converters:
    make_buffer(converters)
    converters.attribute("iio:device5", "name", "adc\n")
    converters.attribute("iio:device5", "trigger/current_trigger", "\n")
    converters.attribute("trigger0", "name", "pulse\n")
    converters.attribute("trigger0", "sampling_frequency", "")
    (tree.sys / "kernel/config/iio/triggers/hrtimer").mkdir(parents=True)
    return converters


def make_buffer(converters: Converters) -> None:
    converters.attribute(NODE, "name", "buffer\n")
    converters.attribute(NODE, "scan_elements/in_voltage3_en", "")
    converters.attribute(NODE, "buffer/enable", "")
    set_type(converters, "le:u12/16>>0")
    converters.fifo(NODE)


def set_type(converters: Converters, text: str) -> None:
    converters.attribute(NODE, "scan_elements/in_voltage3_type", f"{text}\n")


def iio(elements: str = RANGES, **options) -> str:
    return supervised_port("iio", DEVICE + elements, **options)


def sample(converters: Converters, level: int) -> None:
    converters.send(NODE, struct.pack("<H", level))


def sample_until_it_is_read(device, converters: Converters, level: int) -> None:
    """A device that is back has no old samples to tell: those that come too early are dropped."""

    def is_read() -> bool:
        sample(converters, level)
        return readout(device) == ("closed", level)

    wait_for(is_read, f"the sample {level} to be read")


def test_sets_up_timer_trigger_and_buffer(device, converters, tree):
    start(device, iio())
    assert (tree.sys / "kernel/config/iio/triggers/hrtimer/pulse").is_dir()
    assert converters.read("trigger0", "sampling_frequency") == "50"
    assert converters.read("iio:device5", "trigger/current_trigger") == "pulse"
    assert converters.read(NODE, "scan_elements/in_voltage3_en") == "1"
    assert converters.read(NODE, "buffer/enable") == "1"
    assert readout(device) == ("undefined", 0)


def test_samples_are_followed_while_supervised(device, converters):
    start(device, iio())
    assert converters.control_pins() == "10"
    with device.signals() as signals:
        supervise(device)
        assert converters.control_pins() == "01"
        sample(converters, 150)
        signals.wait(lambda change: change.state)
        wait_readout(device, "closed", 150)
        sample(converters, 3500)
        wait_readout(device, "cut", 3500)
        sample(converters, 9)
        wait_readout(device, "undefined", 9)


def test_samples_are_taken_apart_by_their_type(device, converters):
    set_type(converters, "be:u12/16>>4")
    start(device, iio())
    supervise(device)
    converters.send(NODE, b"\xab\xcd")
    wait_for(lambda: readout(device)[1] == 0xABC, "the level")


def test_a_converter_of_another_kind_ends_the_daemon(device, converters):
    set_type(converters, "le:s12/16>>4")
    with pytest.raises(RuntimeError, match="backend->iio_type"):
        start(device, iio())


@pytest.mark.parametrize("text", ["", "garbage", "le:u12", "le:u12/0>>0"])
def test_a_type_that_cannot_be_read_leaves_the_port_out(device, converters, text):
    device.allow_critical("Failed to find device type")
    device.allow_critical("Failed to setup iio device.")
    set_type(converters, text)
    start(device, iio())
    assert readout(device) == ("undefined", 0)
    supervise(device)
    sample(converters, 150)
    assert readout(device) == ("undefined", 0)


def test_a_lost_device_reads_undefined_without_a_busy_loop_and_comes_back(device, converters):
    for text in LOST:
        device.allow_critical(text)
    start(device, iio())
    supervise(device)
    sample(converters, 150)
    wait_readout(device, "closed", 150)
    with device.signals() as signals:
        used = processor_time(device)
        converters.hang_up(NODE)
        wait_readout(device, "undefined", 150)
        signals.wait()
        make_buffer(converters)
        # The daemon looks for it after a second, and has to do nothing else until then.
        wait_for(lambda: converters.read(NODE, "buffer/enable") == "1", "the device to be found")
        assert processor_time(device) - used < 0.5
        signals.take()
        sample_until_it_is_read(device, converters, 160)
        signals.wait(lambda change: change.state)
    assert device.log_count("read Error: ") == 1
    assert device.log_count("Port line0: buffer is back") == 1


def test_a_device_that_is_back_without_rights_is_logged_once_and_tried_again(device, converters):
    for text in LOST:
        device.allow_critical(text)
    start(device, iio())
    supervise(device)
    converters.keep_from_account(NODE)
    converters.hang_up(NODE)
    device.wait_log("read Error: No such device")
    if is_real_root():
        refused = f"buffer is back, but /sys/bus/iio/devices/{NODE}/buffer/enable can't be opened"
        device.wait_log(refused)
    make_buffer(converters)
    sample_until_it_is_read(device, converters, 160)
    if is_real_root():
        assert device.log_count(refused) == 1


def test_a_dropped_port_holds_nothing_and_comes_back_fifty_times(device, converters):
    def come_back(level: int) -> None:
        device.call("RefreshIOPorts")
        sample(converters, level)

    start(device, iio(optional=True))
    supervised(device, "SetSupervisedRanges", "usuu", 0, "short", 5, 6)
    supervise(device)
    come_back_fifty_times(device, converters, come_back)
    assert ("short", 5, 6) in supervised(device, "GetSupervisedRanges", "u", 0)


def test_supervision_and_ranges_outlive_a_restart(device, converters):
    start(device, iio())
    supervised(device, "SetSupervisedRanges", "usuu", 0, "short", 5, 6)
    supervise(device)
    restart_supervised(device, converters)
    sample(converters, 5)
    wait_readout(device, "short", 5)
