"""The storm: clients that call everything at once, the bus read along, and what must agree in quiet."""

import os
import random
import select
import socket
import string
import subprocess
import sys
import time
from pathlib import Path
from typing import Any, Iterator, Optional

from gi.repository import Gio, GLib

from harness import DBusError, Device, scale, wait_for
from harness.device import SETTINGS
from legacy_tool import BASE, INPUT, OUTPUT, SERVICE, Tool, text
from model import (
    ANY, CONNECTOR, CONTROL, LEGACY_PATH, LINE_STATES, NO_PORT, PROPERTIES, STATES, SUPERVISED, Model, Port,
)  # fmt: skip
from neighbours import threads
from producer import INTERFACE as EVENTS
from producer import Producer
from world import LAMP, OPTIONAL, VANISHING, World, make_ports

CLIENTS = 4
WINDOW = 6  # calls of a client that may wait for their replies
STORM_SECONDS = 4.0  # between two quiet points
HARM_SECONDS = 0.25  # between two deeds of the world
STALL_LIMIT = 0.25  # seconds, for a caller that only reads
MEMORY_LIMIT = 4096  # KiB of growth from the first quiet point to the last
PATHS = {name: "/" + name.replace(".", "/") for name in (CONTROL, SUPERVISED, CONNECTOR)}
DRIVEN = (PROPERTIES, *PATHS)

_SIGNED, _UNSIGNED = 2**31, 2**32
FIRST_MARKER = 3_000_000_000  # numbers of no port, for calls that are waited for on the bus
LONGEST_MESSAGE = 65537  # steps of a sequence, one more than a sequence may have
_NAMES = ("", "Door", " lead and trail ", "tab\there", "a;b=c[x]#", "back\\slash\\n", "Ünï ☂", "x" * 4096,
          "x" * 4097, "line\nbreak", "é" * 2048)  # fmt: skip


class Choice:
    """Calls at random."""

    def __init__(self, rng: random.Random):
        self.rng = rng

    def number(self) -> int:
        rng = self.rng
        return rng.choice((999, _UNSIGNED - 1, _SIGNED)) if rng.random() < 0.02 else rng.randrange(14)

    def name(self) -> str:
        if self.rng.random() < 0.5:
            return self.rng.choice(_NAMES)
        return "".join(self.rng.choices(string.ascii_letters + " ", k=self.rng.randrange(1, 40)))

    def flag(self) -> bool:
        return self.rng.random() < 0.5

    def steps(self) -> list:
        if self.rng.random() < 0.05:
            return [(index % 2 == 0, 0) for index in range(2000)]
        return [(self.flag(), self.rng.randrange(-1, 60)) for _ in range(self.rng.randrange(0, 8))]

    def call(self) -> tuple[str, str, str, str, GLib.Variant]:
        """Bus name, path, interface, method, arguments."""
        kind = self.rng.random()
        if kind < 0.25:
            return self._legacy()
        if kind < 0.45:
            return self._plain(SUPERVISED, *self._supervised())
        if kind < 0.50:
            return self._plain(CONNECTOR, *self._connector())
        return self._plain(CONTROL, *self._control())

    @staticmethod
    def _plain(name: str, method: str, signature: str = "", *args: Any):
        return name, PATHS[name], name, method, GLib.Variant(f"({signature})", args)

    def _control(self) -> tuple:
        rng, number = self.rng, self.number()
        direction = rng.choice(("input", "output", "input", "output", "sideways"))
        active = rng.choice(("open", "closed", "open", "closed", "ajar"))
        calls = [
            ("GetState", "u", number), ("SetState", "ub", number, self.flag()),
            ("IsConfigurable", "u", number), ("GetDirection", "u", number),
            ("SetDirection", "us", number, direction), ("GetActive", "u", number),
            ("SetActive", "ubs", number, self.flag(), active), ("GetNames", "u", number),
            ("SetName", "ubs", number, self.flag(), self.name()),
            ("SetVirtual", "ub", number, self.flag()), ("GetNbrPorts",), ("GetPortProps",),
        ]  # fmt: skip
        kind = rng.random()
        if kind < 0.05:
            return "StartActionSequence", "uba(bi)", number, self.flag(), self.steps()
        if kind < 0.08:
            return "DropIOPorts", "as", rng.sample([*OPTIONAL, "nobody", "contact"], rng.randrange(1, 3))
        if kind < 0.12:
            return ("RefreshIOPorts",)
        return rng.choice(calls)

    def _supervised(self) -> tuple:
        rng, number = self.rng, self.number() if self.flag() else self.rng.choice((6, 7, 8, 9))
        state = rng.choice((*STATES, "undefined", "ajar"))
        lower = rng.choice((0, 100, 3000, 65535, _SIGNED))
        return rng.choice((
            ("GetNumberOfPorts",), ("IsSupervisable", "u", number), ("GetSupervised", "u", number),
            ("SetSupervised", "ub", number, self.flag()),
            ("SetSupervisedRanges", "usuu", number, state, lower, lower + rng.randrange(0, 200)),
            ("GetSupervisedRanges", "u", number), ("GetSupervisedReadout", "u", number),
            ("GetSupervisedStates", "u", number), ("GetSupervisedPortNumbers",),
        ))  # fmt: skip

    def _connector(self) -> tuple:
        words = self.rng.choice(("*", "video connector", "AUDIO connector", "none"))
        return self.rng.choice(("GetNumConnectors", "GetConnectorStates")), "s", words

    def _legacy(self) -> tuple:
        path = f"{LEGACY_PATH}/{self.number()}"
        interface = self.rng.choice((BASE, INPUT, OUTPUT))
        name, value = self.rng.choice((
            ("Name", self.name()), ("Direction", self.rng.choice(("input", "output", "aside"))),
            ("Trig", self.rng.choice(("open", "closed", ""))),
            ("Active", self.rng.choice(("open", "closed"))),
            ("Button", self.rng.choice(("none", "pulse", "actinact", "knob"))),
            ("PulseTime", self.rng.randrange(-_SIGNED, _SIGNED)), ("DelayTime", self.rng.randrange(9999)),
            ("Mode", self.rng.choice(("monostable", "bistable", "unstable"))), ("NbrOfInputs", 1),
        ))  # fmt: skip
        kind = self.rng.random()
        if kind < 0.2:
            return SERVICE, path, PROPERTIES, "GetAll", GLib.Variant("(s)", (interface,))
        if kind < 0.5:
            return SERVICE, path, PROPERTIES, "Get", GLib.Variant("(ss)", (interface, name))
        variant = GLib.Variant("i", value) if isinstance(value, int) else text(value.encode() + b"\0")
        return SERVICE, path, PROPERTIES, "Set", GLib.Variant("(ssv)", (interface, name, variant))


class Client:
    def __init__(self, device: Device, choice: Choice):
        self._connection = device.bus.connect()
        self._choice = choice
        self.open = 0
        self.done = 0

    def go_on(self) -> None:
        while self.open < WINDOW:
            self.open += 1
            self._connection.call(*self._choice.call(), None, Gio.DBusCallFlags.NO_AUTO_START,
                                  600_000, None, self._take)  # fmt: skip

    def _take(self, connection: Gio.DBusConnection, result: Gio.AsyncResult) -> None:
        self.open -= 1
        self.done += 1
        try:
            connection.call_finish(result)
        except GLib.Error:
            pass  # the bus was read along

    def close(self) -> None:
        self._connection.close_sync(None)


class Wire:
    """A bare connection that is shown every message of the bus: GDBus would answer what it reads."""

    def __init__(self, address: str):
        self._socket = socket.socket(socket.AF_UNIX)
        self._socket.connect(address.removeprefix("unix:path="))
        self._socket.sendall(b"\0AUTH EXTERNAL " + str(os.geteuid()).encode().hex().encode() + b"\r\n")
        assert self._socket.recv(100).startswith(b"OK ")
        self._socket.sendall(b"BEGIN\r\n")
        self._data = bytearray()
        bus = "org.freedesktop.DBus"
        self._call(1, bus, "Hello")
        self._call(2, f"{bus}.Monitoring", "BecomeMonitor", GLib.Variant("(asu)", ([], 0)))
        wait_for(lambda: any(m.get_member() == "NameLost" for m in self.messages()), "the bus's reader")

    def _call(self, serial: int, interface: str, method: str, body: Optional[GLib.Variant] = None) -> None:
        bus = "org.freedesktop.DBus"
        call = Gio.DBusMessage.new_method_call(bus, "/org/freedesktop/DBus", interface, method)
        call.set_serial(serial)
        if body is not None:
            call.set_body(body)
        self._socket.sendall(call.to_blob(Gio.DBusCapabilityFlags.NONE))

    def messages(self) -> Iterator[Gio.DBusMessage]:
        """What has arrived since the last time."""
        while select.select([self._socket], [], [], 0)[0]:
            data = self._socket.recv(1 << 20)
            assert data, "the bus has closed the connection of its reader"
            self._data += data
        while len(self._data) >= 16:
            size = Gio.DBusMessage.bytes_needed(bytes(self._data[:16]))
            if len(self._data) < size:
                return
            blob = bytes(self._data[:size])
            del self._data[:size]
            yield Gio.DBusMessage.new_from_blob(blob, Gio.DBusCapabilityFlags.NONE)

    def close(self) -> None:
        self._socket.close()


class Reader:
    """Reads the whole bus along, in the order in which it passes messages on, for the model."""

    def __init__(self, device: Device, model: Model):
        self._model = model
        self._owner = device.bus.bus_call("GetNameOwner", "s", CONTROL)
        self._bus_id = "org.freedesktop.DBus"
        self.events: dict[int, Any] = {}
        self.modes: dict[int, tuple] = {}
        self.marker = 0
        self.declared_before: set[int] = set()  # before the bus was read along, or while
        self._wire = Wire(device.bus.address)

    def pump(self) -> None:
        for message in self._wire.messages():
            self._take(message)

    def _take(self, message: Gio.DBusMessage) -> None:
        kind = message.get_message_type()
        if kind == Gio.DBusMessageType.METHOD_CALL:
            self._on_call(message)
        elif kind == Gio.DBusMessageType.SIGNAL:
            if message.get_sender() == self._owner:
                self._on_signal(message)
        elif message.get_sender() in (self._owner, self._bus_id):
            key = (message.get_destination(), message.get_reply_serial())
            self._model.on_reply(key, message.get_error_name(), _body(message))

    def _on_call(self, message: Gio.DBusMessage) -> None:
        interface, member = message.get_interface(), message.get_member()
        if message.get_sender() == self._owner:
            if member == "SetIOMode" and message.get_destination() != self._bus_id:
                number, level, mode = _arguments(message)
                self.modes[number] = (level, mode)
            return
        to_daemon = message.get_destination() in (*PATHS, SERVICE, self._owner)
        if to_daemon and interface in DRIVEN:
            key, arguments = (message.get_sender(), message.get_serial()), _arguments(message)
            if member == "GetState" and arguments[0] > FIRST_MARKER:
                self.marker = arguments[0]
            self._model.on_call(key, message.get_path(), interface, member, arguments)

    def _on_signal(self, message: Gio.DBusMessage) -> None:
        member, arguments = message.get_member(), _arguments(message)
        if message.get_interface() == CONTROL:
            if member == "PortChanged":
                self._model.on_port_changed(arguments)
            elif member == "ActionSequenceDone":
                self._model.on_sequence_done(*arguments)
        elif message.get_interface() == EVENTS:
            self._on_event(member, *arguments)

    def _on_event(self, member: str, number: int, entry: Any = None) -> None:
        if member == "Declared":
            if number in self.events and number not in self.declared_before:
                self._model.complain(f"event {number} is declared twice")
            self.events[number] = entry
        elif number not in self.events:
            self._model.complain(f"{member} of event {number}, which is not declared")
        elif member == "Undeclared":
            del self.events[number]

    def close(self) -> None:
        self._wire.close()


def _arguments(message: Gio.DBusMessage) -> tuple:
    body = message.get_body()
    return body.unpack() if body is not None else ()


def _body(message: Gio.DBusMessage) -> Any:
    values = _arguments(message)
    return None if not values else values[0] if len(values) == 1 else values


class Probe:
    """The caller that only reads, in a process of its own."""

    def __init__(self, device: Device):
        process = device.bus._process
        assert process is not None
        self._log = device.folder / "probe.log"
        argv = [sys.executable, str(Path(__file__).with_name("probe.py")), device.bus.address,
                str(device.pid), str(process.pid)]  # fmt: skip
        with self._log.open("w") as log:
            self._process = subprocess.Popen(argv, stdout=log, stderr=subprocess.DEVNULL)

    def longest(self) -> tuple[float, float]:
        """Without and with the time without a processor, in seconds."""
        lines = self._log.read_text().splitlines()
        assert self._process.poll() is None and lines, "the probe ended"
        own, seen = lines[-1].split()
        return float(own), float(seen)

    def close(self) -> None:
        self._process.kill()
        self._process.wait()


class Soak:
    def __init__(self, device: Device, tree: Any, folder: Path, seed: int):
        rng = random.Random(seed)
        self.device, self.tree = device, tree
        self.model = Model(make_ports())
        self.world = World(device, tree, folder, random.Random(rng.random()))
        for text_ in ("Error: ", "Readout failed: ", "Failed to open spi device", "Failed to open"):
            device.allow_critical(text_)
        device.conf(self.world.document(self.model.ports))
        device.start()
        device.wait_name(SERVICE)
        self.producer = Producer(device)
        self.reader = Reader(device, self.model)
        self.reader.events = self.producer.declarations()
        self.reader.declared_before = set(self.reader.events)
        self.tool = Tool(device)
        self.clients = [Client(device, Choice(random.Random(rng.random()))) for _ in range(CLIENTS)]
        self._refuse_long_sequence()
        self.probe = Probe(device)
        self.figures: list[tuple[int, int, set[str]]] = []
        self.rounds = 0

    def run(self, seconds: float) -> None:
        end = time.monotonic() + seconds
        self._storm(STORM_SECONDS)
        self.check()
        while time.monotonic() < end:
            self._storm(STORM_SECONDS)
            self.check()

    def _refuse_long_sequence(self) -> None:
        """The longest message leaves the allocator with more memory than all others. It comes before
        the figures are taken: that GLib needs a tenth of a second to read it is not the daemon's."""
        steps = [(False, 0)] * LONGEST_MESSAGE
        try:
            self.device.call("StartActionSequence", "uba(bi)", 0, True, steps)
        except DBusError as error:
            assert error.name.endswith(".Generic"), error

    def _storm(self, seconds: float) -> None:
        context = GLib.MainContext.default()
        end = time.monotonic() + seconds
        harm_at = 0.0
        while time.monotonic() < end:
            for client in self.clients:
                client.go_on()
            context.iteration(False)
            self.reader.pump()
            if time.monotonic() > harm_at:
                self.world.do_harm()
                harm_at = time.monotonic() + HARM_SECONDS
            self._check_alive()

    def _check_alive(self) -> None:
        if not self.device.running:
            raise AssertionError("the daemon ended in the storm")

    def _pumped(self, condition) -> Any:
        self._check_alive()
        self.reader.pump()
        return condition()

    def _wait(self, condition, what: str, timeout: float = 30) -> Any:
        return wait_for(lambda: self._pumped(condition), what, timeout)

    # --- Quiet points ---

    def check(self) -> None:
        """Puts the world right, waits until all is quiet, and holds everything against the model."""
        self.rounds += 1
        self.world.heal()
        self._wait(lambda: not any(client.open for client in self.clients), "all replies", 60)
        self._wait(lambda: not any(p.running for p in self.model.ports), "the sequences to end", 60)
        self.device.call("DropIOPorts", "as", VANISHING, timeout=60)
        self.device.call("RefreshIOPorts", timeout=60)
        ids = {port.id for port in self.model.ports}
        self._wait(lambda: ids <= {props.id for props in self.device.port_props()}, "every port")
        self.world.tell()
        self._catch_up()
        for port in self.model.ports:
            port.here = True
            port.doubtful = False
            self._learn(port)
        self._compare()
        self.figures.append(self._figure())

    def _catch_up(self) -> None:
        """Everything that was asked for earlier is stored when this is, and has been read along."""
        self.tool.set(0, INPUT, "Name", f"Round {self.rounds}")
        marker = FIRST_MARKER + self.rounds
        try:
            self.device.call("GetState", "u", marker)
        except DBusError as error:
            assert error.name == NO_PORT, error
        self._wait(lambda: self.reader.marker == marker, "the bus to be read along")
        self._wait(lambda: not self.model.refreshes, "the replies of refreshes")

    def _learn(self, port: Port) -> None:
        """What can't be known is taken from the answers; the other ways to ask must agree with them."""
        if not port.takes_part:
            return
        known: dict[str, Any] = {}
        if port.kind != "output":
            values = self.tool.get_all(port.number, INPUT)
            known |= {"in_name": values["Name"], "low_in": values["Trig"] == "open"}
        if port.kind != "input":
            values = self.tool.get_all(port.number, OUTPUT)
            known |= {"out_name": values["Name"], "low_out": values["Active"] == "open",
                      "button": values["Button"], "pulse": values["PulseTime"],
                      "mode": values["Mode"], "delay": values["DelayTime"]}  # fmt: skip
        if port.kind == "io_ctrl":
            known["is_input"] = self.tool.get(port.number, BASE, "Direction") == "input"
        for name, value in known.items():
            if getattr(port, name) is None:
                setattr(port, name, value)
        if port.supervisable:
            self._learn_supervision(port)
        if port.raw is None and not port.follows_world:
            states = {props.number: props.state for props in self.device.port_props()}
            port.raw = states[port.number] != port.low

    def _learn_supervision(self, port: Port) -> None:
        if port.supervised is None:
            port.supervised = self._supervised("GetSupervised", port)
        if port.ranges is None:
            port.ranges = self._supervised("GetSupervisedRanges", port)

    def _supervised(self, method: str, port: Port) -> Any:
        return self.device.bus.call(
            SUPERVISED, PATHS[SUPERVISED], SUPERVISED, method, "u", port.number
        )

    def _compare(self) -> None:
        for port in self.model.ports:
            self._compare_port(port)
        self._expect("the properties", self.model._on_GetPortProps().values,
                     self.device.call("GetPortProps"))  # fmt: skip
        self._expect("the counts", self.model.counts(), self.device.call("GetNbrPorts"))
        self._compare_world()
        self._compare_legacy()
        self._compare_settings()
        self._compare_events()

    def _expect(self, what: str, wanted: Any, got: Any) -> None:
        if not wanted == got:
            if isinstance(wanted, set):
                wanted, got = wanted - got, got - wanted
            self.model.complain(f"quiet point {self.rounds}: {what}: {got}, and not {wanted}")

    def _converges(self, what: str, wanted: Any, ask) -> None:
        try:
            self._wait(lambda: wanted == ask(), what, 10)
        except TimeoutError:
            self._expect(what, wanted, ask())

    def _compare_port(self, port: Port) -> None:
        if not port.is_ioport:
            return
        ask = lambda method: self.device.call(method, "u", port.number)  # noqa: E731
        state = ask("GetState")
        self._expect(f"{port.id}: state", ANY if port.state is None else port.state, state)
        self._expect(f"{port.id}: names", (port.in_name, port.out_name), ask("GetNames"))
        words = {True: "open", False: "closed"}
        self._expect(f"{port.id}: levels", (words[port.low_in], words[port.low_out]), ask("GetActive"))
        if port.supervisable:
            now = tuple(self._supervised(method, port) for method in ("GetSupervised", "GetSupervisedRanges"))
            self._expect(f"{port.id}: supervision", (port.supervised, port.ranges), now)
        # An SPI line reports what was measured, and answers with what its pin says; a virtual port
        # has the state that a client reported.
        if port.shown is not None and port.backend not in ("spi", "virtual") and not port.follows_world:
            self._expect(f"{port.id}: the last PortChanged", port.shown, state)

    def _compare_world(self) -> None:
        """What devices and neighbours say comes through, and they were told what the ports have."""
        by_id = {port.id: port for port in self.model.ports}
        lamp, flag, line = by_id["lamp"], by_id["flag"], by_id["line"]
        self._expect("the lamp's line", lamp.raw, self.tree.read(LAMP, "value")[0] == "1")
        self._converges("the flag", self.world.flag != flag.low_in, lambda: self._state(flag))
        found = next((r[0] for r in reversed(line.ranges)
                      if r[1] <= self.world.level <= r[2]), "undefined")  # fmt: skip
        self._converges("the line", (found, self.world.level), lambda: self._supervised(
            "GetSupervisedReadout", line))  # fmt: skip
        for port in self.model.ports:
            if port.backend == "iobox":
                self._compare_box_port(port)
            # What the box says of a line that is both may cross with a step of a sequence on it.
            both = port.backend == "iobox" and port.kind == "io_ctrl"
            if port.follows_world and port.backend != "spi" and port.is_ioport and not both:
                self._converges(f"{port.id}: the last PortChanged",
                                ANY if port.shown is None else port.shown,
                                lambda port=port: self._state(port))  # fmt: skip
        triggers = {"manualtrigger1", "manualtrigger2"}
        self._converges("the triggers", triggers, lambda: {
            props.id for props in self.device.port_props() if props.id.startswith("manual")})  # fmt: skip

    def _state(self, port: Port) -> bool:
        return self.device.call("GetState", "u", port.number)

    def _compare_box_port(self, port: Port) -> None:
        if port.is_input:
            # The box judges the line; without supervision the tamper states read as their contact.
            value = LINE_STATES[self.world.box_words[port.number]]
            raw = value == 1 if port.supervised else value in (1, 2)
            state = False if port.supervised and value > 1 else raw != port.low
            self._converges(f"{port.id}: state", state, lambda: self._state(port))
        elif port.number in self.reader.modes:
            # What the box says of a line that is both comes through while it is an output, too.
            level = ANY if port.kind == "io_ctrl" else int(self._state(port) != port.low)
            self._converges(f"{port.id}: what the box was told", (level, "out"),
                            lambda: self.reader.modes[port.number])  # fmt: skip

    def _compare_legacy(self) -> None:
        numbers = {port.number for port in self.model.ports if port.takes_part}
        self._expect("the legacy objects", numbers, set(self.tool.numbers()))
        for port in self.model.ports:
            if not port.takes_part:
                continue
            for interface in (BASE, INPUT, OUTPUT):
                word = interface.rpartition(".")[2]
                if self.model._has(port, word):
                    self._expect(f"{port.id}: legacy {word}", self.model.legacy_values(port, word),
                                 self.tool.get_all(port.number, interface))  # fmt: skip

    def _compare_settings(self) -> None:
        file = GLib.KeyFile()
        file.load_from_file(str(self.device.path(SETTINGS)), GLib.KeyFileFlags.NONE)
        groups = file.get_groups()[0]
        for port in self.model.ports:
            if port.id in groups:
                self._compare_group(port, file)

    def _compare_group(self, port: Port, file: GLib.KeyFile) -> None:
        wanted: dict[str, Any] = {}
        if port.kind != "output":
            wanted |= {"input_name": port.in_name, "input_activelow": port.low_in}
        if port.kind != "input":
            wanted |= {"output_name": port.out_name, "output_activelow": port.low_out,
                       "button_type": port.button, "port_mode": port.mode,
                       "pulse_time": str(port.pulse % _UNSIGNED), "delay_time": str(port.delay)}  # fmt: skip
        if port.kind == "io_ctrl":
            wanted["input"] = port.is_input
        if port.supervisable:
            wanted["supervised_input"] = port.supervised
        for key, value in wanted.items():
            get = file.get_boolean if isinstance(value, bool) else file.get_string
            self._expect(f"settings of {port.id}: {key}", value, get(port.id, key))

    def _compare_events(self) -> None:
        def listed() -> set[tuple]:
            entries = self.producer.declarations().values()
            return {(e["keys"]["port"], e["keys"]["topic2"], e["nice_names"]["port"][1][:50])
                    for e in entries if "ManualTrigger" not in e["type"]}  # fmt: skip

        wanted = {(-1, "Port", "Any")}
        for port in self.model.ports:
            name = (port.in_name if port.is_input else port.out_name)[:50]
            if any("IOPort" in event for event in port.events):
                wanted.add((port.number, "Port", name))
            if port.backend == "spi" and port.supervised:
                wanted.add((port.number, "SupervisedPort", name))
        self._converges("the declared events", wanted, listed)
        self._converges("the events read along", set(self.producer.declarations()),
                        lambda: set(self.reader.events))  # fmt: skip

    # --- Figures ---

    def _figure(self) -> tuple[int, int, set[str]]:
        """Memory in KiB, descriptors and threads, at rest."""
        descriptors = self.device.descriptors_at_rest()
        return int(self.device.status("VmRSS").split()[0]), len(descriptors), threads(self.device)

    def growth(self) -> list[str]:
        """What is more after the storm than before."""
        (memory, descriptors, names), (memory_now, descriptors_now, names_now) = (
            self.figures[0], self.figures[-1])  # fmt: skip
        problems = []
        if not self.device.sanitized and memory_now > memory + MEMORY_LIMIT:
            problems.append(f"memory grew from {memory} to {memory_now} KiB")
        if descriptors_now > descriptors:
            problems.append(f"descriptors grew from {descriptors} to {descriptors_now}")
        if names_now - names:
            problems.append(f"threads were left: {names_now - names}")
        return problems

    def problems(self) -> list[str]:
        """What fails the run."""
        problems = [f"mismatch: {text_[:1500]}" for text_ in self.model.mismatches[:20]]
        problems += self.growth()
        if self.probe.longest()[0] > STALL_LIMIT * scale():
            problems.append(f"a caller waited for {self.probe.longest()[0] * 1000:.0f} ms")
        return problems

    def table(self) -> str:
        first, last = self.figures[0], self.figures[-1]
        own, seen = self.probe.longest()
        rows = [
            ("calls", sum(client.done for client in self.clients)),
            ("deeds of neighbours and devices", self.world.deeds),
            ("quiet points", self.rounds),
            ("mismatches", len(self.model.mismatches)),
            ("memory at the first and last quiet point, KiB", f"{first[0]} {last[0]}"),
            ("descriptors", f"{first[1]} {last[1]}"),
            ("threads", f"{len(first[2])} {len(last[2])}"),
            ("longest stall, ms", f"{own * 1000:.1f}"),
            ("  with the time without a processor, ms", f"{seen * 1000:.1f}"),
        ]
        return "\n".join(f"{name:48} {value}" for name, value in rows)

    def close(self) -> None:
        for part in (self.probe, *self.clients, self.reader, self.world):
            part.close()
