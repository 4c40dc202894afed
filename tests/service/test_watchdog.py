"""The service manager's watchdog, which the main loop answers."""

import os
import signal
import socket

import pytest

from harness import Device, hwdesc, port, scale

PATH = "/run/notify"


class Manager:
    """The service manager's end of the watchdog."""

    def __init__(self, device: Device):
        self._socket = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)
        # The folder may have a longer name than an address holds.
        os.chdir(device.path("/run"))
        self._socket.bind("notify")
        device.path(PATH).chmod(0o777)

    def receive(self, timeout: float) -> bytes:
        self._socket.settimeout(timeout)
        return self._socket.recv(4096)

    def drain(self) -> None:
        self._socket.setblocking(False)
        try:
            while self._socket.recv(4096):
                pass
        except BlockingIOError:
            pass

    def close(self) -> None:
        self._socket.close()


@pytest.fixture
def manager(device, monkeypatch):
    monkeypatch.chdir("/")
    device.conf(hwdesc(port("out", 0, "output")))
    manager = Manager(device)
    yield manager
    manager.close()


def watched(device: Device, interval_ms: int, **more: str) -> Device:
    device.environment = {
        "NOTIFY_SOCKET": PATH, "WATCHDOG_USEC": str(interval_ms * 1000), **more,
    }  # fmt: skip
    return device.start()


def test_the_running_loop_answers_the_watchdog_again_and_again(device, manager):
    watched(device, 200)
    for _ in range(3):
        assert manager.receive(10 * scale()) == b"WATCHDOG=1"


def test_a_daemon_that_hangs_falls_silent(device, manager):
    watched(device, 200)
    manager.receive(10 * scale())
    device.send_signal(signal.SIGSTOP)
    os.waitid(os.P_PID, device.pid, os.WSTOPPED | os.WNOWAIT)
    manager.drain()
    try:
        with pytest.raises(TimeoutError):
            manager.receive(0.5)
    finally:
        device.send_signal(signal.SIGCONT)
    manager.receive(10 * scale())


def test_without_being_asked_the_daemon_says_nothing(device, manager):
    device.environment = {"NOTIFY_SOCKET": PATH}
    device.start()
    device.call("GetNbrPorts")
    with pytest.raises(TimeoutError):
        manager.receive(0.3)


def test_a_watchdog_of_another_process_is_not_answered(device, manager):
    watched(device, 50, WATCHDOG_PID="1")
    with pytest.raises(TimeoutError):
        manager.receive(0.3)


@pytest.mark.parametrize("interval", ["0", "-5", "soon", ""])
def test_an_interval_that_is_none_switches_nothing_on(device, manager, interval):
    device.environment = {"NOTIFY_SOCKET": PATH, "WATCHDOG_USEC": interval}
    device.start()
    with pytest.raises(TimeoutError):
        manager.receive(0.3)


def test_a_manager_that_can_not_be_reached_is_a_warning_and_no_more(device):
    device.conf(hwdesc(port("out", 0, "output")))
    device.environment = {"NOTIFY_SOCKET": "no path", "WATCHDOG_USEC": "100000"}
    device.start()
    device.wait_log("Could not reach the watchdog at no path")
    device.call("GetNbrPorts")
