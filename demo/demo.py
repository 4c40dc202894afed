"""Runs the daemon in a simulated device and shows what its clients see.

On a terminal that is the live table of "portctl watch", elsewhere lines.
"""

import argparse
import errno
import os
import signal
import subprocess
import sys
import tempfile
import time
from pathlib import Path
from typing import Optional

sys.path.insert(0, str(Path(__file__).resolve().parent.parent / "tests/service"))

from gi.repository import GLib  # noqa: E402
from harness import DBusError, Device, NoMounts, PortChanged, PortProps, become_root, wait_for  # noqa: E402
from life import SUPERVISED_INTERFACE, Life, make_device  # noqa: E402
from neighbours import Neighbourhood  # noqa: E402

EVENT_PATH, EVENT_INTERFACE = "/com/kelv/Event/pcd", "com.kelv.Event.Producer"
CONNECTOR, CONNECTOR_PATH = "com.kelv.PCD.Connector", "/com/kelv/PCD/Connector"

_ENDS = (signal.SIGINT, signal.SIGTERM, signal.SIGHUP)

Names = dict[int, tuple[str, str]]  # by port number: as an input, as an output


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


def all_plugged_in(device: Device) -> bool:
    try:
        return all(connector_states(device))
    except DBusError:
        # The name may come before the object.
        return False


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


class End:
    """When to end: somebody interrupts, the time is up, or the daemon has ended.

    An interrupt that comes while a callback of the main loop runs would be lost as an exception.
    """

    def __init__(self, device: Device, seconds: Optional[float]):
        self._device = device
        self._deadline = float("inf") if seconds is None else time.monotonic() + seconds
        self._interrupted = False
        for number in _ENDS:
            GLib.unix_signal_add(GLib.PRIORITY_DEFAULT, number, self._interrupt)

    def _interrupt(self) -> bool:
        self._interrupted = True
        return GLib.SOURCE_CONTINUE

    def reached(self) -> bool:
        time_is_up = time.monotonic() >= self._deadline
        return self._interrupted or time_is_up or not self._device.running


def print_lines(device: Device, life: Life, end: End) -> None:
    """Shows every change and every event until the time is up or somebody interrupts."""
    events = device.signals("Sent", interface=EVENT_INTERFACE, path=EVENT_PATH)
    with device.signals() as signals, events:
        names = print_table(device)
        begin = time.monotonic()

        def over() -> bool:
            for change in signals.take():
                if change.port not in names:
                    # It came back into service after the table was printed.
                    names[change.port] = names_of(device, change.port)
                print_change(change, names, time.monotonic() - begin)
            for sent in events.take():
                print_event(sent, time.monotonic() - begin)
            life.restart_if_due()
            return end.reached()

        wait_for(over, "the end of the demo", float("inf"))


def say_line(text: str) -> None:
    print(f"        {text}", flush=True)


class LiveTable:
    """portctl watch on our terminal, which also shows what we say."""

    def __init__(self, device: Device, portctl: Path, folder: Path):
        self._notes = folder / "notes"
        os.mkfifo(self._notes)
        # For a second terminal. A socket's path must be short, and the folder's may be long.
        self._helper = folder / "portctl"
        bus = folder / "bus"
        bus.symlink_to(device.sandbox.under_root("/run/dbus/system_bus_socket"))
        self._helper.write_text(
            f'#!/bin/sh\nexec 9<"{folder}"\n'
            f'exec "{portctl}" --address unix:path=/proc/self/fd/9/{bus.name} "$@"\n'
        )
        self._helper.chmod(0o755)
        folder.chmod(0o755)
        self._command = [
            portctl, "--address", device.bus.address, "watch", "--title", "portd demo",
            "--notes", self._notes,
        ]  # fmt: skip
        self._file = os.open(self._notes, os.O_RDWR | os.O_NONBLOCK)
        self._process: Optional[subprocess.Popen] = None

    def start(self) -> None:
        self._process = subprocess.Popen(self._command)
        self.say("A device lives here: q ends it. See what happens below the table.")
        self.say(f"Talk to it from a second terminal: {self._helper} set relay on")

    def say(self, text: str) -> None:
        try:
            os.write(self._file, f"- {text}\n".encode())
        except BlockingIOError:
            pass  # nobody reads: the table is about to end

    @property
    def running(self) -> bool:
        return self._process is not None and self._process.poll() is None

    def close(self) -> int:
        if self._process is not None:
            if self.running:
                self._process.terminate()
            self._process.wait()
        os.close(self._file)
        return self._process.returncode if self._process else 0


def show_table(life: Life, table: LiveTable, end: End) -> None:
    table.start()

    def over() -> bool:
        life.restart_if_due()
        return end.reached() or not table.running

    wait_for(over, "the end of the demo", float("inf"))


def run(arguments: argparse.Namespace, device: Device, life: Life, folder: Path) -> int:
    device.start()
    wait_for(lambda: all_plugged_in(device), "the first look at the connector")
    device.wait_name(SUPERVISED_INTERFACE)
    end = End(device, arguments.seconds)
    if not (sys.stdout.isatty() and sys.stdin.isatty()):
        life.begin(say_line)
        print_lines(device, life, end)
        return 0
    table = LiveTable(device, arguments.portctl, folder)
    try:
        life.begin(table.say)
        show_table(life, table, end)
    finally:
        status = table.close()
    return status


def parse_arguments() -> argparse.Namespace:
    parser = argparse.ArgumentParser(prog="demo", description=__doc__)
    parser.add_argument("--binary", type=Path, required=True, help=argparse.SUPPRESS)
    parser.add_argument("--seconds", type=float, help="end by itself after this time")
    arguments = parser.parse_args()
    arguments.portctl = (arguments.binary.parent / "portctl/portctl").absolute()
    return arguments


def main() -> int:
    arguments = parse_arguments()
    for number in _ENDS:
        signal.signal(number, signal.default_int_handler)
    try:
        become_root()
    except NoMounts as error:
        print(error, file=sys.stderr)
        return 1
    status = 0
    with tempfile.TemporaryDirectory(prefix="portd-demo-") as name:
        folder = Path(name)
        neighbourhood = Neighbourhood()
        parts = make_device(folder / "device", arguments.binary)
        life = Life(parts, neighbourhood)
        try:
            life.prepare()
            status = run(arguments, parts.device, life, folder)
        except KeyboardInterrupt:
            pass
        except OSError as error:
            # The terminal is gone: nobody is left to tell.
            if error.errno not in (errno.EIO, errno.EPIPE):
                raise
        finally:
            # A second signal must not cut the cleaning up short.
            for number in _ENDS:
                signal.signal(number, signal.SIG_IGN)
            life.end()
            neighbourhood.close()
            problems = parts.close()
    for problem in problems:
        print(problem, file=sys.stderr)
    return 1 if problems or status else 0


sys.exit(main())
