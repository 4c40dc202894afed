"""Inputs that poll an attribute file. A plain file is as good as a kernel attribute for reading."""

import time

import pytest

from control import call_everything, expect_error
from harness import Device, hwdesc, port, wait_for

FLAG = "/run/flag"
OPEN_FAILURE = "Failed to open"
READ_FAILURE = "Error failed to read"
UNEXPECTED = "Unexpected value: "
FORMAT = "Unexpected format when parsing input when reading"


def sysfs(number: int = 0, name: str = "flag", optional: bool = False, **device: str) -> str:
    properties = {"path": FLAG, "timeout": "20", **device}
    return port(name, number, backend="sysfs", device=properties, optional=optional)


def started(device: Device, text: str, **properties: str) -> Device:
    """A running device with one input on a file with this text."""
    device.write(FLAG, text)
    device.conf(hwdesc(sysfs(**properties)))
    return device.start()


def state(device: Device) -> bool:
    return device.call("GetState", "u", 0)


def wait_state(device: Device, expected: bool) -> None:
    wait_for(lambda: state(device) is expected, f"state {expected}")


def test_follows_the_file(device):
    started(device, "0\n")
    with device.signals() as signals:
        for expected in (True, False, True):
            device.write(FLAG, f"{int(expected)}\n")
            wait_state(device, expected)
        signals.wait_count(3)
        assert [change.state for change in signals.received] == [True, False, True]
        assert all((change.port, change.input) == (0, True) for change in signals.received)


def test_active_low_turns_it(device):
    started(device, "1\n")
    wait_state(device, True)
    device.call("SetActive", "ubs", 0, True, "open")
    assert state(device) is False
    device.write(FLAG, "0\n")
    wait_state(device, True)


def test_an_inverted_file(device):
    started(device, "0\n", inverted="true")
    wait_state(device, True)
    device.write(FLAG, "1\n")
    wait_state(device, False)


def test_a_large_file(device):
    started(device, "1\n" + "x" * 1_000_000)
    wait_state(device, True)


def test_a_latched_flag_is_cleared(device):
    started(device, "0\n", clear_flag="true")
    with device.signals() as signals:
        device.write(FLAG, "1\n")
        wait_for(lambda: device.read(FLAG) == "0\n", "the flag to be cleared")
        signals.wait_count(2)
        assert [change.state for change in signals.received] == [True, False]


def test_a_latched_flag_latches_again(device):
    started(device, "0\n", clear_flag="true")
    with device.signals() as signals:
        for round_number in range(1, 6):
            device.write(FLAG, "1\n")
            signals.wait_count(2 * round_number)
        assert [change.state for change in signals.received] == [True, False] * 5


def test_a_file_that_vanishes_keeps_its_last_reading(device):
    """An open file outlives its name, and a new file of that name is not seen."""
    started(device, "1\n")
    wait_state(device, True)
    with device.path(FLAG).open("r+") as still_open, device.signals() as signals:
        device.path(FLAG).unlink()
        device.write(FLAG, "0\n")
        still_open.truncate(0)
        still_open.write("0\n")
        still_open.flush()
        signals.wait_count(1)
        device.write(FLAG, "1\n")
        still_open.seek(0)
        still_open.write("1\n")
        still_open.flush()
        signals.wait_count(2)
        assert [change.state for change in signals.received] == [False, True]


def test_a_file_that_turns_into_a_directory(device):
    started(device, "1\n")
    wait_state(device, True)
    with device.path(FLAG).open("r+") as still_open:
        device.path(FLAG).unlink()
        device.mkdir(FLAG)
        still_open.write("0\n")
        still_open.flush()
        wait_state(device, False)


def test_a_port_that_comes_back_onto_a_directory(device):
    device.write(FLAG, "1\n")
    device.conf(hwdesc(sysfs(optional=True, inverted="true"), port("other", 1)))
    device.start()
    device.call("DropIOPorts", "as", ["flag"])
    device.path(FLAG).unlink()
    device.mkdir(FLAG)
    device.call("RefreshIOPorts")
    device.wait_log(f"{READ_FAILURE} {FLAG}!", 3)
    assert state(device) is False


def test_a_directory_can_not_be_cleared(device):
    device.mkdir(FLAG)
    device.conf(hwdesc(sysfs(clear_flag="true")))
    device.start()
    assert device.log_count(f"{OPEN_FAILURE} {FLAG}: ") == 1
    assert state(device) is False


@pytest.mark.parametrize("inverted", ["false", "true"])
def test_a_file_that_does_not_exist(device, inverted):
    device.conf(hwdesc(sysfs(inverted=inverted), port("other", 1, "output")))
    device.start()
    assert device.log_count(f"{OPEN_FAILURE} {FLAG}: ") == 1
    # The port was never set up, so that it is inactive whatever the backend makes of it.
    device.write(FLAG, "1\n")
    device.call("RefreshIOPorts")
    assert state(device) is False
    call_everything(device, [0])
    assert device.log_count(READ_FAILURE) == 0


def test_no_path_at_all(device):
    device.conf(hwdesc(port("flag", 0, backend="sysfs")))
    device.start()
    assert device.log_count(OPEN_FAILURE) == 1
    call_everything(device)


def elapsed(device: Device, lines: int) -> float:
    """How long the next so many warnings of a file with a strange number take."""
    begin = time.monotonic()
    device.wait_log(UNEXPECTED, device.log_count(UNEXPECTED) + lines, timeout=60)
    return time.monotonic() - begin


def test_the_interval_is_that_of_the_document(device):
    started(device, "2\n", timeout="0x64")
    device.wait_log(UNEXPECTED)
    assert elapsed(device, 10) > 0.8


@pytest.mark.parametrize("timeout", ["0", "", "soon"])
def test_no_interval_still_leaves_time_for_clients(device, timeout):
    started(device, "0\n", timeout=timeout)
    for _ in range(100):
        device.call("GetNbrPorts")
    device.write(FLAG, "1\n")
    wait_state(device, True)


def test_it_can_not_be_driven(device):
    started(device, "0\n")
    expect_error(device, "Not_output", "Port not output.", "SetState", "ub", 0, True)
    assert device.read(FLAG) == "0\n"


@pytest.mark.parametrize("kind", ["output", "io_ctrl"])
def test_as_anything_but_an_input(device, kind):
    device.write(FLAG, "1\n")
    text = sysfs().replace('type="input"', f'type="{kind}"')
    device.conf(hwdesc(text, port("other", 1, "output")))
    device.start()
    call_everything(device)
    assert device.read(FLAG) == "1\n"


def test_a_real_kernel_attribute(device):
    attribute = "/proc/sys/net/ipv4/ip_forward"
    device.conf(hwdesc(sysfs(path=attribute), sysfs(1, "turned", path=attribute, inverted="true")))
    device.start()
    with open(attribute) as file:
        value = file.read().strip() == "1"
    wait_for(lambda: device.call("GetState", "u", 1 if not value else 0), "the first poll")
    assert device.call("GetState", "u", 0) is value
    assert device.call("GetState", "u", 1) is not value


def test_refreshing_never_adds_a_timer(device):
    device.write("/run/module", "0\n")
    module = {"path": "/run/module", "timeout": "20"}
    device.write(FLAG, "2\n")
    device.conf(
        hwdesc(
            sysfs(timeout="50"),
            port("module", 1, backend="sysfs", device=module, optional=True),
        )
    )
    device.start()
    for _ in range(100):
        assert device.call("DropIOPorts", "as", ["module"]) == ["module"]
        device.call("RefreshIOPorts")
    device.wait_log(UNEXPECTED)
    # A second timer would halve this, a hundred of them would leave nothing of it.
    assert elapsed(device, 20) > 0.8 * 20 * 0.05
    with device.signals() as signals:
        for level in (1, 0, 1):
            device.write("/run/module", f"{level}\n")
            wait_for(lambda: device.call("GetState", "u", 1) is bool(level), f"level {level}")
        signals.wait_count(3)
        assert [(change.port, change.state) for change in signals.received] == [
            (1, True),
            (1, False),
            (1, True),
        ]


def test_dropping_ends_the_polling(device):
    device.write(FLAG, "2\n")
    device.write("/run/other", "2\n")
    device.conf(hwdesc(sysfs(optional=True), sysfs(1, "other", path="/run/other")))
    device.start()
    device.wait_log(f"when reading: {FLAG}")
    device.call("DropIOPorts", "as", ["flag"])
    before = device.log_count(f"when reading: {FLAG}")
    others = device.log_count("when reading: /run/other")
    device.wait_log("when reading: /run/other", others + 10)
    assert device.log_count(f"when reading: {FLAG}") == before
    assert str(device.path(FLAG)) not in device.descriptors() and FLAG not in device.descriptors()
