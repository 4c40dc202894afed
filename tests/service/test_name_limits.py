"""A name has at most 4,096 bytes of UTF-8, whichever way it comes."""

import pytest

from control import expect_error
from harness import hwdesc, port
from legacy_tool import EXPORT, INPUT, INVALID, Tool, fails

LIMIT = 4096
LONGEST = "€" * (LIMIT // 3) + "x"
TOO_LONG = LONGEST + "x"
# As much as fits into a message: the signal that told of it would not fit into one.
HUGE = "x" * 33_554_000
IGNORED = "WARNING: portd: Port gate: the input name is ignored"


@pytest.fixture
def gate(device):
    event = '<event declaration="IOPort"/>'
    device.conf(hwdesc(port("gate", 0, extra=event), port("siren", 1, kind="output", extra=event)))
    return device


def test_the_longest_name_is_kept(gate):
    gate.start()
    gate.call("SetName", "ubs", 0, True, LONGEST)
    assert gate.call("GetNames", "u", 0) == (LONGEST, "")
    gate.restart()
    assert gate.call("GetNames", "u", 0) == (LONGEST, "")


@pytest.mark.parametrize("name", [TOO_LONG, HUGE], ids=["one more byte", "32 MB"])
def test_a_longer_one_is_refused(gate, name):
    gate.start()
    for number, side, word in ((0, True, "input"), (1, False, "output")):
        message = f"Could not set {word} name for the port."
        expect_error(gate, "Generic", message, "SetName", "ubs", number, side, name)
    assert gate.call("GetNames", "u", 0) == ("Input 1", "")
    settings = gate.read_settings()
    gate.restart()
    assert gate.read_settings() == settings
    assert gate.call("GetNames", "u", 1) == ("", "Output 1")


def test_a_longer_one_is_refused_by_the_legacy_property(gate):
    gate.start()
    tool = Tool(gate)
    for name in (TOO_LONG, HUGE):
        assert fails(INVALID, tool.set, 0, INPUT, "Name", name) == "Incorrect value for Name"
    tool.set(0, INPUT, "Name", LONGEST)
    assert tool.get(0, INPUT, "Name") == LONGEST


def test_a_stored_one_gives_way_to_the_default(gate):
    gate.settings(f"[gate]\ninput_name={TOO_LONG}\ninput_activelow=true\n")
    gate.start()
    assert gate.call("GetNames", "u", 0) == ("Input 1", "")
    assert gate.call("GetActive", "u", 0)[0] == "open"
    assert gate.log_count(IGNORED) == 1
    gate.restart()
    assert gate.log_count(IGNORED) == 0


def test_one_of_the_hardware_description_gives_way_to_the_default(device):
    device.conf(hwdesc(port("gate", 0, names={"input": TOO_LONG})))
    device.start()
    assert device.call("GetNames", "u", 0) == ("Input 1", "")
    assert device.log_count(IGNORED) == 1


def test_one_of_the_export_is_left_out(gate):
    gate.write(EXPORT, f"[IOPort.I0.Input]\nName={TOO_LONG}\nTrig=open\n")
    gate.start()
    assert gate.call("GetNames", "u", 0) == ("Input 1", "")
    assert gate.call("GetActive", "u", 0)[0] == "open"
    assert gate.log_count("Name in group IOPort.I0.Input is too long for a name of port gate") == 1
