"""The device of the soak: ports on every kind of backend, and neighbours and devices that come to harm."""

import random
from pathlib import Path
from typing import Callable

from converters import PINS, Converters
from gpio_tree import GpioTree
from harness import Device, hwdesc, port
from model import FIRST_TRIGGER, Port
from neighbours import IoBox, Neighbourhood, Streamer

IOPORT = '<event declaration="IOPort"/>'
PORT_ANY = '<event declaration="PortAny" output="false"/>'
SUPERVISED_EVENT = (
    '<event declaration="com.kelv.Event.Pcd.SupervisedPort" input="false" output="false"'
    ' supervised_input="true"/>'
)
FLAG, CONNECTOR_FLAG = "/run/soak/flag", "/run/soak/connector"
LAMP = 40  # the line of the port of that name
RANGES = [("closed", 100, 199), ("open", 200, 299), ("cut", 3000, 4095)]
LEVELS = (50, 150, 250, 3500)
WORDS = ("open", "closed", "short", "cut")
BOX_INPUTS = (7, 9)
CHANNELS = {1: True, 2: True}

# Identifier, kind, backend, flags, optional, whether the world decides on its state, events.
_PORTS = (
    ("contact", "input", "check", "ioport", False, False, (IOPORT, PORT_ANY)),
    ("relay", "output", "check", "ioport", False, False, (IOPORT,)),
    ("either", "io_ctrl", "check", "ioport", True, False, (IOPORT,)),
    ("gate", "output", "virtual", "ioport virtual", True, False, (IOPORT,)),
    ("lamp", "output", "gpio", "ioport", True, False, (IOPORT,)),
    ("flag", "input", "sysfs", "ioport", True, True, (IOPORT,)),
    ("line", "input", "spi", "ioport", True, True, (IOPORT, SUPERVISED_EVENT)),
    ("boxin", "input", "iobox", "ioport", True, True, (IOPORT,)),
    ("boxout", "output", "iobox", "ioport", True, True, (IOPORT,)),
    ("boxio", "io_ctrl", "iobox", "ioport hidden", True, True, (IOPORT,)),
    ("video", "input", "check", "video_connector hidden", False, False, ()),
    ("audio", "input", "sysfs", "audio_connector", False, True, ()),
    ("trigger", "output", "virtual", "virtual", False, False, ()),
    ("plain", "output", "check", "ioport", True, False, (PORT_ANY,)),
)
VANISHING = ["flag", "line"]
OPTIONAL = [entry[0] for entry in _PORTS if entry[4]]


def make_ports() -> list[Port]:
    ports = []
    for number, (id, kind, backend, flags, optional, follows, events) in enumerate(_PORTS):
        made = Port(id, number, kind, backend, frozenset(flags.split()), optional, follows, events)
        made.in_name = f"In {id}" if kind != "output" else ""
        made.out_name = f"Out {id}" if kind != "input" else ""
        made.ranges = list(RANGES) if backend == "spi" else []
        made.raw = None if backend == "gpio" else False
        ports.append(made)
    return ports


def _backend(made: Port) -> str:
    if made.backend == "gpio":
        return f'<backend name="gpio"><output pin="{LAMP}"/></backend>'
    if made.backend == "sysfs":
        path = FLAG if made.id == "flag" else CONNECTOR_FLAG
        return f'<backend name="sysfs"><device path="{path}" timeout="20"/></backend>'
    if made.backend == "spi":
        ranges = "".join(f'<range state="{s}" lower="{a}" upper="{b}"/>' for s, a, b in RANGES)
        device = '<device path="/run/converters/spidev0"/><address value="1f"/>'
        return f'<backend name="spi">{PINS}{device}{ranges}</backend>'
    return f'<backend name="{made.backend}"/>'


def _element(made: Port) -> str:
    names = {"input": made.in_name, "output": made.out_name}
    return port(
        made.id, made.number, made.kind, backend=None, flags=" ".join(sorted(made.flags)),
        names={side: name for side, name in names.items() if name}, optional=made.optional,
        extra=_backend(made) + "".join(made.events),
    )  # fmt: skip


class World:
    """To be made before the device starts; heal() puts everything right again."""

    def __init__(self, device: Device, tree: GpioTree, folder: Path, rng: random.Random):
        self.device, self.tree, self.rng = device, tree, rng
        self.converters = Converters(device, tree, folder)
        self.converters.spidev()
        self.converters.answer(LEVELS[0])
        for file in tree.line(LAMP).iterdir():
            file.chmod(0o666)
        self.level = LEVELS[0]
        self.flag = self.connector = False
        self.box_words = {number: "open" for number in BOX_INPUTS}
        self.neighbourhood = Neighbourhood()
        self._write_flags()
        self.box = IoBox(self.neighbourhood, device)
        self.streamer = Streamer(self.neighbourhood, device, CHANNELS)
        self.harmed: set[str] = set()
        self.deeds = 0

    def document(self, ports: list[Port]) -> str:
        first_virtual = f'<first_virtual_input nbr="{FIRST_TRIGGER}"/>'
        return hwdesc(*map(_element, ports), first_virtual)

    def close(self) -> None:
        self.neighbourhood.close()
        self.converters.close()

    def _write_flags(self) -> None:
        for path, flag in ((FLAG, self.flag), (CONNECTOR_FLAG, self.connector)):
            self.device.write(path, f"{int(flag)}\n").chmod(0o644)

    def do_harm(self) -> None:
        """One deed at random."""
        self.deeds += 1
        deeds: list[Callable[[], None]] = [
            self._move_flags, self._move_flags, self._move_line, self._move_line, self._box_reports,
            self._box_reports, self._hang_box, self._resume_box, self._kill_box, self._hang_streamer,
            self._resume_streamer, self._kill_streamer, self._flag_vanishes, self._line_vanishes,
            self._line_fails,
        ]  # fmt: skip
        self.rng.choice(deeds)()

    def heal(self) -> None:
        for resume in (self._resume_box, self._resume_streamer):
            resume()
        if "box gone" in self.harmed:
            self.box = IoBox(self.neighbourhood, self.device)
        if "streamer gone" in self.harmed:
            self.streamer = Streamer(self.neighbourhood, self.device, CHANNELS)
        self.harmed.clear()
        self._write_flags()
        spidev = self.converters.folder / "spidev0"
        spidev.touch()
        spidev.chmod(0o666)
        self.converters.answer(self.level)

    def tell(self) -> None:
        """What the box has to say of its inputs."""
        for number, word in self.box_words.items():
            self.box.report(number, word)

    def _move_flags(self) -> None:
        self.flag, self.connector = (self.rng.random() < 0.5 for _ in range(2))
        if "flag gone" not in self.harmed:
            self._write_flags()

    def _move_line(self) -> None:
        self.level = self.rng.choice(LEVELS)
        self.converters.answer(self.level)

    def _line_fails(self) -> None:
        self.converters.fail(5)

    def _box_reports(self) -> None:
        number, word = self.rng.choice(BOX_INPUTS), self.rng.choice(WORDS)
        self.box_words[number] = word
        if not self.harmed & {"box hangs", "box gone"}:
            self.box.report(number, word)

    def _hang_box(self) -> None:
        if "box gone" not in self.harmed:
            self.harmed.add("box hangs")
            self.box.service.hang()

    def _resume_box(self) -> None:
        if "box hangs" in self.harmed:
            self.harmed.discard("box hangs")
            self.box.service.resume()

    def _kill_box(self) -> None:
        if "box gone" not in self.harmed:
            self.harmed.discard("box hangs")
            self.harmed.add("box gone")
            self.box.service.stop()

    def _hang_streamer(self) -> None:
        if "streamer gone" not in self.harmed:
            self.harmed.add("streamer hangs")
            self.streamer.service.hang()

    def _resume_streamer(self) -> None:
        if "streamer hangs" in self.harmed:
            self.harmed.discard("streamer hangs")
            self.streamer.service.resume()

    def _kill_streamer(self) -> None:
        if "streamer gone" not in self.harmed:
            self.harmed.discard("streamer hangs")
            self.harmed.add("streamer gone")
            self.streamer.service.stop()

    def _flag_vanishes(self) -> None:
        self.harmed.add("flag gone")
        self.device.path(FLAG).unlink(missing_ok=True)

    def _line_vanishes(self) -> None:
        (self.converters.folder / "spidev0").unlink(missing_ok=True)
