"""Fixtures of the service tier: devices that are taken down and judged after every test."""

import itertools
from pathlib import Path
from typing import Iterator

import pytest

from converters import Converters
from gpio_tree import GpioTree
from harness import Device, NoMounts, become_root, default_binary


def pytest_configure() -> None:
    try:
        become_root()
    except NoMounts as error:
        raise pytest.UsageError(str(error)) from None


def pytest_report_header() -> str:
    return f"portd: {default_binary()}"


@pytest.hookimpl(hookwrapper=True)
def pytest_runtest_makereport(item, call):
    """Shows what the daemon printed below a failure, and tells the fixtures about it."""
    outcome = yield
    report = outcome.get_result()
    if report.failed:
        item.portd_test_failed = True
        for device in getattr(item, "portd_devices", []):
            report.sections.append(("portd", device.output()))


@pytest.fixture
def make_device(request, tmp_path: Path) -> Iterator:
    """Makes devices, for tests that want a special one or several."""
    devices = request.node.portd_devices = []
    numbers = itertools.count()

    def make(**options) -> Device:
        folder = tmp_path / f"device{next(numbers)}"
        folder.mkdir()
        devices.append(Device(folder, **options))
        return devices[-1]

    yield make
    problems = [problem for device in devices for problem in device.close()]
    # A test that failed has said already what is wrong; its devices need no second judgement.
    if problems and not getattr(request.node, "portd_test_failed", False):
        pytest.fail("\n".join(problems), pytrace=False)


@pytest.fixture
def device(make_device) -> Device:
    return make_device()


@pytest.fixture
def tree(tmp_path: Path) -> Iterator[GpioTree]:
    """The kernel's files of GPIO lines, for a device that has them for its /sys."""
    tree = GpioTree(tmp_path)
    yield tree
    tree.close()


@pytest.fixture
def converters(device, tree, tmp_path: Path) -> Iterator[Converters]:
    """Converters beside the lines of `tree`, none of them plugged in yet."""
    converters = Converters(device, tree, tmp_path)
    yield converters
    converters.close()
