"""Inputs that sample a converter on an SPI bus, through the kernel's spidev interface."""

import errno
import os
from typing import Iterator

import pytest

from control import call_everything
from harness import Device, hwdesc, port, wait_for
from mocked_devices import MockedDevices, Spidev, add_spidev

NODE = "/dev/spidev0.0"
FAILURE = "SPI_IOC_MESSAGE failed! : "
# SPI_IOC_MESSAGE(2) of the kernels that number writes with 1; MIPS and some others have 0x80406b00.
MESSAGE_OF_TWO = 0x40406B00
USUAL = [("1000", "2000", "50")]

# The fields of struct spi_ioc_transfer: the two buffers, length, and nine that stay zero.
SENDS_TWO_BYTES = (True, False, 2, *[0] * 8)
RECEIVES_TWO_BYTES = (False, True, 2, *[0] * 8)


def spiadc(
    ranges=USUAL, kind: str = "input", number: int = 0, optional: bool = False, **other: str
) -> str:
    device = {"device": NODE, "address": "0x18", "timeout": "10", **other}
    attributes = " ".join(f'{key}="{value}"' for key, value in device.items())
    elements = f"<device {attributes}/>" + "".join(
        f'<range name="r"/><input active_min="{low}" active_max="{high}" hysteresis="{hysteresis}"/>'
        for low, high, hysteresis in ranges
    )
    backend = f'<backend name="spiadc">{elements}</backend>'
    return port("level", number, kind, backend=None, extra=backend, optional=optional)


@pytest.fixture
def devices(device) -> Iterator[MockedDevices]:
    devices = MockedDevices(device)
    yield devices
    devices.close()


@pytest.fixture
def spidev(devices) -> Spidev:
    return add_spidev(devices, "spidev0.0")


def start(device: Device, *ports: str) -> Device:
    device.conf(hwdesc(*(ports or (spiadc(),))))
    return device.start()


def state_after(device: Device, spidev: Spidev, sample: int) -> bool:
    """The state once the sample was taken and what follows from it was done."""
    spidev.answer(sample)
    spidev.wait_messages(1)
    return device.call("GetState", "u", 0)


def test_a_sample_is_one_message_of_two_transfers_with_all_else_zero(device, spidev):
    start(device)
    for message in spidev.wait_messages(3):
        assert message.request == MESSAGE_OF_TWO
        assert message.sent == b"\x18\x00"
        assert message.receive_buffer == b"\0\0"
        assert message.first == SENDS_TWO_BYTES
        assert message.second == RECEIVES_TWO_BYTES


@pytest.mark.parametrize("text, byte", [("24", 24), ("0x18", 24), ("030", 24), ("0x1ff", 255)])
def test_the_address_is_the_low_byte_of_any_kind_of_number(device, spidev, text, byte):
    start(device, spiadc(address=text))
    assert spidev.wait_messages(1)[0].sent == bytes([byte, 0])


def test_a_sample_has_its_high_eight_bits_first(device, spidev):
    start(device, spiadc([("0xABC", "0xABC", "0")]))
    spidev.answer_bytes(b"\xab\xcd")
    wait_for(lambda: device.call("GetState", "u", 0), "the state")


def test_becomes_active_inside_the_narrowed_range_only(device, spidev):
    start(device)
    assert state_after(device, spidev, 1049) is False
    assert state_after(device, spidev, 1050) is True


def test_stays_active_in_the_widened_range(device, spidev):
    start(device)
    for sample, expected in [(1500, True), (950, True), (2050, True), (2051, False), (1951, False),
                             (1950, True), (949, False)]:  # fmt: skip
        assert state_after(device, spidev, sample) is expected, sample


def test_either_of_two_ranges_is_active(device, spidev):
    start(device, spiadc([("100", "200", "0"), ("1000", "1100", "0")]))
    for sample, expected in [(150, True), (500, False), (1050, True), (1101, False)]:
        assert state_after(device, spidev, sample) is expected, sample


def test_without_ranges_it_is_inactive(device, spidev):
    start(device, spiadc([]))
    assert state_after(device, spidev, 0) is False
    assert state_after(device, spidev, 4095) is False


def test_properties_before_any_range_are_logged_and_lost(device, spidev):
    early = '<input active_min="0" active_max="4095"/>'
    start(device, spiadc([("10", "20", "0")]).replace("<range", early + "<range", 1))
    assert device.log_count("Spi ADC backend configured incorrectly") == 2
    assert state_after(device, spidev, 1000) is False
    assert state_after(device, spidev, 15) is True


def test_inverted_it_is_active_outside_all_ranges(device, spidev):
    start(device, spiadc(inverted="true"))
    assert state_after(device, spidev, 500) is True
    assert state_after(device, spidev, 1500) is False


def test_changes_are_reported_once(device, spidev):
    start(device)
    state_after(device, spidev, 0)
    with device.signals() as signals:
        for sample in (1500, 1600, 1500, 0, 100):
            state_after(device, spidev, sample)
        assert [change.state for change in signals.wait_count(2)] == [True, False]
        assert all((change.port, change.input) == (0, True) for change in signals.received)


def test_active_low_turns_it(device, spidev):
    start(device)
    state_after(device, spidev, 1500)
    device.call("SetActive", "ubs", 0, True, "open")
    assert device.call("GetState", "u", 0) is False
    assert state_after(device, spidev, 0) is True


def test_a_failed_transfer_is_a_sample_of_zero(device, spidev):
    start(device, spiadc([("0", "10", "0")]))
    assert state_after(device, spidev, 2000) is False
    spidev.fail(errno.EIO)
    wait_for(lambda: device.call("GetState", "u", 0), "the state of a sample of 0")
    device.wait_log(FAILURE + "Input/output error", 2)


def test_sampling_goes_on_after_failures(device, spidev):
    start(device)
    spidev.fail(errno.ETIMEDOUT)
    device.wait_log(FAILURE, 2)
    assert state_after(device, spidev, 1500) is True


def test_a_device_that_is_missing_is_sampled_in_vain(device):
    start(device, spiadc([("0", "10", "0")]))
    device.wait_log(f"Failed to open {NODE}: No such file or directory")
    device.wait_log(FAILURE + "Bad file descriptor", 3)
    assert device.call("GetState", "u", 0) is False
    call_everything(device, numbers=(0,))


def test_a_pipe_in_place_of_a_device_does_not_hold_the_start(device):
    os.mkfifo(device.mkdir("/run/pipes") / "spidev")
    start(device, spiadc(device="/run/pipes/spidev"))
    device.wait_log(FAILURE + "Inappropriate ioctl for device")
    assert device.call("GetState", "u", 0) is False


@pytest.mark.parametrize("kind", ["output", "io_ctrl"])
def test_only_inputs_can_be_set_up(device, spidev, kind):
    start(device, spiadc(kind=kind))
    device.wait_log("an SPI ADC port can only be an input")
    call_everything(device, numbers=(0,))


def test_an_optional_port_comes_back_with_its_ranges(device, spidev):
    start(device, spiadc(optional=True))
    assert state_after(device, spidev, 1500) is True
    assert device.call("DropIOPorts", "as", ["level"]) == ["level"]
    assert not any("spidev" in target for target in device.descriptors())
    device.call("RefreshIOPorts")
    assert state_after(device, spidev, 949) is False
    assert state_after(device, spidev, 1050) is True


def test_announcements_do_not_multiply_the_samples(device, spidev):
    start(device, spiadc(timeout="100"))
    for _ in range(20):
        device.call("RefreshIOPorts")
    messages = spidev.wait_messages(5)
    assert messages[4].time - messages[0].time > 0.3


def test_sampling_takes_no_descriptors(device, spidev):
    start(device, spiadc(timeout="1"))
    spidev.wait_messages(10)
    before = sorted(device.descriptors())
    spidev.wait_messages(500)
    assert sorted(device.descriptors()) == before
