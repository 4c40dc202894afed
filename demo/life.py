"""The simulated device of the demo, and what happens in it."""

from pathlib import Path
from typing import Any, Callable, NamedTuple

from gi.repository import GLib

from converters import Converters
from gpio_tree import GpioTree
from harness import Device
from neighbours import IoBox, Neighbourhood, Streamer

DOOR, MOTION, MODULE = "/run/demo/door", "/run/demo/motion", "/run/demo/module"
PLUG = "/run/demo/plug"
RELAY, CONFIGURABLE, ALARM, BOX, TRIGGER = 3, 4, 5, 8, 21
DOOR_NUMBER, LINE = 0, 10

SUPERVISED_INTERFACE, SUPERVISED_PATH = (
    "com.kelv.IOSupervised.Supervised", "/com/kelv/IOSupervised/Supervised"
)  # fmt: skip

# What the line measures in each of its states, in turn, and what that means.
LEVELS = (
    (2100, "the contact of the fence line opens"),
    (1100, "the contact of the fence line closes"),
    (300, "somebody shorts the fence line"),
    (3500, "somebody cuts the fence line"),
)
_STEP_MS, _STEPS_PER_STATE = 250, 20


class Parts(NamedTuple):
    """The device with what it is wired to."""

    device: Device
    tree: GpioTree
    converters: Converters

    def close(self) -> list[str]:
        self.converters.close()
        problems = self.device.close()
        self.tree.close()
        return problems


def make_device(folder: Path, binary: Path) -> Parts:
    folder.mkdir()
    tree = GpioTree(folder)
    device = Device(folder, binary, binds={"/sys": tree.sys})
    return Parts(device, tree, Converters(device, tree, folder))


class Life:
    """Inputs that move by themselves, a client that switches outputs, a restart."""

    def __init__(self, parts: Parts, neighbourhood: Neighbourhood):
        self._device, self._converters = parts.device, parts.converters
        self._neighbourhood = neighbourhood
        self._tick = 0
        self._step = 0
        self._level = LEVELS[0][0]
        self._restart_due = False
        self._timers: list[int] = []
        self._say: Callable[[str], None] = print
        self._states: dict[Any, bool] = {}

    def prepare(self) -> None:
        self._device.conf((Path(__file__).parent / "conf.xml").read_text())
        for attribute, value in ((DOOR, 0), (MOTION, 0), (PLUG, 1)):
            self._device.write(attribute, f"{value}\n").chmod(0o666)
        self._converters.spidev()
        self._converters.answer(self._level)
        self._box = IoBox(self._neighbourhood, self._device)
        Streamer(self._neighbourhood, self._device, {1: True, 2: True})

    def begin(self, say: Callable[[str], None]) -> None:
        """Lets time pass; what happens is told to `say`."""
        self._say = say
        self._supervise()
        self._timers = [
            GLib.timeout_add_seconds(1, self._second), GLib.timeout_add(_STEP_MS, self._move_line)
        ]  # fmt: skip

    def end(self) -> None:
        for timer in self._timers:
            GLib.source_remove(timer)
        self._timers = []

    def restart_if_due(self) -> None:
        """Not from a timer: the others go on while the daemon comes up."""
        if self._restart_due:
            self._restart_due = False
            self._say("device: the daemon is restarted, the door keeps its new name")
            self._device.restart()

    def _second(self) -> bool:
        self._tick += 1
        tick = self._tick
        if tick % 3 == 0:
            self._device.write(DOOR, f"{int(self._toggle(DOOR))}\n")
        if tick % 5 == 0:
            self._device.write(MOTION, "1\n")
        if tick % 5 == 1:
            self._box.report(BOX, "closed" if self._toggle(BOX) else "open")
        self._be_a_client(tick)
        if tick == 6:
            self._plug_in()
        if tick == 14:
            name = "Front door"
            self._client("SetName", "ubs", DOOR_NUMBER, True, name)
        if tick == 18:
            self._restart_due = True
        return GLib.SOURCE_CONTINUE

    def _be_a_client(self, tick: int) -> None:
        if tick % 4 == 0:
            self._client("SetState", "ub", RELAY, self._toggle(RELAY))
        if tick % 7 == 0:
            self._client("SetVirtual", "ub", ALARM, self._toggle(ALARM))
        if tick % 5 == 3:
            self._client("SetVirtual", "ub", TRIGGER, self._toggle(TRIGGER))
        if tick % 9 == 0:
            self._client("SetDirection", "us", CONFIGURABLE, "output" if tick % 2 else "input")
        if tick % 20 == 10:
            self._sequence("a pulse", [(True, 700), (False, 0)])
        if tick % 20 == 2:
            self._sequence("a sequence of six steps", [(True, 250), (False, 150)] * 3)

    def _toggle(self, what: str | int) -> bool:
        self._states[what] = not self._states.get(what, False)
        return self._states[what]

    def _client(self, method: str, signature: str = "", *args: Any) -> None:
        shown = ", ".join(str(arg) for arg in args)
        self._say(f"client: {method}({shown})")
        self._device.begin_call(method, signature, *args)

    def _sequence(self, what: str, steps: list[tuple[bool, int]]) -> None:
        self._say(f"client: StartActionSequence on the relay, {what}")
        self._device.begin_call("StartActionSequence", "uba(bi)", RELAY, False, steps)

    def _supervise(self) -> None:
        self._say(f"client: SetSupervised({LINE}, True)")
        self._device.bus.begin_call(
            SUPERVISED_INTERFACE, SUPERVISED_PATH, SUPERVISED_INTERFACE, "SetSupervised", "ub",
            LINE, True,
        )  # fmt: skip

    def _plug_in(self) -> None:
        self._say("device: a module is plugged in")
        self._device.write(MODULE, "1\n")
        self._client("RefreshIOPorts")

    def _move_line(self) -> bool:
        """A step towards the level of the state that the line is to take, with a little noise."""
        state, step = divmod(self._step, _STEPS_PER_STATE)
        level, meaning = LEVELS[state % len(LEVELS)]
        if step == 0:
            self._say(f"device: {meaning}")
        self._level += (level - self._level) // 2
        self._converters.answer(self._level + (self._step * 37) % 23)
        self._step += 1
        return GLib.SOURCE_CONTINUE
