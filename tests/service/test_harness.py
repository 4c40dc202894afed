"""The harness itself: what it must catch and what it must not leave behind."""

import os
import resource
import signal
import subprocess
import sys
from pathlib import Path

import pytest

from gpio_tree import GpioTree
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


def alive(pid: str) -> bool:
    """A process that has ended is not, though it stays in the table where PID 1 does not reap it."""
    try:
        return Path(f"/proc/{pid}/stat").read_text().rpartition(")")[2].split()[0] not in "ZX"
    except (FileNotFoundError, ProcessLookupError):
        return False


def test_a_process_that_was_not_reaped_is_not_alive():
    process = subprocess.Popen(["true"])
    wait_for(lambda: not alive(str(process.pid)), "the end of the process")
    assert Path(f"/proc/{process.pid}").exists()
    process.wait()


def test_used_up_inotify_instances_are_told(tmp_path: Path):
    # What runs out are this process's descriptors, which says the same.
    first_free = os.dup(0)
    os.close(first_free)
    soft, hard = resource.getrlimit(resource.RLIMIT_NOFILE)
    resource.setrlimit(resource.RLIMIT_NOFILE, (first_free, hard))
    try:
        with pytest.raises(OSError, match="no inotify instance: Too many open files; .*max_user_instances"):
            GpioTree(tmp_path)
    finally:
        resource.setrlimit(resource.RLIMIT_NOFILE, (soft, hard))


def test_who_may_not_mount_is_told_how_to():
    """Without the capability, and where there can be no user namespace to have it in: within another
    that allows none, or in a chroot.
    """
    script = f"""
import sys
sys.path.insert(0, {str(Path(__file__).parent)!r})
from harness import NoMounts, become_root
try:
    become_root()
except NoMounts as error:
    print(error)
"""
    limit = "echo 0 >/proc/sys/user/max_user_namespaces"
    drop = "setpriv --bounding-set=-sys_admin --inh-caps=-sys_admin"
    shell = f'{limit}; exec {drop} "$0" -c "$1"'
    outer = ["unshare", "-U", "-r"]
    if subprocess.run([*outer, "true"], stderr=subprocess.DEVNULL).returncode != 0:
        outer, shell = [], f'exec {drop} "$0" -c "$1"'
    command = [*outer, "sh", "-c", shell, sys.executable, script]
    told = subprocess.run(command, capture_output=True, text=True, check=True).stdout
    assert "CAP_SYS_ADMIN" in told and len(told.splitlines()) == 1


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
    assert len(pids) == 3 and all(map(alive, pids))
    os.kill(harness.pid, signal.SIGKILL)
    harness.wait()
    harness.stdin.close()
    harness.stdout.close()
    wait_for(lambda: not any(map(alive, pids)), "the processes' end")


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
