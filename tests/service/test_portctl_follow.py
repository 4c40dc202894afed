"""portctl's commands that wait for what comes: monitor and wait."""

import signal

import pytest

from harness import hwdesc, port
from portctl import NO_PORT, OK, TIMEOUT, Portctl, follow_commands

PORTS = hwdesc(
    port("door", 0, names={"input": "Door"}, extra='<event declaration="IOPort"/>'),
    port("relay", 1, kind="output", names={"output": "Relay"}),
)


@pytest.fixture
def portctl(device) -> Portctl:
    device.conf(PORTS)
    device.start()
    return Portctl(device)


follow = pytest.fixture(follow_commands)


def test_the_monitor_tells_of_changes_in_words(portctl, follow, device):
    monitor = follow("monitor")
    assert monitor.line().endswith("the daemon serves 2 ports")
    portctl("set", "relay", "on")
    assert monitor.line().endswith("port 1 Relay: output active")
    portctl("virtual", "door", "on")
    monitor.until_line("event 1: port=0 state=true")
    monitor.until_line("port 0 Door: input active, reported by a client")
    portctl("pulse", "relay", "1")
    monitor.until_line("port 1 Relay: the sequence has ended")
    assert monitor.end() == (OK, "")


def test_the_monitor_writes_one_object_a_line(portctl, follow):
    monitor = follow("monitor", "--json")
    assert monitor.until("up")["ports"] == 2
    portctl("set", "relay", "on")
    change = monitor.until("changed")
    assert (change["port"], change["name"], change["active"]) == (1, "Relay", True)
    portctl("virtual", "door", "on")
    assert monitor.until("event")["keys"]["state"] is True
    assert monitor.end(signal.SIGTERM) == (OK, "")


def test_the_monitor_outlives_the_daemon(portctl, follow, device):
    monitor = follow("monitor", "--json")
    monitor.until("up")
    device.stop()
    monitor.until("down")
    device.start()
    monitor.until("up")
    portctl("set", "relay", "on")
    assert monitor.until("changed")["port"] == 1
    assert monitor.end() == (OK, "")


def test_waiting_ends_with_the_state(portctl, follow):
    waiting = follow("wait", "Relay", "active", "--timeout", "60")
    portctl("set", "relay", "on")
    assert waiting.wait() == OK
    assert portctl("wait", "1", "on") == ""


def test_waiting_gives_up_in_time_and_knows_its_ports(portctl):
    assert "did not become active" in portctl.fails(
        TIMEOUT, "wait", "door", "active", "--timeout", "0.1"
    )
    assert portctl.fails(NO_PORT, "wait", "window", "active")


def test_waiting_goes_on_until_the_daemon_comes(device, follow):
    device.conf(PORTS)
    device.bus.start()
    waiting = follow("wait", "door", "inactive", "--timeout", "60")
    device.start()
    assert waiting.wait() == OK
