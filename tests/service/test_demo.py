"""The demo: shows its device's ports and their changes, and ends cleanly however it is ended."""

import re
import signal
import subprocess
import sys
from pathlib import Path

import pytest

from harness import default_binary, scale
from harness.device import REPOSITORY
from terminal import Terminal


@pytest.fixture
def demo(tmp_path: Path):
    """Starts the demo with a folder for temporary files of its own."""
    processes: list[subprocess.Popen] = []

    def start(*arguments: str) -> subprocess.Popen:
        command = [sys.executable, "demo/demo.py", "--binary", str(default_binary()), *arguments]
        process = subprocess.Popen(
            command,
            cwd=REPOSITORY,
            env={"PATH": "/usr/sbin:/usr/bin:/sbin:/bin", "TMPDIR": str(tmp_path)},
            stdout=subprocess.PIPE,
            stderr=subprocess.PIPE,
            text=True,
        )
        processes.append(process)
        return process

    yield start
    for process in processes:
        process.kill()
        process.communicate()
    assert list(tmp_path.iterdir()) == []


def test_shows_the_table_and_then_the_changes(demo):
    process = demo("--seconds", "5")
    output, errors = process.communicate(timeout=60 * scale())
    assert (process.returncode, errors) == (0, "")
    table, _, changes = output.partition("\n\n")[2].partition("\n\n")
    # The optional port's module is plugged in later.
    assert [line.split()[1] for line in table.splitlines()[1:]] == [
        "door", "pir_detector", "forwarding", "relay", "io1", "alarm", "spare", "box1", "video_out",
        "fence", "manualtrigger1", "manualtrigger2",
    ]  # fmt: skip
    assert changes.startswith("1 video connector, 1 of them plugged in\n")
    assert re.search(r"^ +\d+\.\ds  port 0 Door contact +input +active$", changes, re.MULTILINE)
    assert re.search(r"^ +\d+\.\ds  port 3 Relay +output +active$", changes, re.MULTILINE)
    assert re.search(r"^ +\d+\.\ds  port 8 Gate, on the I/O box +input +active$", changes, re.MULTILINE)
    # The second video channel's manual trigger raises its event.
    assert re.search(r"^ +\d+\.\ds  event \d+: port 2, state True$", changes, re.MULTILINE)


@pytest.mark.parametrize("number", [signal.SIGINT, signal.SIGTERM, signal.SIGHUP])
def test_an_interrupt_is_a_regular_end(demo, number):
    process = demo()
    assert process.stdout is not None
    while "Door contact" not in process.stdout.readline():
        assert process.poll() is None
    process.send_signal(number)
    _, errors = process.communicate(timeout=60 * scale())
    assert (process.returncode, errors) == (0, "")


def test_on_a_terminal_the_live_table_shows_what_happens(tmp_path):
    command = [sys.executable, "demo/demo.py", "--binary", str(default_binary())]
    env = {"PATH": "/usr/sbin:/usr/bin:/sbin:/bin", "TMPDIR": str(tmp_path), "TERM": "xterm"}
    terminal = Terminal(command, env | {"LC_ALL": "C.UTF-8"}, 80, 24, cwd=REPOSITORY)
    try:
        screen = terminal.wait_text("q ends it")
        helper = next(tmp_path.glob("portd-demo-*/portctl"))
        terminal.wait_for(lambda text: re.search(r"10 Fence line .*\[[ocsx.]*#[ocsx.]*\]", text))
        done = subprocess.run(
            [helper, "get", "Relay"], capture_output=True, text=True, timeout=30 * scale()
        )
        assert (done.returncode, done.stderr) == (0, "")
        screen = terminal.wait_text("a sequence of six steps")
        assert len(screen) == 24 and max(map(len, screen)) <= 80
        assert "q quit" in screen[23]
        terminal.type("q")
        assert terminal.wait_exit() == 0
        assert terminal.is_as_before
    finally:
        terminal.close()
    assert list(tmp_path.iterdir()) == []
