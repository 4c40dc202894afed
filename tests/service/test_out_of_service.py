"""Ports whose hardware is missing: the log says which, and clients that call them find out from it."""

from pathlib import Path

import pytest

from control import expect_error
from converters import PINS, supervise
from gpio_tree import device_on_lines
from harness import Device, hwdesc, port

NO_FILE = "No such file or directory"
COULD_NOT_SET = "Failed to set state on port!"
OUTPUT = 12

device = pytest.fixture(device_on_lines)


def gpio_output(number: int, line: int) -> str:
    backend = f'<backend name="gpio"><output pin="{line}"/></backend>'
    return port(f"relay{number}", number, "output", backend=None, extra=backend)


def measured(number: int, backend: str, elements: str) -> str:
    section = f'<backend name="{backend}">{PINS}{elements}</backend>'
    return port(f"line{number}", number, backend=None, extra=section)


def sysfs(number: int, optional: bool = False) -> str:
    return port(f"flag{number}", number, backend="sysfs", optional=optional,
                device={"path": f"/run/flag{number}", "timeout": "100"})  # fmt: skip


def start(device: Device, *ports: str) -> list[str]:
    """Starts with these ports. Gives the warnings on those out of service, and the count."""
    device.conf(hwdesc(*ports))
    device.allow_critical("")
    device.start()
    device.wait_log("ports are in service")
    return [line.partition(": portd: ")[2] for line in device.log().splitlines()
            if "is out of service" in line or "ports are in service" in line]  # fmt: skip


def test_the_start_ends_with_a_warning_for_each_port_that_lacks_something_and_a_count(device, tree):
    for line in (11, 12, 13):
        tree.line(line)
    lines = start(
        device,
        port("door", 0),
        gpio_output(1, 99),
        sysfs(2),
        sysfs(3, optional=True),
        port("adc", 4, backend="spiadc", device={"device": "/run/spidev9", "timeout": "100"}),
        measured(5, "spi", '<device path="/run/spidev8"/>'),
        measured(6, "iio", '<device name="adc7" adc="adc7" hrtimer="pace" freq="10"/>'),
        measured(7, "iio-interrupt", '<device driver="adc8" channel="0"/>'),
        port("gate", 8, backend="iobox"),
        port("bare", 9, backend=None),
        gpio_output(10, OUTPUT),
    )
    assert lines == [
        f"Port relay1, number 1, is out of service (listed): output pin 99: {NO_FILE}",
        f"Port flag2, number 2, is out of service (listed): /run/flag2: {NO_FILE}",
        f"Port adc, number 4, is out of service (listed): /run/spidev9: {NO_FILE}",
        f"Port line5, number 5, is out of service (listed): /run/spidev8: {NO_FILE}",
        "Port line6, number 6, is out of service (listed): there is no converter adc7",
        "Port line7, number 7, is out of service (listed): there is no converter adc8",
        "Port gate, number 8, is out of service (listed): no I/O box is connected",
        "Port bare, number 9, is out of service (listed): it has no backend",
        f"Port flag3, number 3, is out of service (not listed): /run/flag3: {NO_FILE}",
        "2 of 11 ports are in service",
    ]
    listed = {properties.id for properties in device.port_props()}
    for line in lines[:-1]:
        assert (line.split()[1].rstrip(",") in listed) == ("(listed)" in line)


def test_a_device_that_has_everything_is_counted_in_one_line(device, tree):
    tree.line(OUTPUT)
    device.write("/run/flag1", "0\n")
    assert start(device, gpio_output(0, OUTPUT), sysfs(1)) == ["2 of 2 ports are in service"]
    assert "INFO" in next(line for line in device.log().splitlines() if "in service" in line)


def test_a_line_that_could_not_be_had_is_named_when_it_is_driven_and_only_once(device, tree):
    start(device, gpio_output(0, 99))
    device.wait_log(f"WARNING: portd: Port relay0 has to do without its output pin 99: {NO_FILE}")
    for state in (True, False, True):
        device.call("SetState", "ub", 0, state)
    device.wait_log(COULD_NOT_SET, 3)
    assert device.log_count(f"Port relay0: its output pin 99 can't be driven: {NO_FILE}") == 1


class FullLine:
    """An output line that takes no level while its storage is full."""

    def __init__(self, device: Device, tree, number: int):
        self._device = device
        self._folder = f"/sys/class/gpio/gpio{number}"
        (tree.gpio / f"gpio{number}").mkdir()
        # A page each for the files that hold something; an empty file needs none.
        device.sandbox.tmpfs(self._folder, "size=16k")
        for name, text in {"direction": "in\n", "edge": "none\n", "active_low": "0\n"}.items():
            self._file(name).write_text(text)
        self._file("value").write_text("")
        self.fill()

    def _file(self, name: str) -> Path:
        return self._device.path(f"{self._folder}/{name}")

    def fill(self) -> None:
        self._file("value").write_text("")
        self._file("ballast").write_bytes(b"x")

    def make_room(self) -> None:
        self._file("ballast").unlink()

    def value(self) -> str:
        return self._file("value").read_text()


def test_a_line_that_worked_in_between_is_named_again(device, tree):
    line = FullLine(device, tree, OUTPUT)
    start(device, gpio_output(0, OUTPUT))
    message = f"Port relay0: its output pin {OUTPUT} can't be driven: No space left on device"
    for turn in (1, 2):
        for state in (True, False):
            device.call("SetState", "ub", 0, state)
        device.wait_log(COULD_NOT_SET, 2 * turn)
        assert device.log_count(message) == turn
        line.make_room()
        device.call("SetState", "ub", 0, True)
        assert line.value() == "1"
        line.fill()


def test_supervision_of_a_port_that_was_not_set_up_says_why_and_only_once(device, tree):
    for number in (11, 12, 13):
        tree.line(number)
    start(device, measured(0, "spi", '<device path="/run/spidev8"/>'))
    device.wait_name("com.kelv.IOSupervised.Supervised")
    for on in (True, False, True):
        supervise(device, on)
    message = "Port line0 is supervised from now on, but its line is not measured: /run/spidev8: "
    assert device.log_count(message + NO_FILE) == 1


def test_supervision_on_a_box_that_is_not_there_says_so(device):
    start(device, port("gate", 0, backend="iobox"))
    device.wait_name("com.kelv.IOSupervised.Supervised")
    supervise(device)
    device.wait_log("Port gate is supervised from now on, but its line is not measured: no I/O box")


def test_a_port_that_is_listed_out_of_service_refuses_to_be_driven(device):
    failing = port("relay", 0, "output", device={"setup": "fail"})
    assert start(device, failing)[0] == (
        "Port relay, number 0, is out of service (listed): its description says so"
    )
    expect_error(device, "Not_output", "Port not output.", "SetState", "ub", 0, True)
