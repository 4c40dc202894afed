"""Settings that older firmware left."""

import random

import pytest

from harness import hwdesc, port
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


def test_earlier_settings_wait_for_an_export(device):
    device.conf(four_ports())
    device.write(EARLIER, "[in0]\ninput_name=earlier\ninput_activelow=true\n")
    device.start()
    assert device.path(EARLIER).exists()
    assert Tool(device).get(0, INPUT, "Name") == "Input 1"


def test_an_export_that_is_no_file(device):
    device.conf(four_ports())
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
