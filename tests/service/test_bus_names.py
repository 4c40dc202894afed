"""How the daemon comes to its names on the bus: late, in a queue, or not at all."""

import signal

import pytest

from harness import hwdesc, port, wait_for
from harness.device import CONTROL
from legacy_tool import DISABLED

NAMES = (CONTROL, "com.kelv.PCD.Connector", "com.kelv.IOSupervised.Supervised")
NO_BUS = "No interface is served until there is a system bus"


@pytest.fixture
def door(device):
    device.conf(hwdesc(port("door", 0)))
    return device


def test_a_bus_that_comes_late_is_found(door):
    door.allow_critical(NO_BUS)
    door.start(DISABLED, wait=False, bus=False)
    door.wait_log(NO_BUS)
    door.bus.start()
    for name in NAMES:
        door.wait_name(name)
    assert door.call("GetNbrPorts") == (1, 0)
    with door.signals() as changes:
        door.call("SetVirtual", "ub", 0, True)
        changes.wait()
    assert door.log_count(NO_BUS) == 1


def test_without_a_bus_the_daemon_can_be_ended(door):
    door.allow_critical(NO_BUS)
    door.start(DISABLED, wait=False, bus=False)
    door.wait_log(NO_BUS)
    door.stop()


def test_the_legacy_bridge_needs_a_bus(door):
    door.start(wait=False, bus=False)
    assert door.wait_exit() == -signal.SIGTRAP
    assert door.log_count("ERROR: portd: Failed to connect to system bus: ") == 1


def test_a_second_instance_says_that_the_names_are_taken(door):
    door.start(DISABLED)
    second, log = door.start_another(DISABLED)
    for name in NAMES:
        line = f"WARNING: portd: The name {name} is taken: is another instance running?"
        wait_for(lambda line=line: line in log.read_text(), line)
    assert "is taken" not in door.log()
    door.stop()
    wait_for(lambda: door.bus.has_owner(CONTROL), "the name's new owner")
    second.terminate()
    assert second.wait(20) == 0
