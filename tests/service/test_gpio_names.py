"""Lines that the hardware description calls by name, which the kernel's GPIO devices know."""

from typing import Iterator

import pytest

from gpio_tree import GpioTree
from harness import hwdesc, port
from mocked_devices import MockedDevices, add_gpiochip

OUTPUT_WRITES = ("direction low", "active_low 0")


def output(attributes: str) -> str:
    backend = f'<backend name="gpio"><output {attributes}/></backend>'
    return port("terminal", 0, "output", backend=None, extra=backend)


@pytest.fixture
def devices(device) -> Iterator[MockedDevices]:
    """A device with two chips, which sysfs numbers the other way round."""
    devices = MockedDevices(device)
    add_gpiochip(devices, 0, "soc", ["led", ""], 512)
    add_gpiochip(devices, 1, "expander", ["", "relay", "siren"], 480)
    yield devices
    devices.close()


@pytest.fixture
def tree(devices) -> Iterator[GpioTree]:
    tree = GpioTree(devices.root)
    yield tree
    tree.close()


@pytest.mark.parametrize("name, number", [("led", 512), ("relay", 481), ("siren", 482)])
def test_a_name_is_the_line_of_its_chip(device, tree, name, number):
    tree.line(number)
    device.conf(hwdesc(output(f'alias="{name}"')))
    device.start()
    tree.wait(*(f"gpio{number}/{text}" for text in OUTPUT_WRITES))
    device.call("SetState", "ub", 0, True)
    tree.wait(f"gpio{number}/value 1")


def test_a_fresh_line_is_exported_by_its_number(device, tree):
    tree.line(482, exported=False)
    device.conf(hwdesc(output('alias="siren"')))
    device.start()
    tree.wait("export 482", *(f"gpio482/{text}" for text in OUTPUT_WRITES))


def test_the_name_counts_where_there_is_a_number_too(device, tree):
    tree.line(7)
    tree.line(482)
    device.conf(hwdesc(output('pin="7" alias="siren"')))
    device.start()
    tree.wait(*(f"gpio482/{text}" for text in OUTPUT_WRITES))


def test_a_name_that_no_chip_has(device, tree):
    device.conf(hwdesc(output('alias="bell"')))
    device.start()
    assert device.log_count("Failed to allocate pin 0/bell") == 1
    assert device.log_count("Can't find GPIO line bell: No such file or directory") == 1
    assert tree.take() == []
    assert device.call("GetState", "u", 0) is True


def put_out_of_order(devices, chip: int) -> None:
    """Takes what libgpiod tells a chip by: version 1 its number, version 2 its subsystem."""
    next((devices.root / "sys/devices/platform").glob(f"*/gpiochip{chip}/dev")).unlink()
    (devices.root / f"sys/dev/char/254:{chip}").unlink()


def test_a_chip_that_is_out_of_order_hides_no_line_of_others(device, devices, tree):
    put_out_of_order(devices, 0)
    tree.line(482)
    device.conf(hwdesc(output('alias="siren"')))
    device.start()
    tree.wait(*(f"gpio482/{text}" for text in OUTPUT_WRITES))


def test_a_chip_that_is_out_of_order_is_given_as_the_reason_for_a_name_that_no_other_has(
    device, devices, tree
):
    put_out_of_order(devices, 0)
    device.conf(hwdesc(output('alias="led"')))
    device.start()
    reasons = ("Inappropriate ioctl for device", "No such device")
    assert sum(device.log_count(f"Can't find GPIO line led: {reason}") for reason in reasons) == 1


def test_the_chip_of_the_lowest_number_has_a_name_that_several_have(device, devices, tree):
    for chip in (10, 2, 11, 3):
        add_gpiochip(devices, chip, f"bank{chip}", ["twin"], 1000 + chip)
    tree.line(1002)
    device.conf(hwdesc(output('alias="twin"')))
    device.start()
    tree.wait(*(f"gpio1002/{text}" for text in OUTPUT_WRITES))
