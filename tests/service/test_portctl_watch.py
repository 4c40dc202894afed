"""portctl watch: the live table on a terminal."""

import os
import signal
from typing import Callable, Iterator

import pytest

import portctl as client
from harness import Device, hwdesc, port
from portctl import NO_DAEMON, OK, USAGE, Portctl
from terminal import TAKEN, Terminal

PORTS = hwdesc(
    port("door", 0, names={"input": "Front door"}),
    port("relay", 1, kind="output", names={"output": "Relay"}),
    port("io", 2, kind="io_ctrl", names={"input": "Gate", "output": "Lamp"}),
)
Watch = Callable[..., Terminal]


@pytest.fixture
def watch(device: Device) -> Iterator[Watch]:
    terminals = []

    def begin(*words: str, columns: int = 80, rows: int = 24, **extra: str) -> Terminal:
        arguments = [client.binary(), "--address", device.bus.address, "watch", *words]
        env = {"TERM": "xterm", "LC_ALL": "C.UTF-8", "PATH": os.environ["PATH"]} | extra
        terminals.append(Terminal(arguments, env, columns, rows))
        return terminals[-1]

    device.conf(PORTS)
    device.bus.start()
    yield begin
    for terminal in terminals:
        terminal.close()


def test_changes_are_drawn_as_they_come(device, watch):
    device.start()
    portctl = Portctl(device)
    terminal = watch("--title", "Board 7")
    screen = terminal.wait_text("the daemon serves 3 ports")
    assert screen[0].startswith(" Board 7  3 ports: 2 in, 1 out")
    assert "0 Front door" in screen[2] and "input <>" in screen[4]
    portctl("set", "relay", "on")
    screen = terminal.wait_text("port 1 Relay is an output, active")
    assert screen[3].split()[1:4] == ["Relay", "output", "active"]
    portctl("name", "relay", "Lock")
    terminal.wait_text("1 Lock")
    assert len(screen) == 24 and max(map(len, screen)) <= 80


def test_the_table_fits_whatever_size_the_terminal_takes(device, watch):
    names = {"input": "A name that is far too long for a narrow table of ports"}
    device.conf(hwdesc(*(port(f"p{number}", number, names=names) for number in range(40))))
    device.start()
    terminal = watch()
    for columns, rows in ((80, 24), (120, 40), (40, 10)):
        terminal.resize(columns, rows)
        screen = terminal.wait_for(lambda text: "q quit" in text and "  0 A name" in text)
        assert max(map(len, screen)) <= columns and "q quit" in screen[rows - 1]
    terminal.type("\x1b[B" * 3)
    terminal.wait_for(lambda text: "  3 A name" in text and "  2 A name" not in text)


def test_a_restart_of_the_daemon_is_outlived(device, watch):
    terminal = watch()
    terminal.wait_text("the daemon is not running, waiting for it")
    device.start()
    terminal.wait_text("3 ports: 2 in, 1 out")
    device.restart()
    terminal.wait_for(lambda text: text.count("the daemon serves 3 ports") == 2)


@pytest.mark.parametrize("way", ["q", "ctrl-c", "term", "hup"])
def test_the_terminal_is_given_back_on_every_way_out(device, watch, way):
    device.start()
    terminal = watch()
    terminal.wait_text("the daemon serves 3 ports")
    assert TAKEN in terminal.read()
    if way == "q":
        terminal.type("q")
    else:
        number = {"ctrl-c": signal.SIGINT, "term": signal.SIGTERM, "hup": signal.SIGHUP}[way]
        terminal.process.send_signal(number)
    assert terminal.wait_exit() == OK
    assert terminal.is_as_before


def test_the_terminal_is_given_back_when_the_bus_goes(device, watch):
    terminal = watch()
    terminal.wait_text("waiting for it")
    device.bus.stop()
    assert terminal.wait_exit() == NO_DAEMON
    assert terminal.is_as_before


def test_notes_are_shown_without_their_control_characters(device, watch, tmp_path):
    device.start()
    notes = tmp_path / "notes"
    os.mkfifo(notes)
    terminal = watch("--notes", str(notes))
    terminal.wait_text("the daemon serves 3 ports")
    with notes.open("w") as file:
        file.write("the door\x1b[2Jopens\n")
    terminal.wait_text(r"the door\x1b[2Jopens")


def test_without_colours_no_style_is_written(device, watch):
    device.start()
    terminal = watch(NO_COLOR="1")
    terminal.wait_text("the daemon serves 3 ports")
    assert "\x1b[7m" not in terminal.read() and "\x1b[1m" not in terminal.read()


def test_a_pipe_is_no_terminal(device):
    device.bus.start()
    done = Portctl(device).run("watch")
    assert done.returncode == USAGE and "portctl monitor" in done.stderr
