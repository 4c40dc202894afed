"""portctl with a line that is measured by a converter."""

import pytest

from converters import Converters, range_element, start, supervise, supervised_port
from gpio_tree import device_on_lines
from portctl import OK, REFUSED, Portctl, follow_commands

RANGES = (
    range_element("closed", 0x100, 0x1FF)
    + range_element("open", 0x200, 0x2FF)
    + range_element("cut", 0xA00, 0xFFF)
)


device = pytest.fixture(device_on_lines)
follow = pytest.fixture(follow_commands)


@pytest.fixture
def portctl(device, converters: Converters) -> Portctl:
    converters.spidev()
    converters.answer(0x150)
    elements = '<device path="/run/converters/spidev0"/><address value="1f"/>' + RANGES
    start(device, supervised_port("spi", elements))
    return Portctl(device)


def test_lines_are_listed_switched_and_read(portctl):
    (line,) = portctl.json("supervised")
    assert line["supervision"]["on"] is False
    portctl("supervised", "0", "on")
    assert portctl("supervised", "0", "readout") == "closed 336\n"
    assert portctl.json("supervised", "0", "readout")["level"] == 336
    portctl("supervised", "0", "range", "short", "0", "50")
    assert portctl("supervised", "0", "ranges").splitlines()[-1].split() == ["short", "0", "50"]
    assert "closed 336" in portctl("list")
    assert "lower < upper" in portctl.fails(REFUSED, "supervised", "0", "range", "cut", "9", "9")


def test_states_of_the_line_are_monitored_and_waited_for(portctl, follow, device, converters):
    supervise(device)
    monitor = follow("monitor", "--json")
    monitor.until("up")
    waiting = follow("wait", "0", "cut", "--timeout", "60")
    converters.answer(0xA00)
    assert monitor.until("changed", line="cut")["level"] == 0xA00
    assert waiting.wait() == OK
