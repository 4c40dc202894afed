"""Inputs that sample a converter on an SPI bus, through the kernel's spidev interface."""

import errno
import os
import time

import pytest

from control import call_everything
from converters import Converters
from gpio_tree import device_on_lines
from harness import Device, hwdesc, port, wait_for

NODE = "/run/converters/spidev0"
FAILURE = "SPI_IOC_MESSAGE failed! : "
USUAL = [("1000", "2000", "50")]


def spiadc(ranges=USUAL, kind: str = "input", optional: bool = False, **other: str) -> str:
    device = {"device": NODE, "address": "0x18", "timeout": "10", **other}
    attributes = " ".join(f'{key}="{value}"' for key, value in device.items())
    elements = f"<device {attributes}/>" + "".join(
        f'<range name="r"/><input active_min="{low}" active_max="{high}" hysteresis="{hysteresis}"/>'
        for low, high, hysteresis in ranges
    )
    backend = f'<backend name="spiadc">{elements}</backend>'
    return port("level", 0, kind, backend=None, extra=backend, optional=optional)


device = pytest.fixture(device_on_lines)


@pytest.fixture
def converters(converters) -> Converters:
    converters.spidev()
    converters.answer(0)
    return converters


def start(device: Device, *ports: str) -> Device:
    device.conf(hwdesc(*(ports or (spiadc(),))))
    return device.start()


def wait_messages(converters: Converters, count: int) -> None:
    """That many messages from now on."""
    before = len(converters.spi_calls())
    wait_for(lambda: len(converters.spi_calls()) >= before + count, f"{count} messages")


def state_after(device: Device, converters: Converters, sample: int) -> bool:
    """The state once the sample was taken and what follows from it was done."""
    converters.answer(sample)
    wait_messages(converters, 2)  # the first one may have begun before
    return device.call("GetState", "u", 0)


def test_a_sample_is_one_message_and_nothing_else_is_set(device, converters):
    start(device)
    wait_messages(converters, 3)
    assert set(converters.spi_calls()) == {"message 18 00, 2"}


def test_the_ranges_of_the_document_decide(device, converters):
    start(device, spiadc([("100", "200", "0"), *USUAL], inverted="true"))
    for sample, expected in [(0, True), (1049, True), (1050, False), (951, False), (949, True),
                             (150, False)]:  # fmt: skip
        assert state_after(device, converters, sample) is expected, sample


def test_changes_are_reported_once(device, converters):
    start(device)
    state_after(device, converters, 0)
    with device.signals() as signals:
        for sample in (1500, 1600, 1500, 0, 100):
            state_after(device, converters, sample)
        assert [change.state for change in signals.wait_count(2)] == [True, False]
        assert all((change.port, change.input) == (0, True) for change in signals.received)


def test_active_low_turns_it(device, converters):
    start(device)
    state_after(device, converters, 1500)
    device.call("SetActive", "ubs", 0, True, "open")
    assert device.call("GetState", "u", 0) is False
    assert state_after(device, converters, 0) is True


def test_sampling_goes_on_after_failures(device, converters):
    start(device)
    converters.fail(errno.ETIMEDOUT)
    device.wait_log(FAILURE, 2)
    assert state_after(device, converters, 1500) is True


def test_a_device_that_is_missing_is_sampled_in_vain(device, converters):
    (converters.folder / "spidev0").unlink()
    start(device, spiadc([("0", "10", "0")]))
    device.wait_log(f"Failed to open {NODE}: No such file or directory")
    device.wait_log(FAILURE + "Bad file descriptor", 3)
    assert device.call("GetState", "u", 0) is False
    call_everything(device, numbers=(0,))


def test_a_pipe_in_place_of_a_device_does_not_hold_the_start(device, converters):
    os.mkfifo(device.mkdir("/run/pipes") / "spidev")
    start(device, spiadc(device="/run/pipes/spidev"))
    assert "/run/pipes/spidev" in device.descriptors()
    assert device.call("GetState", "u", 0) is False


@pytest.mark.parametrize("kind", ["output", "io_ctrl"])
def test_only_inputs_can_be_set_up(device, converters, kind):
    start(device, spiadc(kind=kind))
    device.wait_log("an SPI ADC port can only be an input")
    call_everything(device, numbers=(0,))


def test_an_optional_port_comes_back_with_its_ranges(device, converters):
    start(device, spiadc(optional=True))
    assert state_after(device, converters, 1500) is True
    assert device.call("DropIOPorts", "as", ["level"]) == ["level"]
    assert not any("spidev" in target for target in device.descriptors())
    device.call("RefreshIOPorts")
    assert state_after(device, converters, 949) is False
    assert state_after(device, converters, 1050) is True


def test_announcements_do_not_multiply_the_samples(device, converters):
    start(device, spiadc(timeout="100"))
    for _ in range(20):
        device.call("RefreshIOPorts")
    begin = time.monotonic()
    wait_messages(converters, 5)
    assert time.monotonic() - begin > 0.3


def test_sampling_takes_no_descriptors(device, converters):
    def held() -> list[str]:
        # Beside the node, the fake opens files of its own for a moment.
        return sorted(path for path in device.descriptors() if path == NODE or "/run/" not in path)

    start(device, spiadc(timeout="1"))
    wait_messages(converters, 10)
    before = held()
    wait_messages(converters, 500)
    assert held() == before
