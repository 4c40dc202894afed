"""The services beside the daemon, as the tests play them: the I/O box monitor, the video streamer and
the camera-control coordinator."""

import json
import os
import signal
import subprocess
import time
from pathlib import Path
from typing import Any, Iterator, Optional, Sequence

from gi.repository import GLib

from harness import Device, Pending, Signals, scale, wait_for

IOBOX = "com.kelv.IOBoxMonitor"
STREAMER = "com.kelv.Streamer"
COORDINATOR = "com.kelv.PTZ.Coordinator"

_PLAYER = Path(__file__).with_name("player.py")
_MOCK = "org.freedesktop.DBus.Mock"
_POLICY = """<busconfig>
  <policy user="root"><allow own="{name}"/></policy>
  <policy context="default"><allow send_destination="{name}"/></policy>
</busconfig>
"""

_STORM = """
for _ in range(5000):
    for word in ("closed", "open"):
        self._emit_signal("", "IOStateChanged", "is", (args[0], word), {})
"""


class Neighbour:
    """A service that has all of its objects from the moment on which its name is on the bus."""

    def __init__(self, device: Device, name: str, objects: dict[str, Any], **behaviour: Any):
        """`objects` maps paths to (interface, properties, methods); for `behaviour` see player.py."""
        self.device, self.name = device, name
        self._objects = objects
        self.first_path = next(iter(objects))
        device.bus.start()
        device.write(f"/etc/dbus-1/system.d/{name}.conf", _POLICY.format(name=name))
        device.bus.bus_call("ReloadConfig")
        parameters = json.dumps({"objects": objects, **behaviour})
        env = dict(os.environ, DBUS_SYSTEM_BUS_ADDRESS=device.bus.address, PLAYED_NAME=name)
        with (device.folder / f"{name}.log").open("ab") as log:
            self.process = subprocess.Popen(
                ["/usr/bin/python3", "-m", "dbusmock", "--system", "-t", str(_PLAYER), "-p", parameters],
                stdin=subprocess.DEVNULL, stdout=log, stderr=log, env=env, start_new_session=True,
            )  # fmt: skip
        wait_for(self._is_owner, f"{name} to be on the bus")

    def _is_owner(self) -> bool:
        assert self.process.poll() is None, f"the player of {self.name} ended"
        bus = self.device.bus
        if not bus.has_owner(self.name):
            return False
        return bus.bus_call("GetConnectionUnixProcessID", "s", self.name) == self.process.pid

    def emit(self, path: str, member: str, signature: str, *arguments: Any) -> None:
        interface = self._objects[path][0]
        variants = [GLib.Variant(*pair) for pair in zip(signature, arguments)]
        self.device.bus.call(
            self.name, path, _MOCK, "EmitSignal", "sssav", interface, member, signature, variants
        )

    def call(self, path: str, interface: str, method: str, signature: str = "", *args: Any) -> Any:
        return self.device.bus.call(self.name, path, interface, method, signature, *args)

    def calls(self, path: str, method: str) -> list[tuple]:
        """The arguments of every call of a method so far."""
        reply = self.device.bus.call(self.name, path, _MOCK, "GetMethodCalls", "s", method)
        return [tuple(args) for _time, args in reply]

    def stop(self) -> None:
        """The service crashes; returns when the bus knows."""
        self.process.kill()
        self.process.wait()
        wait_for(lambda: not self.device.bus.has_owner(self.name), f"{self.name} to be gone")

    def hang(self) -> None:
        self.process.send_signal(signal.SIGSTOP)

    def resume(self) -> None:
        self.process.send_signal(signal.SIGCONT)

    def close(self) -> None:
        self.process.kill()
        self.process.wait()


class Neighbourhood:
    """Plays services of one device and ends them with the test."""

    def __init__(self) -> None:
        self._neighbours: list[Neighbour] = []

    def play(self, device: Device, name: str, objects: dict[str, Any], **behaviour: Any) -> Neighbour:
        self._neighbours.append(Neighbour(device, name, objects, **behaviour))
        return self._neighbours[-1]

    def close(self) -> None:
        for neighbour in self._neighbours:
            neighbour.close()


class IoBox:
    """The I/O box monitor."""

    PATH = "/com/kelv/IOBoxMonitor"
    METHODS = {
        "GetIOBoxConnected": ("", "b", "ret = True"),
        "GetIOPortStatus": ("i", "s", "ret = 'enabled'"),
        "GetIOState": ("i", "s", "ret = 'open'"),
        "SetIOMode": ("iis", "", ""),
        "Storm": ("i", "", _STORM),
    }

    def __init__(
        self, neighbourhood: Neighbourhood, device: Device, ignored: Sequence[str] = (),
        **changed: tuple[str, str],
    ):  # fmt: skip
        """`changed` maps a method to the signature and the code of its answer; `ignored` have none."""
        methods = {**self.METHODS}
        for method, (signature, code) in changed.items():
            methods[method] = (methods[method][0], signature, code)
        listed = [(name, *rest) for name, rest in methods.items()]
        self.service = neighbourhood.play(
            device, IOBOX, {self.PATH: (IOBOX, {}, listed)}, ignored=ignored
        )

    def answer(self, method: str, signature: str, code: str) -> None:
        """Changes the answer of a method while the service runs."""
        arguments = self.METHODS[method][0]
        self.service.call(
            self.PATH, _MOCK, "AddMethod", "sssss", IOBOX, method, arguments, signature, code
        )

    def wait_told(self, modes: set[tuple]) -> None:
        """Returns when each of the modes was asked for, and each input's state after it."""
        wait_for(lambda: modes <= set(self.modes()), f"the modes {modes}")
        inputs = {(port,) for port, _level, mode in modes if mode != "out"}
        asked = lambda: set(self.service.calls(self.PATH, "GetIOState"))  # noqa: E731
        wait_for(lambda: inputs <= asked(), f"questions for the states of {inputs}")

    def report(self, number: int, word: str) -> None:
        self.service.emit(self.PATH, "IOStateChanged", "is", number, word)

    def modes(self) -> list[tuple]:
        """Every (port, level, mode) that the daemon asked for."""
        return self.service.calls(self.PATH, "SetIOMode")

    def storm(self, number: int) -> Pending:
        """Has 10,000 signals sent, ending with "open"; answered when the last one is out."""
        return self.service.device.bus.begin_call(IOBOX, self.PATH, IOBOX, "Storm", "i", number)


class Streamer:
    """The video streamer; `channels` maps channel numbers to their property "Enabled", or to none."""

    ROOT = "/com/kelv/Streamer/Video/Channel"
    INTERFACE = "com.kelv.Streamer.Video.Channel"

    def __init__(
        self, neighbourhood: Neighbourhood, device: Device, channels: dict[int, Any], **behaviour: Any
    ):
        objects: dict[str, Any] = {self.ROOT: (self.INTERFACE, {}, [])}
        for number, enabled in channels.items():
            properties = {"Name": "a view"} if enabled is None else {"Enabled": enabled}
            objects[f"{self.ROOT}/{number}"] = (self.INTERFACE, properties, [])
        self.service = neighbourhood.play(device, STREAMER, objects, **behaviour)

    def enable(self, channel: int, enabled: bool) -> None:
        self.emit(channel, "EnabledChanged", "b", enabled)

    def emit(self, channel: int, member: str, signature: str, *arguments: Any) -> None:
        self.service.emit(f"{self.ROOT}/{channel}", member, signature, *arguments)


class Coordinator:
    """The camera-control coordinator."""

    PATH = "/com/kelv/PTZ/Coordinator/1"

    def __init__(
        self, neighbourhood: Neighbourhood, device: Device, enabled: Optional[Any], **behaviour: Any
    ):
        properties = {"Model": "any"} if enabled is None else {"PTZEnabled": enabled}
        objects = {self.PATH: (COORDINATOR, properties, [])}
        self.service = neighbourhood.play(device, COORDINATOR, objects, **behaviour)

    def enable(self, enabled: bool) -> None:
        self.emit("PtzEnabledChanged", "ib", 1, enabled)

    def emit(self, member: str, signature: str, *arguments: Any) -> None:
        self.service.emit(self.PATH, member, signature, *arguments)


def neighbourhood_fixture() -> Iterator[Neighbourhood]:
    neighbours = Neighbourhood()
    yield neighbours
    neighbours.close()


def longest_wait(device: Device) -> float:
    """How long a caller waited at most, of many that did nothing but read, in units of the time scale."""
    longest = 0.0
    for _ in range(100):
        began = time.monotonic()
        device.call("GetNbrPorts", timeout=60)
        longest = max(longest, time.monotonic() - began)
    return longest / scale()


def threads(device: Device) -> set[str]:
    """The names of the daemon's threads."""
    return {comm.read_text().strip() for comm in Path(f"/proc/{device.pid}/task").glob("*/comm")}


def arrived() -> None:
    """Takes in the replies and signals that have come."""
    wait_for(lambda: True, "what has arrived")


def barrier(device: Device, changes: Signals, number: int) -> None:
    """Returns when every signal that the daemon has emitted so far is recorded.

    `number` is a port of the check backend in the same device, whose reports are not recorded.
    """
    device.call("SetVirtual", "ub", number, True)
    change = changes.wait(lambda change: change.port == number and change.virtual_trig)
    changes.received.remove(change)
