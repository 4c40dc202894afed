"""The harness itself: what it must catch and what it must not leave behind."""

import os
import signal
import subprocess
import sys
from pathlib import Path

import pytest

from harness import Device, Sandbox, hwdesc, port, wait_for


@pytest.fixture
def pretender(tmp_path: Path):
    """Makes a device whose daemon is a shell script, and judges it."""

    def judge(script: str) -> list[str]:
        binary = tmp_path / "pretender"
        binary.write_text(f"#!/bin/sh\n{script}\n")
        binary.chmod(0o755)
        device = Device(tmp_path, binary)
        device.start(wait=False)
        wait_for(lambda: "ready" in device.log() or not device.running, "the script")
        return device.close()

    return judge


READY_AND_CLEAN = "trap 'exit 0' TERM; echo ready; while :; do sleep 0.01; done"


def test_a_clean_end_raises_no_complaint(pretender):
    assert pretender(READY_AND_CLEAN) == []


def test_a_crash_is_a_complaint(pretender):
    assert pretender("exit 3") == ["portd ended by itself with status 3"]


def test_a_failing_end_is_a_complaint(pretender):
    problems = pretender(READY_AND_CLEAN.replace("exit 0", "exit 4"))
    assert len(problems) == 1 and "status 4" in problems[0]


@pytest.mark.parametrize(
    "line",
    [
        "==1==ERROR: AddressSanitizer: heap-use-after-free",
        "x.cc:1:2: runtime error: signed integer overflow",
        "WARNING: ThreadSanitizer: data race",
        "==1==ERROR: LeakSanitizer: detected memory leaks",
        "CRITICAL: GLib: assertion failed",
        "(process:1): GLib-CRITICAL **: assertion failed",
    ],
)
def test_bad_output_is_a_complaint(pretender, line):
    problems = pretender(f"echo '{line}' >&2; {READY_AND_CLEAN}")
    assert len(problems) == 1 and problems[0].endswith(line)


def test_nothing_outlives_a_killed_harness(device, tmp_path: Path):
    device.conf(hwdesc())
    script = f"""
import sys
sys.path.insert(0, {str(Path(__file__).parent)!r})
from pathlib import Path
from harness import Device
device = Device(Path({str(tmp_path)!r}), Path({str(device.binary)!r}))
device.conf("<ports/>")
device.start()
print(device.pid, device.bus._process.pid, device.sandbox.pid, flush=True)
sys.stdin.read()
"""
    harness = subprocess.Popen(
        [sys.executable, "-c", script], stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True
    )
    assert harness.stdin is not None and harness.stdout is not None
    pids = harness.stdout.readline().split()
    assert len(pids) == 3 and all(Path(f"/proc/{pid}").exists() for pid in pids)
    os.kill(harness.pid, signal.SIGKILL)
    harness.wait()
    harness.stdin.close()
    harness.stdout.close()
    wait_for(lambda: not any(Path(f"/proc/{pid}").exists() for pid in pids), "the processes' end")


def test_devices_are_apart_from_each_other(make_device):
    devices = [make_device() for _ in range(3)]
    for number, device in enumerate(devices):
        device.conf(hwdesc(*(port(f"p{n}", n) for n in range(number))))
        device.start()
    devices[2].call("SetName", "ubs", 0, True, "Here only")
    assert [device.call("GetNbrPorts")[0] for device in devices] == [0, 1, 2]
    assert devices[1].call("GetNames", "u", 0) == ("Input 1", "")


def test_the_host_sees_none_of_the_device(tmp_path: Path):
    sandbox = Sandbox(tmp_path)
    (tmp_path / "etc/only-here").write_text("x")
    program = sandbox.spawn(["cat", "/etc/only-here"], os.environ, subprocess.PIPE, subprocess.PIPE)
    assert program.communicate() == (b"x", b"")
    sandbox.stop()
    assert not Path("/etc/only-here").exists()
