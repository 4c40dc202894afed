"""What the daemon has to answer: its ports, moved by the calls in the order in which the bus passes them on.

An attribute whose value can't be known (a sequence was cut short, a refresh of a hung box is under
way) is None until an answer tells it. What a neighbour or a device decides is never predicted.
"""

from collections import deque
from dataclasses import dataclass, field
from typing import Any, Callable, Optional

CONTROL = "com.kelv.IOControl.State"
SUPERVISED = "com.kelv.IOSupervised.Supervised"
CONNECTOR = "com.kelv.PCD.Connector"
LEGACY = "com.kelv.Configuration.Legacy.IOControl1."
LEGACY_PATH = "/com/kelv/Configuration/Legacy/IOControl/IOPort"
PROPERTIES = "org.freedesktop.DBus.Properties"
NO_PORT = "com.kelv.IOControl.Error.No_port"
BUSY = "com.kelv.IOControl.Error.Busy"
INVALID = "org.freedesktop.DBus.Error.InvalidArgs"
# What is answered while the legacy objects and their name are made anew.
GONE = (
    "org.freedesktop.DBus.Error.NameHasNoOwner",
    "org.freedesktop.DBus.Error.ServiceUnknown",
    "org.freedesktop.DBus.Error.UnknownMethod",
    "org.freedesktop.DBus.Error.UnknownObject",
)
STATES = ("closed", "open", "short", "cut")
LINE_STATES = {"closed": 1, "open": 0, "short": 2, "cut": 3}
LONGEST_NAME = 4096
MOST_STEPS = 65536
FIRST_TRIGGER = 14


class Any_:
    """Equals everything."""

    def __eq__(self, _other: object) -> bool:
        return True

    def __ne__(self, _other: object) -> bool:
        return False

    def __repr__(self) -> str:
        return "any"


ANY = Any_()


@dataclass
class Answer:
    """What a call may be answered: some values, some errors. `learn` takes in what is unknown."""

    values: Any = ()
    errors: tuple[str, ...] = ()
    may_succeed: bool = True
    learn: Optional[Callable[[Any], None]] = None

    def allows(self, error: Optional[str], values: Any) -> bool:
        if error is not None:
            return any(error == name or name.endswith("*") and error.startswith(name[:-1])
                       for name in self.errors)  # fmt: skip
        return self.may_succeed and (self.values == values)


def refused(*errors: str) -> Answer:
    return Answer(errors=errors, may_succeed=False)


def control_error(word: str) -> Answer:
    return refused(f"com.kelv.IOControl.Error.{word}")


@dataclass
class Port:
    id: str
    number: int
    kind: str  # "input", "output" or "io_ctrl"
    backend: str
    flags: frozenset[str]
    optional: bool = False
    follows_world: bool = False  # its state is what a neighbour or a device says
    events: tuple[str, ...] = ()
    in_name: str = ""
    out_name: str = ""
    supervised: Optional[bool] = False
    ranges: Optional[list] = field(default_factory=list)
    here: Optional[bool] = True  # in service; None: as a pending refresh decides
    is_input: Optional[bool] = True
    low_in: Optional[bool] = False
    low_out: Optional[bool] = False
    raw: Optional[bool] = False
    button: Optional[str] = "none"
    pulse: Optional[int] = 0
    delay: Optional[int] = 0
    mode: Optional[str] = "bistable"
    expected: deque = field(default_factory=deque)  # signals to come: fields, and whether they must
    shown: Optional[bool] = None  # the state that PortChanged said last
    serving: Any = None  # the call that is being looked at
    starts: int = 0  # calls that may yet start a sequence
    running: int = 0  # sequences that were started and have not ended
    ending: set = field(default_factory=set)  # calls under way when a sequence ended
    touched: int = 0  # counts what may have changed the state
    history: deque = field(default_factory=lambda: deque(maxlen=16))  # the last calls
    doubtful: bool = False  # dropped while a refresh was under way

    def __post_init__(self) -> None:
        self.is_input = self.kind != "output"

    @property
    def is_ioport(self) -> bool:
        return "ioport" in self.flags

    @property
    def takes_part(self) -> bool:
        return bool(self.flags & {"ioport", "virtual"})

    @property
    def supervisable(self) -> bool:
        return self.backend == "iobox" or (self.backend == "spi" and self.kind != "output")

    @property
    def loose(self) -> bool:
        """Whether a sequence may move the port, at any moment."""
        return bool(self.starts or self.running or self.ending)

    @property
    def state(self) -> Optional[bool]:
        low = self.low_in if self.is_input else self.low_out
        if None in (self.raw, self.is_input, low) or self.follows_world or self.loose:
            return None
        return self.raw != low

    @property
    def low(self) -> Optional[bool]:
        return None if self.is_input is None else self.low_in if self.is_input else self.low_out

    def expect(self, trig: bool, state: Optional[bool], must: bool = True) -> None:
        """One signal PortChanged is to come, or may where a sequence may have its turn first."""
        self.touched += 1
        if not self.follows_world:
            must = must and not self.loose
            fields = (self.number, "virtual" in self.flags, "hidden" in self.flags,
                      _or_any(self.is_input), trig, _or_any(state), _or_any(self.low))  # fmt: skip
            self.expected.append((fields, must, self.serving))

    def drive(self, state: bool) -> None:
        """The level that gives the state is written, and a change is told."""
        old = self.state
        self.touched += 1
        self.raw = None if self.loose or self.low_out is None else state != self.low_out
        now = self.state
        if old is None or now is None or old != now:
            self.expect(False, now, must=None not in (old, now))

    def turn(self, to_input: bool, must: bool = True) -> None:
        self.is_input = to_input
        self.touched += 1
        self.expect(False, self.state, must)

    def set_low(self, low: bool, of_input: bool) -> None:
        if of_input:
            old, self.low_in = self.low_in, low
            if old != low and self.is_input is not False:
                self.expect(False, self.state, must=None not in (old, self.is_input))
            return
        old, self.low_out = self.low_out, low
        if old != low and self.is_input is not True:
            raw = None if None in (old, self.is_input) or self.loose else self.raw
            self.raw, before = raw, self.state
            # The line flips, so that what the port says of itself stays.
            self.touched += 1
            if raw is None:
                self.expect(False, None, must=False)
            else:
                self.raw = (low == raw) != low
                if before is None or self.state != before:
                    self.expect(False, self.state, must=before is not None)

    def report(self, state: bool) -> None:
        """A client reports a state."""
        if self.backend == "virtual" and self.kind == "output":
            self.raw = None if self.loose else state
        self.expect(True, state)

    def forget(self, *names: str) -> None:
        for name in names:
            other_side = {"in": "output", "low_in": "output", "out": "input", "low_out": "input"}.get(
                name.removesuffix("_name"), "")  # fmt: skip
            if self.kind != other_side and not (name == "is_input" and self.kind != "io_ctrl"):
                setattr(self, name, None)
        self.touched += 1


def _or_any(value: Any) -> Any:
    return ANY if value is None else value


class Model:
    def __init__(self, ports: list[Port]):
        self.ports = ports
        self.refreshes: set = set()  # calls of RefreshIOPorts without their reply
        self.renewals: set = set()  # calls that may renew the legacy objects, without their reply
        self.open: dict = {}  # calls without their reply
        self.by_number = {port.number: port for port in ports}
        self.mismatches: list[str] = []

    # --- The stream of the bus ---

    def on_call(self, key: Any, path: str, interface: str, member: str, args: tuple) -> None:
        answer, port = self._predict(key, path, interface, member, args)
        renewed = bool(self.renewals)
        if member in ("DropIOPorts", "RefreshIOPorts"):
            self.renewals.add(key)
        if interface == PROPERTIES and renewed:
            answer.errors = (*answer.errors, *GONE, NO_PORT)
            if port is not None and member == "Set":
                self._doubt_write(port, args[1])
        text = f"{interface.rpartition('.')[2]}.{member}{args}"[:160]
        if port is not None:
            port.history.append(text)
        self.open[key] = (answer, port, member, text)

    def on_reply(self, key: Any, error: Optional[str], values: Any) -> None:
        found = self.open.pop(key, None)
        if found is None:
            return
        answer, port, member, text = found
        if not answer.allows(error, values):
            wanted = answer.errors if not answer.may_succeed else (answer.values, *answer.errors)
            self.complain(f"{text} is answered {error or values}, and not {wanted}", port)
        if error is None and answer.learn:
            answer.learn(values)
        if key in self.refreshes:
            self._on_refreshed(key)
        self.renewals.discard(key)
        if port is not None:
            if member == "StartActionSequence" and answer.may_succeed:
                port.starts -= 1
                port.running += error is None
                # What was asked for since the sequence ended counted on nothing either.
                port.ending |= self._open_calls(port)
            port.ending.discard(key)
            self._expire(port, key)

    def _expire(self, port: Port, key: Any) -> None:
        """What a call is to signal comes before its answer."""
        for fields, must, of in list(port.expected):
            if of == key:
                port.expected.remove((fields, must, of))
                if must:
                    self.complain(f"{port.id}: PortChanged{fields} did not come", port)

    def _on_refreshed(self, key: Any) -> None:
        """What needs no neighbour is back, unless it was dropped again meanwhile."""
        self.refreshes.discard(key)
        if not self.refreshes:
            for port in self.ports:
                if port.here is None and not port.follows_world and not port.doubtful:
                    port.here = True

    def on_port_changed(self, fields: tuple) -> None:
        port = self.by_number.get(fields[0])
        if port is None:
            if fields[0] < FIRST_TRIGGER:
                self.complain(f"PortChanged of an unknown port {fields}")
            return
        port.history.append(f"changed{fields}")
        if not fields[4]:
            port.shown = fields[5]
        if port.follows_world or port.loose:
            return
        while port.expected:
            wanted, must, _key = port.expected.popleft()
            if wanted == fields:
                if not must:
                    self._weaken(port, fields)
                return
            if must:
                self.complain(f"{port.id}: PortChanged{fields} comes in place of {wanted}", port)
                return
        self.complain(f"{port.id}: PortChanged{fields} has no cause", port)

    @staticmethod
    def _weaken(port: Port, fields: tuple) -> None:
        """The signal may have been a later one, with the one before left out."""
        port.expected = deque(
            (wanted, must and wanted != fields, key) for wanted, must, key in port.expected
        )

    def on_sequence_done(self, number: int) -> None:
        port = self.by_number.get(number)
        if port is None:
            return
        port.running -= 1
        port.history.append("sequence done")
        # Calls that came before may have been served before or after the end.
        port.ending |= self._open_calls(port)
        port.forget("raw")

    def _open_calls(self, port: Port) -> set:
        return {key for key, (_, of, *_rest) in self.open.items() if of is port}

    def complain(self, text: str, port: Optional[Port] = None) -> None:
        after = f"\n    after {list(port.history)}" if port else ""
        self.mismatches.append(text + after)

    # --- Calls ---

    def _predict(
        self, key: Any, path: str, interface: str, member: str, args: tuple
    ) -> tuple[Answer, Optional[Port]]:
        if interface == PROPERTIES:
            return self._legacy(key, path, member, args)
        if member == "RefreshIOPorts":
            self.refreshes.add(key)
            return self._refresh(), None
        plain = getattr(self, f"_on_{member}", None)
        if plain is not None:
            return plain(*args), None
        of_port = getattr(self, f"_of_{member}", None)
        if of_port is None:
            return Answer(ANY, ("*",)), None
        return self._of_port(key, of_port, interface, member, args)

    # Methods that serve ports that are only virtual too; the others want one of the device's own.
    _ANY_PORT = ("SetVirtual", "StartActionSequence", "SetSupervisedRanges", "GetSupervisedRanges",
                 "GetSupervisedReadout", "GetSupervisedStates")  # fmt: skip

    def _of_port(
        self, key: Any, serve: Callable, interface: str, member: str, args: tuple
    ) -> tuple[Answer, Optional[Port]]:
        no_port = NO_PORT if interface == CONTROL else "com.kelv.IOSupervised.Error.No_port"
        if args[0] >= FIRST_TRIGGER and args[0] < FIRST_TRIGGER + 100:
            return Answer(ANY, ("*",)), None  # a manual trigger, as long as there is a streamer
        port = self.by_number.get(args[0])
        serves = port and (port.takes_part if member in self._ANY_PORT else port.is_ioport)
        if not serves or port.here is False:
            return refused(no_port), None
        port.serving = key
        answer = serve(port, *args[1:])
        if port.here is None:
            self._doubt(port, member)
            answer.values, answer.errors, answer.may_succeed = ANY, ("*",), answer.may_succeed
        return answer, port

    def _doubt(self, port: Port, member: str) -> None:
        """The call may have changed something, or found no port."""
        changes = {
            "SetDirection": ("is_input",), "SetActive": ("low_in", "low_out"),
            "SetName": ("in_name", "out_name"), "SetSupervised": ("supervised",),
            "SetSupervisedRanges": ("ranges",),
        }  # fmt: skip
        port.forget("raw", *changes.get(member, ()))
        self._relax(port)

    def _relax(self, port: Port) -> None:
        """No signal that is expected has to come, and none that comes is a surprise."""
        port.expected = deque((fields, False, key) for fields, _must, key in port.expected)

    def _of_GetState(self, port: Port) -> Answer:
        touched = port.touched

        def learn(state: bool) -> None:
            if port.touched == touched and not port.loose and port.low is not None:
                port.raw = state != port.low

        unknown = port.state is None
        return Answer(_or_any(port.state), learn=learn if unknown else None)

    def _of_SetState(self, port: Port, state: bool) -> Answer:
        if port.is_input is None:
            port.forget("raw")
            port.expect(False, None, must=False)
            return Answer(ANY, ("com.kelv.IOControl.Error.Not_output",))
        if port.is_input or port.backend == "virtual":
            return control_error("Not_output")
        port.drive(state)
        return Answer(None)

    def _of_IsConfigurable(self, port: Port) -> Answer:
        return Answer(port.kind == "io_ctrl")

    def _of_GetDirection(self, port: Port) -> Answer:
        return Answer(ANY if port.is_input is None else "input" if port.is_input else "output")

    def _of_SetDirection(self, port: Port, word: str) -> Answer:
        if word not in ("input", "output"):
            return control_error("Generic")
        if port.kind != "io_ctrl":
            return control_error("Not_configurable")
        self._stop_sequence(port)
        port.turn(word == "input")
        return Answer(None)

    def _stop_sequence(self, port: Port) -> None:
        if port.loose:
            port.forget("raw")

    def _of_GetActive(self, port: Port) -> Answer:
        words = {True: "open", False: "closed", None: ANY}
        return Answer((words[port.low_in], words[port.low_out]))

    def _of_SetActive(self, port: Port, of_input: bool, word: str) -> Answer:
        if word not in ("open", "closed") or port.kind == ("output" if of_input else "input"):
            return control_error("Generic")
        self._stop_sequence(port)
        port.set_low(word == "open", of_input)
        return Answer(None)

    def _of_GetNames(self, port: Port) -> Answer:
        return Answer((_or_any(port.in_name), _or_any(port.out_name)))

    def _of_SetName(self, port: Port, of_input: bool, name: str) -> Answer:
        too_long = len(name.encode()) > LONGEST_NAME
        if too_long or port.kind == ("output" if of_input else "input"):
            return control_error("Generic")
        setattr(port, "in_name" if of_input else "out_name", name)
        return Answer(None)

    def _of_SetVirtual(self, port: Port, state: bool) -> Answer:
        port.report(state)
        return Answer(None)

    def _of_StartActionSequence(self, port: Port, virtual: bool, steps: list) -> Answer:
        if not steps or len(steps) > MOST_STEPS:
            return control_error("Generic")
        may_drive = not port.is_input and port.backend != "virtual"
        if not virtual and not may_drive and port.is_input is not None:
            return refused(BUSY, "com.kelv.IOControl.Error.Not_output")
        self._relax(port)
        port.forget("raw")
        port.starts += 1
        return Answer(None, (BUSY, "com.kelv.IOControl.Error.Not_output"))

    def _of_IsSupervisable(self, port: Port) -> Answer:
        return Answer((port.supervisable, False))

    def _of_GetSupervised(self, port: Port) -> Answer:
        return Answer(_or_any(port.supervised))

    def _of_SetSupervised(self, port: Port, on: bool) -> Answer:
        if not port.supervisable:
            return refused("com.kelv.IOSupervised.Not_supervisable") if on else Answer(None)
        port.supervised = on
        return Answer(None)

    def _supervisable(self, port: Port, answer: Callable[[], Answer]) -> Answer:
        if not port.supervisable:
            return refused("com.kelv.IOSupervised.Not_supervisable")
        return answer()

    def _of_SetSupervisedRanges(self, port: Port, state: str, lower: int, upper: int) -> Answer:
        def change() -> Answer:
            low, high = (n - 2**32 if n >= 2**31 else n for n in (lower, upper))
            if not (low < 65536 and high < 65536 and low < high) or state not in STATES:
                return refused("com.kelv.IOSupervised.Bad_supervised_range")
            if port.ranges is not None:
                port.ranges = [r for r in port.ranges if r[0] != state] + [(state, lower, upper)]
            return Answer(None)

        return self._supervisable(port, change)

    def _of_GetSupervisedRanges(self, port: Port) -> Answer:
        values = ANY if port.ranges is None else list(port.ranges)
        return self._supervisable(port, lambda: Answer(values))

    def _of_GetSupervisedReadout(self, port: Port) -> Answer:
        errors = ("com.kelv.IOSupervised.Error.Generic",)
        return self._supervisable(port, lambda: Answer(ANY, errors))

    def _of_GetSupervisedStates(self, port: Port) -> Answer:
        states = [(state,) for state in STATES]
        return self._supervisable(port, lambda: Answer((4, states)))

    # --- Calls about all ports ---

    def _certain(self) -> bool:
        return all(port.here is not None and port.is_input is not None for port in self.ports)

    def counts(self) -> tuple[int, int]:
        roles = [port.is_input for port in self.ports if port.here and port.is_ioport]
        return roles.count(True), roles.count(False)

    def _on_GetNbrPorts(self) -> Answer:
        return Answer(self.counts() if self._certain() else ANY)

    def _on_GetNumberOfPorts(self) -> Answer:
        return self._on_GetNbrPorts()

    def _on_GetSupervisedPortNumbers(self) -> Answer:
        if not self._certain():
            return Answer(ANY)
        return Answer(_Unordered(port.number for port in self.ports if port.here and port.supervisable))

    def connectors(self, words: str) -> list[Port]:
        video = words == "*" or words.lower() == "video connector"
        audio = words == "*" or words.lower() == "audio connector"
        return [port for port in self.ports if port.here
                and (video and "video_connector" in port.flags
                     or audio and "audio_connector" in port.flags)]  # fmt: skip

    def _on_GetNumConnectors(self, words: str) -> Answer:
        return Answer(len(self.connectors(words)) if self._certain() else ANY)

    def _on_GetConnectorStates(self, words: str) -> Answer:
        known = [_or_any(port.state) for port in self.connectors(words)]
        return Answer(_Unordered(known) if self._certain() and ANY not in known else ANY)

    def props(self, port: Port) -> tuple:
        flags = {flag: True for flag in port.flags}
        return (port.id, port.number, _or_any(port.state), _or_any(port.is_input),
                port.kind == "io_ctrl", _or_any(port.low), flags)  # fmt: skip

    def _on_GetPortProps(self) -> Answer:
        if not self._certain():
            return Answer(ANY)
        return Answer(_Props([self.props(port) for port in self.ports if port.here]))

    def _on_DropIOPorts(self, ids: list[str]) -> Answer:
        dropped, certain = [], not self.refreshes
        for id in ids:
            for port in self.ports:
                if port.id == id and port.optional and port.here is not False:
                    certain = certain and port.here is True
                    dropped.append(id)
                    self._leave(port)
        return Answer(dropped if certain else ANY)

    def _leave(self, port: Port) -> None:
        port.here = None if self.refreshes else False
        port.doubtful = bool(self.refreshes)
        port.history.append("dropped")
        self._relax(port)
        port.forget("raw")
        port.shown = None

    def _refresh(self) -> Answer:
        parked = [port for port in self.ports if port.here is not True]
        hanging = any(port.follows_world for port in parked) or len(self.refreshes) > 1
        for port in parked:
            port.shown = None
            port.forget("raw")
            port.history.append("refresh")
            port.doubtful = port.doubtful and len(self.refreshes) > 1
            port.here = None if hanging else True
            if port.here and port.backend != "gpio":
                port.raw = False  # its record is a new one
        return Answer(None)

    # --- The objects of older tools ---

    def _legacy(
        self, key: Any, path: str, member: str, args: tuple
    ) -> tuple[Answer, Optional[Port]]:
        number = path.removeprefix(LEGACY_PATH + "/")
        port = self.by_number.get(int(number)) if number.isdigit() else None
        if port is not None:
            port.serving = key
        interface = args[0].removeprefix(LEGACY)
        # The first object tells of the counts whether or not there is its port.
        if port is None or not port.takes_part or not self._has(port, interface):
            return refused("org.freedesktop.DBus.Error.*"), None
        if port.here is False:
            return refused("org.freedesktop.DBus.Error.*", NO_PORT), None
        if member == "Set":
            answer = self._legacy_set(port, interface, *args[1:])
        elif member == "GetAll":
            answer = Answer(self._legacy_all(port, interface))
        else:
            answer = self._legacy_get(port, interface, args[1])
        if port.here is None:
            if member == "Set":
                self._doubt_write(port, args[1])
            answer = Answer(ANY, ("*",))
        return answer, port

    _WRITES = {
        "Name": ("in_name", "out_name"), "Direction": ("is_input", "raw"), "Trig": ("low_in", "raw"),
        "Active": ("low_out", "raw"), "Button": ("button",), "PulseTime": ("pulse",),
        "DelayTime": ("delay",), "Mode": ("mode",),
    }  # fmt: skip

    def _doubt_write(self, port: Port, name: str) -> None:
        """The write may have found no object."""
        port.forget(*self._WRITES.get(name, ()))
        self._relax(port)

    @staticmethod
    def _has(port: Port, interface: str) -> bool:
        return interface == "IOPort" or port.kind in (interface.lower(), "io_ctrl")

    def legacy_values(self, port: Port, interface: str) -> dict[str, Any]:
        words = {True: "open", False: "closed", None: None}
        if interface == "Input":
            return {"Name": port.in_name, "Trig": words[port.low_in]}
        if interface == "Output":
            return {"Name": port.out_name, "Active": words[port.low_out], "Button": port.button,
                    "PulseTime": port.pulse, "Mode": port.mode, "DelayTime": port.delay}  # fmt: skip
        inputs, outputs = self.counts() if self._certain() else (None, None)
        total = None if inputs is None or outputs is None else inputs + outputs
        values = {"NbrOfIOPorts": total, "NbrOfInputs": inputs, "NbrOfOutputs": outputs}
        if port.is_ioport:
            word = None if port.is_input is None else "input" if port.is_input else "output"
            values |= {"Configurable": port.kind == "io_ctrl", "Direction": word}
        return values

    def _legacy_all(self, port: Port, interface: str) -> dict[str, Any]:
        return {name: _or_any(value) for name, value in self.legacy_values(port, interface).items()}

    def _legacy_get(self, port: Port, interface: str, name: str) -> Answer:
        values = self._legacy_all(port, interface)
        return Answer(values[name]) if name in values else refused(INVALID)

    def _legacy_set(self, port: Port, interface: str, name: str, value: Any) -> Answer:
        text = _text(value)
        if name == "Direction" and interface == "IOPort":
            return self._legacy_direction(port, text)
        if name == "Name" and interface != "IOPort":
            if text is None or len(text.encode()) > LONGEST_NAME:
                return refused(INVALID)
            setattr(port, "in_name" if interface == "Input" else "out_name", text)
        elif (interface, name) in (("Input", "Trig"), ("Output", "Active")):
            if text not in ("open", "closed"):
                return refused(INVALID)
            self._stop_sequence(port)
            port.set_low(text == "open", interface == "Input")
        elif interface == "Output" and name in ("PulseTime", "DelayTime"):
            setattr(port, "pulse" if name == "PulseTime" else "delay", value)
        elif interface == "Output" and name == "Button":
            port.button = text if text in ("none", "pulse", "actinact") else port.button
        elif interface == "Output" and name == "Mode":
            if text not in ("monostable", "bistable"):
                return refused(INVALID)
            port.mode = text
        else:
            return refused("org.freedesktop.DBus.Error.*")
        return Answer(None)

    def _legacy_direction(self, port: Port, word: Optional[str]) -> Answer:
        if word not in ("input", "output"):
            return refused(INVALID)
        if port.is_input is None:
            port.turn(word == "input", must=False)
            return Answer(ANY, (INVALID,))
        if port.is_input != (word == "input"):
            if port.kind != "io_ctrl":
                return refused(INVALID)
            self._stop_sequence(port)
            port.turn(word == "input")
        return Answer(None)


def _text(value: Any) -> Optional[str]:
    """What a byte string that ends with a zero says."""
    if isinstance(value, int):
        return None
    raw = bytes(value)
    try:
        return raw.split(b"\0")[0].decode() if raw.endswith(b"\0") else None
    except UnicodeDecodeError:
        return None


class _Unordered:
    """Equals every list of the same values."""

    def __init__(self, values: Any):
        self.values = sorted(values)

    def __eq__(self, other: Any) -> bool:
        return self.values == sorted(other)

    def __repr__(self) -> str:
        return repr(self.values)


class _Props:
    """Equals what GetPortProps answers, whose order means nothing, as do those of triggers."""

    def __init__(self, entries: list[tuple]):
        self.entries = {entry[0]: entry for entry in entries}

    def __eq__(self, other: Any) -> bool:
        number, entries = other
        if number != len(entries):
            return False
        found = {e[0]: (*e[:6], dict(e[6])) for e in entries if e[1] < FIRST_TRIGGER}
        return self.entries == found

    def __repr__(self) -> str:
        return repr(self.entries)
