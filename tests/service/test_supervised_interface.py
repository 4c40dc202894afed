"""The supervised-input interface, on ports whose converter is a plain file."""

import xml.etree.ElementTree as ElementTree
import pytest

from control import ODD_NUMBERS
from converters import (
    SUPERVISED,
    SUPERVISED_PATH,
    Converters,
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
from harness import port, wait_for

METHODS = {
    "GetNumberOfPorts": [("inputs", "u", "out"), ("outputs", "u", "out")],
    "IsSupervisable": [("port", "u", "in"), ("input", "b", "out"), ("output", "b", "out")],
    "GetSupervised": [("port", "u", "in"), ("supervised", "b", "out")],
    "SetSupervised": [("port", "u", "in"), ("supervised", "b", "in")],
    "SetSupervisedRanges": [
        ("port", "u", "in"), ("state", "s", "in"), ("lowerlimit", "u", "in"),
        ("upperlimit", "u", "in"),
    ],
    "GetSupervisedRanges": [("port", "u", "in"), ("ranges", "a(suu)", "out")],
    "GetSupervisedReadout": [
        ("port", "u", "in"), ("state", "s", "out"), ("level", "u", "out"),
    ],
    "GetSupervisedStates": [
        ("port", "u", "in"), ("nbrstates", "u", "out"), ("states", "a(s)", "out"),
    ],
    "GetSupervisedPortNumbers": [("ports", "au", "out")],
}  # fmt: skip

BY_NUMBER = [
    ("IsSupervisable", "u"),
    ("GetSupervised", "u"),
    ("SetSupervised", "ub", True),
    ("SetSupervisedRanges", "usuu", "open", 1, 2),
    ("GetSupervisedRanges", "u"),
    ("GetSupervisedReadout", "u"),
    ("GetSupervisedStates", "u"),
]
# Those that take a port for one of the device's own only when it says so.
BY_FLAG = BY_NUMBER[:3]


device = pytest.fixture(device_on_lines)


@pytest.fixture
def converters(converters) -> Converters:
    converters.spidev()
    converters.answer(0)
    return converters


def spi(number: int = 0, elements: str = "", **options) -> str:
    return supervised_port(
        "spi", f'<device path="/run/converters/spidev0"/>{elements}', number, **options
    )


def test_offers_nine_methods_and_nothing_else(device, converters):
    start(device, spi())
    text = device.bus.call(
        SUPERVISED, SUPERVISED_PATH, "org.freedesktop.DBus.Introspectable", "Introspect"
    )
    interface = ElementTree.fromstring(text).find(f"interface[@name='{SUPERVISED}']")
    found = {
        method.get("name"): [
            (arg.get("name"), arg.get("type"), arg.get("direction")) for arg in method.iter("arg")
        ]
        for method in interface.iter("method")
    }
    assert found == METHODS
    assert interface.find("signal") is None and interface.find("property") is None


def test_gives_its_name_up_at_the_end(device, converters):
    start(device, spi())
    device.stop()
    wait_for(lambda: not device.bus.has_owner(SUPERVISED), "the name to be free")


def test_counts_ports_by_the_role_that_they_have(device, converters):
    start(device, spi(0), port("out", 1, "output"), spi(2, kind="io_ctrl"), port("in", 3))
    assert supervised(device, "GetNumberOfPorts") == (3, 1)
    device.call("SetDirection", "us", 2, "output")
    assert supervised(device, "GetNumberOfPorts") == (2, 2)


def test_tells_which_ports_can_be_supervised(device, converters):
    start(device, spi(0), port("out", 1, "output"), spi(2, kind="io_ctrl"), port("in", 3))
    assert supervised(device, "IsSupervisable", "u", 0) == (True, False)
    assert supervised(device, "IsSupervisable", "u", 1) == (False, False)
    device.call("SetDirection", "us", 2, "output")
    assert supervised(device, "IsSupervisable", "u", 2) == (True, False)
    assert supervised(device, "IsSupervisable", "u", 3) == (False, False)
    assert supervised(device, "GetSupervisedPortNumbers") == [2, 0]


@pytest.mark.parametrize("call", BY_NUMBER, ids=lambda call: call[0])
def test_knows_no_port_by_an_odd_number(device, converters, call):
    start(device, spi(3), spi(-1, name="no number"), spi("4000000000", name="high"))
    method, signature, *rest = call
    for number in ODD_NUMBERS:
        expect_supervised_error(
            device, "Error.No_port", "No such port.", method, signature, number, *rest
        )


@pytest.mark.parametrize("call", BY_FLAG, ids=lambda call: call[0])
def test_a_port_that_is_not_the_devices_own_is_not_found(device, converters, call):
    start(device, spi(0, flags="virtual"))
    method, signature, *rest = call
    expect_supervised_error(device, "Error.No_port", "No such port.", method, signature, 0, *rest)


@pytest.mark.parametrize("call", BY_NUMBER[2:], ids=lambda call: call[0])
def test_a_port_that_cannot_be_supervised_says_so(device, converters, call):
    start(device, port("in", 0))
    method, signature, *rest = call
    stop = "" if method == "GetSupervisedStates" else "."
    expect_supervised_error(
        device, "Not_supervisable", f"Port is not supervisable{stop}", method, signature, 0, *rest
    )


def test_offers_four_states(device, converters):
    start(device, spi())
    states = supervised(device, "GetSupervisedStates", "u", 0)
    assert states == (4, [("closed",), ("open",), ("short",), ("cut",)])


def test_ranges_are_kept_in_the_order_in_which_they_were_set(device, converters):
    start(device, spi(elements=range_element("open", 10, 20)))
    supervised(device, "SetSupervisedRanges", "usuu", 0, "closed", 5, 8)
    ranges = [("open", 10, 20), ("closed", 5, 8)]
    assert supervised(device, "GetSupervisedRanges", "u", 0) == ranges
    supervised(device, "SetSupervisedRanges", "usuu", 0, "open", 11, 12)
    ranges = [("closed", 5, 8), ("open", 11, 12)]
    assert supervised(device, "GetSupervisedRanges", "u", 0) == ranges


@pytest.mark.parametrize(
    "state, lower, upper, message",
    [
        ("open", 10, 5, "Invalid range."),
        ("open", 100, 100, "Invalid range."),
        ("open", 0, 65536, "Invalid range."),
        ("open", 5, 2**32 - 1, "Invalid range."),
        ("Open", 1, 2, "State is undefined."),
        ("undefined", 1, 2, "State is undefined."),
        ("", 1, 2, "State is undefined."),
    ],
)
def test_a_bad_range_is_refused_and_changes_nothing(
    device, converters, state, lower, upper, message
):
    start(device, spi(elements=range_element("cut", 1, 2)))
    settings = device.read_settings()
    expect_supervised_error(
        device, "Bad_supervised_range", message, "SetSupervisedRanges", "usuu", 0, state, lower,
        upper,
    )  # fmt: skip
    assert supervised(device, "GetSupervisedRanges", "u", 0) == [("cut", 1, 2)]
    assert device.read_settings() == settings


def test_the_value_that_a_port_has_is_not_stored_again(device, converters):
    start(device, spi())
    settings = device.path("/etc/portd/portd.conf")
    before = settings.stat()
    supervise(device, False)
    assert (settings.stat().st_ino, settings.stat().st_mtime_ns) == (
        before.st_ino,
        before.st_mtime_ns,
    )
    supervise(device, True)
    assert "supervised_input=true" in device.read_settings()
    assert settings.stat().st_ino != before.st_ino


def test_supervision_and_ranges_outlive_a_restart(device, converters):
    converters.answer(0x123)
    start(device, spi(elements=range_element("open", 1, 2)))
    supervised(device, "SetSupervisedRanges", "usuu", 0, "short", 0x100, 0x200)
    supervised(device, "SetSupervisedRanges", "usuu", 0, "open", 5, 6)
    supervise(device)
    device.restart()
    device.wait_name(SUPERVISED)
    assert supervised(device, "GetSupervised", "u", 0) is True
    ranges = [("open", 5, 6), ("short", 0x100, 0x200)]
    assert supervised(device, "GetSupervisedRanges", "u", 0) == ranges
    assert converters.control_pins() == "01"
    # Read by the watch, not by a client.
    reads = len(converters.spi_calls())
    wait_for(lambda: len(converters.spi_calls()) > reads, "the watch")
    wait_readout(device, "short", 0x123)


def test_a_readout_that_fails_passes_the_systems_words_on(device, converters):
    device.allow_critical("Error: Input/output error")
    device.allow_critical("Error: Bad file descriptor")
    start(device, spi())
    assert readout(device) == ("undefined", 0)
    converters.fail(5)
    expect_supervised_error(
        device, "Error.Generic", "Input/output error", "GetSupervisedReadout", "u", 0
    )
    expect_supervised_error(
        device, "Error.Generic", "Bad file descriptor", "GetSupervisedReadout", "u", 0
    )


def test_documents_that_make_no_sense_do_no_harm(device, converters):
    for text in ("Supervised IO port", "Limited IO port", "Failed to", "Error: Bad file"):
        device.allow_critical(text)
    numbers = [-1, 4000000000, 2147483647, 2147483648, 6, "nonsense"]
    ports = []
    for backend in ("spi", "iio", "iio-interrupt"):
        for number, kind in enumerate(("input", "output", "io_ctrl")):
            name = f"{backend} {kind}"
            ports.append(port(name, number, kind, backend=backend))
            ports.append(supervised_port(backend, "", numbers[number], kind, name=name + " 2"))
            ports.append(
                supervised_port(backend, range_element("x", 9, 1), numbers[number + 3], kind,
                                name=name + " 3")
            )  # fmt: skip
    start(device, *ports)
    for number in supervised(device, "GetSupervisedPortNumbers"):
        for method, signature, *rest in BY_NUMBER:
            try:
                supervised(device, method, signature, number, *rest)
            except Exception:  # noqa: BLE001 - any answer will do
                pass
        for direction in ("output", "input"):
            try:
                device.call("SetDirection", "us", number, direction)
            except Exception:  # noqa: BLE001
                pass
    assert supervised(device, "GetNumberOfPorts") is not None
    device.restart()
