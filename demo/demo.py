"""Runs the daemon in a simulated device and shows what its clients see."""

import argparse
import signal
import sys
import tempfile
import time
from pathlib import Path
from typing import Optional

sys.path.insert(0, str(Path(__file__).resolve().parent.parent / "tests/service"))

from gi.repository import GLib  # noqa: E402
from harness import DBusError, Device, PortChanged, PortProps, become_root, wait_for  # noqa: E402
from neighbours import IoBox, Neighbourhood, Streamer  # noqa: E402

DOOR, MOTION, MODULE = "/run/demo/door", "/run/demo/motion", "/run/demo/module"
PLUG = "/run/demo/plug"
RELAY, CONFIGURABLE, ALARM, BOX, TRIGGER = 3, 4, 5, 8, 21

EVENT_PATH, EVENT_INTERFACE = "/com/kelv/Event/pcd", "com.kelv.Event.Producer"
CONNECTOR, CONNECTOR_PATH = "com.kelv.PCD.Connector", "/com/kelv/PCD/Connector"

Names = dict[int, tuple[str, str]]  # by port number: as an input, as an output


class Life:
    """The simulated device: inputs that move by themselves, and a client that switches outputs."""

    def __init__(self, device: Device, neighbourhood: Neighbourhood):
        self._device = device
        self._neighbourhood = neighbourhood
        self._tick = 0
        self._states = {DOOR: False, RELAY: False, ALARM: False, BOX: False, TRIGGER: False}

    def prepare(self) -> None:
        self._device.conf((Path(__file__).parent / "conf.xml").read_text())
        for attribute, value in ((DOOR, 0), (MOTION, 0), (PLUG, 1)):
            self._device.write(attribute, f"{value}\n").chmod(0o666)
        self._box = IoBox(self._neighbourhood, self._device)
        Streamer(self._neighbourhood, self._device, {1: True, 2: True})

    def tick(self) -> bool:
        """One second of the device's life."""
        self._tick += 1
        if self._tick % 3 == 0:
            self._device.write(DOOR, f"{int(self._toggle(DOOR))}\n")
        if self._tick % 4 == 0:
            self._client("SetState", "ub", RELAY, self._toggle(RELAY))
        if self._tick % 5 == 0:
            self._device.write(MOTION, "1\n")
        if self._tick % 7 == 0:
            self._client("SetVirtual", "ub", ALARM, self._toggle(ALARM))
        if self._tick % 5 == 1:
            self._box.report(BOX, "closed" if self._toggle(BOX) else "open")
        if self._tick % 5 == 3:
            self._client("SetVirtual", "ub", TRIGGER, self._toggle(TRIGGER))
        if self._tick == 6:
            self._plug_in()
        if self._tick % 9 == 0:
            self._turn_round()
        return GLib.SOURCE_CONTINUE

    def _toggle(self, what: str | int) -> bool:
        self._states[what] = not self._states[what]
        return self._states[what]

    def _client(self, method: str, signature: str = "", *args) -> None:
        shown = ", ".join(str(arg) for arg in args)
        print(f"        client: {method}({shown})", flush=True)
        self._device.begin_call(method, signature, *args)

    def _plug_in(self) -> None:
        print("        device: a module is plugged in", flush=True)
        self._device.write(MODULE, "1\n")
        self._client("RefreshIOPorts")

    def _turn_round(self) -> None:
        direction = "output" if self._tick % 2 else "input"
        self._client("SetDirection", "us", CONFIGURABLE, direction)


def role(port: PortProps) -> str:
    direction = "input" if port.input else "output"
    return f"configurable {direction}" if port.configurable else direction


def shown_name(names: Names, number: int, is_input: bool) -> str:
    return names[number][0 if is_input else 1]


def names_of(device: Device, number: int, identifier: str = "") -> tuple[str, str]:
    """A port that is not one of the device's own, such as a manual trigger, has only its identifier."""
    try:
        return device.call("GetNames", "u", number)
    except DBusError:
        return identifier, identifier


def connector_states(device: Device) -> list[int]:
    arguments = ("GetConnectorStates", "s", "video connector")
    return device.bus.call(CONNECTOR, CONNECTOR_PATH, CONNECTOR, *arguments)


def print_table(device: Device) -> Names:
    """Prints the ports that are in service, and gives their names by number."""
    ports = sorted(device.port_props(), key=lambda port: port.number)
    names = {port.number: names_of(device, port.number, port.id) for port in ports}
    inputs, outputs = device.call("GetNbrPorts")
    print(f"{len(ports)} ports in service, {inputs} inputs and {outputs} outputs\n")
    row = "{:>2}  {:<16}{:<26}{:<22}{:<10}{}"
    print(row.format("No", "Identifier", "Name", "Role", "State", "Flags"))
    for port in ports:
        name = shown_name(names, port.number, port.input)
        state = "active" if port.state else "inactive"
        flags = " ".join(sorted(flag for flag, value in port.flags.items() if value))
        print(row.format(port.number, port.id, name, role(port), state, flags))
    states = connector_states(device)
    plugged = sum(states)
    print(f"\n{len(states)} video connector, {plugged} of them plugged in\n", flush=True)
    return names


def print_change(change: PortChanged, names: Names, elapsed: float) -> None:
    name = shown_name(names, change.port, change.input)
    state = "active" if change.state else "inactive"
    direction = "input" if change.input else "output"
    source = ", set by a client" if change.virtual_trig else ""
    line = f"port {change.port} {name:<26}{direction:<7}{state}{source}"
    print(f"{elapsed:6.1f}s  {line}", flush=True)


def print_event(sent: tuple, elapsed: float) -> None:
    number, keys = sent
    shown = ", ".join(f"{key} {value}" for key, value in keys.items() if key[:5] != "topic")
    print(f"{elapsed:6.1f}s  event {number}: {shown}", flush=True)


def watch(device: Device, neighbourhood: Neighbourhood, seconds: Optional[float]) -> None:
    """Shows every change and every event until the time is up or somebody interrupts."""
    life = Life(device, neighbourhood)
    life.prepare()
    device.start()
    wait_for(lambda: all(connector_states(device)), "the first look at the connector")
    events = device.signals("Sent", interface=EVENT_INTERFACE, path=EVENT_PATH)
    with device.signals() as signals, events:
        names = print_table(device)
        begin = time.monotonic()
        ticker = GLib.timeout_add_seconds(1, life.tick)

        def over() -> bool:
            for change in signals.take():
                if change.port not in names:
                    # It came back into service after the table was printed.
                    names[change.port] = names_of(device, change.port)
                print_change(change, names, time.monotonic() - begin)
            for sent in events.take():
                print_event(sent, time.monotonic() - begin)
            time_is_up = seconds is not None and time.monotonic() - begin >= seconds
            return time_is_up or not device.running

        try:
            wait_for(over, "the end of the demo", float("inf"))
        finally:
            GLib.source_remove(ticker)


def parse_arguments() -> argparse.Namespace:
    parser = argparse.ArgumentParser(prog="demo", description=__doc__)
    parser.add_argument("--binary", type=Path, required=True, help=argparse.SUPPRESS)
    parser.add_argument("--seconds", type=float, help="end by itself after this time")
    return parser.parse_args()


def main() -> int:
    arguments = parse_arguments()
    signal.signal(signal.SIGTERM, signal.getsignal(signal.SIGINT))
    become_root()
    with tempfile.TemporaryDirectory(prefix="portd-demo-") as folder:
        device = Device(Path(folder), arguments.binary)
        neighbourhood = Neighbourhood()
        try:
            watch(device, neighbourhood, arguments.seconds)
        except KeyboardInterrupt:
            print()
        finally:
            neighbourhood.close()
            problems = device.close()
    for problem in problems:
        print(problem, file=sys.stderr)
    return 1 if problems else 0


sys.exit(main())
