"""Settings that older firmware left."""

import os
import random
import time

import pytest

from harness import Device, hwdesc, is_real_root, port
from harness.device import PCD_ID
from harness.waiting import scale
from legacy_tool import (
    BASE,
    EARLIER,
    EXPORT,
    INPUT,
    OUTPUT,
    Tool,
    four_ports,
)


def test_export_is_imported(device):
    device.conf(four_ports())
    device.write(EXPORT, """[IOPort.I2]
Direction=output
Usage=Door
[IOPort.I0.Input]
Name="Gate"
Trig=open
[IOPort.I2.Output]
Name=Lock
Active=open
Button=pulse
PulseTime=250
DelayTime=70
Mode=monostable
""")  # fmt: skip
    device.start()
    tool = Tool(device)
    assert tool.get_all(0, INPUT) == {"Name": "Gate", "Trig": "open"}
    assert tool.get(2, BASE, "Direction") == "output"
    assert tool.get_all(2, OUTPUT) == {
        "Name": "Lock", "Active": "open", "Button": "pulse", "PulseTime": 250, "Mode": "monostable",
        "DelayTime": 70,
    }  # fmt: skip
    settings = device.read_settings()
    assert "input_name=Gate\n" in settings and "output_name=Lock\n" in settings


def test_export_wins_over_settings_win_over_earlier_ones(device):
    group = "[in0]\ninput_name={}\ninput_activelow=false\n[in1]\ninput_name={}\ninput_activelow=false\n"
    device.conf(hwdesc(*(port(f"in{n}", n) for n in range(3))))
    device.write(EARLIER, group.format("earlier0", "earlier1") + "[in2]\ninput_name=earlier2\n")
    device.settings(group.format("stored0", "stored1"))
    device.write(EXPORT, "[IOPort.I1.Input]\nName=export1\n")
    device.start()
    names = [Tool(device).get(n, INPUT, "Name") for n in range(3)]
    assert names == ["stored0", "export1", "earlier2"]
    assert not device.path(EARLIER).exists()
    assert device.path(EXPORT).exists()


@pytest.mark.parametrize("export", ["absent", "no file"])
def test_earlier_settings_wait_for_an_export(device, export):
    device.conf(four_ports())
    if export == "no file":
        device.mkdir(EXPORT)
    device.write(EARLIER, "[in0]\ninput_name=earlier\ninput_activelow=true\n")
    device.start()
    assert device.path(EARLIER).exists()
    assert Tool(device).get(0, INPUT, "Name") == "Input 1"


def test_earlier_settings_that_cannot_be_read_stay(device):
    device.conf(four_ports())
    device.write(EXPORT, "")
    device.write(EARLIER, "no key file\n")
    device.start()
    assert device.path(EARLIER).exists()
    assert "Could not read key file: " in device.stderr()


def test_an_export_for_a_port_that_is_not_there(device):
    device.conf(four_ports())
    device.write(EXPORT, "[IOPort.I9.Input]\nName=nine\n[IOPort.I0.Input]\nName=zero\n")
    device.start()
    assert "No port 9 to write parhand data to.\n" in device.stderr()
    assert Tool(device).get(0, INPUT, "Name") == "Input 1"


@pytest.mark.parametrize("seed", range(5))
def test_exports_of_rubbish(device, seed):
    chance = random.Random(seed)
    groups = ("IOPort.I0", "IOPort.I2.Input", "IOPort.I2.Output", "IOPort.I1.Output", "Input", "XInput",
              "IOPort.Ix.Input", "IOPort.I99999999999999999999.Output", "IOPort.I-1.Output", "")  # fmt: skip
    keys = ("Name", "Trig", "Active", "Button", "PulseTime", "DelayTime", "Mode", "Direction")
    values = (b'"', b'"x', b"open", b"\xff\xfe", b"99999999999999999999", b"-1", b"", b"\\n\\", b"a;b")
    lines = []
    for _ in range(60):
        if chance.random() < 0.3:
            group = chance.choice(groups)
            lines.append(b"[" + group.encode() + b"]" if group else b"[a\xffInput]")
        else:
            lines.append(chance.choice(keys).encode() + b"=" + chance.choice(values))
    start = next(i for i, line in enumerate(lines) if line.startswith(b"["))
    device.conf(four_ports())
    device.write(EXPORT, "").write_bytes(b"\n".join(lines[start:]))
    device.start()
    tool = Tool(device)
    before = {(n, i): tool.get_all(n, i) for n in range(4) for i in tool.interfaces(n)}
    device.path(EXPORT).unlink()
    device.restart()
    assert {key: tool.get_all(*key) for key in before} == before


# Who may leave an export

GATE = "[IOPort.I0.Input]\nName=Gate\n"
NOBODY = 65534


def assert_left_alone(device: Device, reason: str) -> None:
    begun = time.monotonic()
    device.start()
    assert time.monotonic() - begun < 5 * scale()
    assert device.log_count(f"WARNING: portd: Ignored {EXPORT}: {reason}") == 1
    assert Tool(device).get(0, INPUT, "Name") == "Input 1"
    assert device.path(EARLIER).exists()


@pytest.fixture
def exported(device) -> Device:
    """A device with an export and with settings that wait for one."""
    device.conf(four_ports())
    device.write(EARLIER, "[in0]\ninput_name=earlier\ninput_activelow=true\n")
    device.write(EXPORT, GATE)
    return device


@pytest.mark.parametrize("owner", [0, PCD_ID] if is_real_root() else [os.geteuid()])
def test_an_export_of_roots_or_of_the_accounts_counts(exported, owner):
    os.chown(exported.path(EXPORT), owner, owner)
    exported.start()
    assert Tool(exported).get(0, INPUT, "Name") == "Gate"
    assert not exported.path(EARLIER).exists()


def test_an_export_of_somebody_elses_drives_nothing(exported):
    if not is_real_root():
        return  # nobody but root can leave one
    exported.write(EXPORT, "[IOPort.I1.Output]\nActive=open\n" + GATE)
    os.chown(exported.path(EXPORT), NOBODY, NOBODY)
    assert_left_alone(exported, f"it belongs to uid {NOBODY}")
    assert exported.call("GetActive", "u", 1) == ("closed", "closed")


def test_a_huge_export_costs_nothing(exported):
    with exported.path(EXPORT).open("ab") as file:
        file.truncate(2 << 30)
    assert_left_alone(exported, "File too large")
    if not exported.sanitized:
        assert int(exported.status("VmHWM").split()[0]) < 64 * 1024  # kB


@pytest.mark.parametrize("size, counts", [(1 << 20, True), ((1 << 20) + 1, False)])
def test_an_export_has_at_most_a_mebibyte(exported, size, counts):
    exported.write(EXPORT, GATE + "#" * (size - len(GATE)))
    exported.start()
    assert Tool(exported).get(0, INPUT, "Name") == ("Gate" if counts else "Input 1")


def test_a_pipe_for_an_export_does_not_hold_up_the_start(exported):
    exported.path(EXPORT).unlink()
    os.mkfifo(exported.path(EXPORT), 0o666)
    assert_left_alone(exported, "Not a regular file")


def test_a_link_for_an_export_is_not_followed(exported):
    exported.write("/etc/export", GATE)
    exported.path(EXPORT).unlink()
    exported.path(EXPORT).symlink_to("/etc/export")
    assert_left_alone(exported, "Is a link")
