"""portctl check: typical mistakes are found where they stand, and what is right is not complained of."""

import json
from pathlib import Path
from typing import NamedTuple

import pytest

import portctl as client
from harness import Device
from portctl import OK, REFUSED, USAGE

GOOD = """<ports>
  <port name="door">
    <port_type type="input"/>
    <port_no nbr="0"/>
    <properties ioport="true"/>
    <backend name="sysfs">
      <device path="/run/door" timeout="100"/>
    </backend>
    <event declaration="IOPort"/>
  </port>
  <port name="relay" optional="true">
    <port_type type="output"/>
    <port_no nbr="1"/>
    <properties ioport="true" hidden="FALSE"/>
    <backend name="gpio">
      <output alias="relay" inverted="true"/>
    </backend>
  </port>
  <port name="line">
    <port_type type="input"/>
    <port_no nbr="2"/>
    <properties ioport="true"/>
    <backend name="spi">
      <device path="/dev/spidev0.0"/>
      <input pin="17"/>
      <io_ctrl pin="18"/>
      <sio_ctrl pin="19"/>
      <range state="closed" lower="100" upper="200"/>
      <range state="open" lower="201" upper="300"/>
    </backend>
  </port>
</ports>
"""


class Mistake(NamedTuple):
    """In GOOD, `before` becomes `after`; the message with `said` stands at `at` of its line."""

    before: str
    after: str
    at: str  # the text at which the finding points, searched for in `after`; "" where it begins
    said: str


MISTAKES = {
    "nr for nbr": Mistake('nbr="0"', 'nr="0"', "", 'did you mean "nbr"?'),
    "a number as text": Mistake('<port_no nbr="0"/>', "<port_no>0</port_no>", "0<", '<port_no nbr="...'),
    "port-type": Mistake('<port_type type="o', '<port-type type="o', "", 'did you mean "port_type"?'),
    "a number in words": Mistake('nbr="2"', 'nbr="two"', "", 'the daemon reads 0'),
    "a duplicate number": Mistake('nbr="1"', 'nbr="0"', "", 'is taken by "door" (line 2)'),
    "a negative number": Mistake('nbr="1"', 'nbr="-1"', "", "from 0 on"),
    "a hole": Mistake('nbr="2"', 'nbr="7"', "", "beyond the 3 ports"),
    "a duplicate name": Mistake('name="line"', 'name="door"', "", "taken by the port in line 2"),
    "Port": Mistake('<port name="relay"', '<Port name="relay"', "", 'did you mean "port"?'),
    "no properties": Mistake(
        '<port name="door">\n    <port_type type="input"/>\n    <port_no nbr="0"/>\n'
        '    <properties ioport="true"/>\n',
        '<port name="door">\n    <port_type type="input"/>\n    <port_no nbr="0"/>\n',
        "", "has no <properties ioport",
    ),
    "ioports": Mistake('ioport="true" hidden', 'ioports="true" hidden', "", 'did you mean "ioport"?'),
    "ioport yes": Mistake('ioport="true" hidden', 'ioport="yes" hidden', "", "neither true nor false"),
    "inverted 1": Mistake('inverted="true"', 'inverted="1"', "", "in small letters"),
    "inverted TRUE": Mistake('inverted="true"', 'inverted="TRUE"', "", "in small letters"),
    "clear_flag yes": Mistake('timeout="100"', 'timeout="100" clear_flag="yes"', "clear", "neither"),
    "two backends": Mistake(
        "    </backend>\n    <event", '    </backend>\n    <backend name="null"/>\n    <event',
        '<backend name="null"', "keep one of them",
    ),
    "IOport": Mistake('"IOPort"', '"IOport"', "", 'did you mean "IOPort"?'),
    "range min and max": Mistake('lower="100" upper="200"', 'min="100" max="200"', "", 'no "min"'),
    "overlapping ranges": Mistake(
        '<range state="open" lower="201"', '<range state="open" lower="200"', "", "overlaps",
    ),
    "a range in another order": Mistake(
        '<range state="open" lower="201" upper="300"', '<range lower="201" upper="300" state="open"',
        "", "in this order",
    ),
    "line for pin": Mistake('<input pin="17"', '<input line="17"', "", "takes GPIO 0"),
    "the key line": Mistake('<input pin="17"', '<input line="17"', "line", 'no "line"'),
    "GPIO17": Mistake('pin="17"', 'pin="GPIO17"', "", "the daemon reads 0"),
    "file for path": Mistake('path="/run/door"', 'file="/run/door"', "", 'no "file"'),
    "a bare ampersand": Mistake('path="/run/door"', 'path="/run/a&b"', "b", "ampersand"),
    "an unclosed tag": Mistake("    </backend>\n    <event", "    <event", "", "malformed"),
    "no polling interval": Mistake(' timeout="100"', "", "", "needs timeout"),
    "an interval of nothing": Mistake('timeout="100"', 'timeout="0"', "", "all the time"),
    "an unknown type": Mistake('type="output"', 'type="Output"', "", 'write "output"'),
    "an unknown backend": Mistake('"gpio"', '"gpios"', "", 'write "gpio"'),
    "a backend for inputs": Mistake(
        '<backend name="gpio">', '<backend name="sysfs">', "", "serves ports of the type input only",
    ),
    "a section of another backend": Mistake("<output alias", "<outputs alias", "", 'did you mean "output"?'),
    "a missing line": Mistake('<sio_ctrl pin="19"/>', "", "", "needs <sio_ctrl .../>"),
    "a name after another": Mistake(
        '<port name="relay" optional="true">', '<port optional="true" name="relay">', "name",
        "must stand first",
    ),
    "optional in capitals": Mistake('optional="true"', 'optional="True"', "", "in small letters"),
    "a port in a port": Mistake(
        '  </port>\n  <port name="relay"', '  <port name="relay"', "<port", "close that first"
    ),
    "an empty range": Mistake('lower="100" upper="200"', 'lower="200" upper="100"', "", "below upper"),
    "lost text": Mistake("<ports>\n", "<ports>\nmine\n", "mine", "text between tags"),
}  # fmt: skip


def check(*words: object, status: int = OK) -> list[dict]:
    done = client.run("check", "--json", *map(str, words))
    assert (done.returncode, done.stderr) == (status, ""), done
    return json.loads(done.stdout)


@pytest.fixture
def conf(tmp_path: Path) -> Path:
    path = tmp_path / "conf.xml"
    path.write_text(GOOD)
    return path


def test_what_is_right_passes(conf):
    done = client.run("check", "--strict", str(conf))
    assert (done.returncode, done.stdout, done.stderr) == (OK, "", "")


@pytest.mark.parametrize("name", MISTAKES)
def test_a_typical_mistake_is_found_where_it_stands(conf, name):
    mistake = MISTAKES[name]
    assert GOOD.count(mistake.before) >= 1
    offset = GOOD.index(mistake.before)
    text = GOOD.replace(mistake.before, mistake.after, 1)
    conf.write_text(text)
    findings = [entry for entry in check(conf, "--strict", status=REFUSED)]
    said = [entry for entry in findings if mistake.said in entry["message"]]
    assert said, findings
    if mistake.at or mistake.after:
        start = offset + mistake.after.index(mistake.at)
        line = text.count("\n", 0, start) + 1
        column = start - text.rfind("\n", 0, start)
        places = [(entry["line"], entry["column"]) for entry in said]
        # Some are about the whole of which the changed text is a part.
        assert (line, column) in places or (not mistake.at and line in [p[0] for p in places]) or (
            name in ("an unclosed tag", "a backend for inputs", "a missing line", "a bare ampersand")
        ), (places, (line, column))


@pytest.mark.parametrize(
    "content, said",
    [
        (b"\xef\xbb\xbf" + GOOD.encode(), "byte order mark"),
        (GOOD.encode("utf-16"), "UTF-16"),
        (b"", "empty"),
        (b" \n", "empty"),
        (GOOD.replace("door", "T\xfcr").encode("latin-1"), "UTF-8"),
        (GOOD.encode()[:200], "malformed"),
    ],
)
def test_a_file_that_the_parser_cannot_read_is_told_with_the_reason(conf, content, said):
    conf.write_bytes(content)
    findings = check(conf, status=REFUSED)
    assert any(said in entry["message"] for entry in findings), findings


def test_the_place_is_printed_as_compilers_do(conf):
    conf.write_text(GOOD.replace('nbr="1"', 'nbr="0"'))
    done = client.run("check", str(conf))
    assert done.stdout.startswith(f"{conf}:13:14: error: ")


def test_numbers_from_one_are_recognised(conf):
    for number in (2, 1, 0):
        conf.write_text(conf.read_text().replace(f'nbr="{number}"', f'nbr="{number + 1}"'))
    (finding,) = check(conf)
    assert "begin at 1" in finding["message"] and finding["severity"] == "warning"


def test_more_than_five_ports_want_their_first_virtual_input(conf):
    ports = "".join(
        f'<port name="p{number}"><port_type type="input"/><port_no nbr="{number}"/>'
        '<properties ioport="true"/><backend name="null"/></port>\n'
        for number in range(6)
    )
    conf.write_text(f"<ports>\n{ports}</ports>")
    (finding,) = check(conf)
    assert '<first_virtual_input nbr="6"/>' in finding["message"] and finding["line"] == 7
    conf.write_text(f'<ports>\n{ports}<first_virtual_input nbr="6"/></ports>')
    assert check(conf) == []


def test_a_fragment_takes_the_place_of_a_port_without_complaint(conf, tmp_path):
    fragment = tmp_path / "10-door.xml"
    fragment.write_text(GOOD[: GOOD.index('  <port name="relay"')] + "</ports>\n")
    assert check(conf, fragment, "--strict") == []


def test_every_file_of_a_folder_counts_and_copies_are_told(conf, tmp_path):
    folder = tmp_path / "portd.d"
    folder.mkdir()
    (folder / "a.xml~").write_text("<ports/>")
    (finding,) = check(conf, folder, status=REFUSED)
    assert finding["file"] == f"{folder}/a.xml~" and "move it away" in finding["message"]


def test_a_file_that_is_not_there_is_a_senseless_command_line(tmp_path):
    assert client.run("check", str(tmp_path / "none.xml")).returncode == USAGE


SETTINGS = """# remarks are kept
[door]
input_name=Front door
input_activelow=false

[relay]
output_name=Relay
output_activelow=true
button_type=none
pulse_time=0
port_mode=bistable
delay_time=0

[line]
input_name=Line
input_activelow=false
supervised_input_ranges=[('open', uint32 100, uint32 200)]
supervised_input=true
"""


@pytest.mark.parametrize(
    "before, after, line, column, said",
    [
        ("Front door", r"C:\quarry", 3, 12, "write \\\\ for a backslash"),
        ("input_name=Front door\n", "", 2, 1, "lacks input_name"),
        ("output_activelow=true", "output_activelow=yes", 8, 18, "true or false"),
        ("port_mode=bistable", "port_mode=Bistable", 11, 11, 'write "bistable"'),
        ("button_type=none", "button_type=toggle", 9, 13, "none, pulse, actinact"),
        ("pulse_time=0", "pulse_tim=0", 10, 1, 'did you mean "pulse_time"?'),
        ("pulse_time=0", "pulse_time=soon", 10, 12, "no number"),
        ("uint32 200", "200, 4", 17, 25, "no ranges"),
        ("('open'", "('ajar'", 17, 25, "no state"),
        ("uint32 200", "uint32 20", 17, 25, "lower < upper"),
        ("[relay]", "[relais]", 6, 1, 'no port is called "relais"'),
        ("pulse_time=0", "pulse_time", 10, 1, "malformed"),
        ("input_activelow=false\n\n", "input_activelow=false\noutput_name=x\n", 5, 1, "has no effect"),
    ],
)  # fmt: skip
def test_a_mistake_in_the_settings_is_found(conf, tmp_path, before, after, line, column, said):
    settings = tmp_path / "portd.conf"
    settings.write_text(SETTINGS)
    assert check(conf, "--settings", settings, "--strict") == []
    settings.write_text(SETTINGS.replace(before, after, 1))
    findings = check(conf, "--settings", settings, "--strict", status=REFUSED)
    found = [(entry["line"], entry["column"]) for entry in findings if said in entry["message"]]
    assert (line, column) in found, findings


def test_the_settings_that_the_daemon_writes_pass(device: Device, tmp_path):
    ports = GOOD.replace('name="gpio"', 'name="check"').replace('name="spi"', 'name="check"')
    device.write("/run/door", "0\n").chmod(0o666)
    device.conf(ports)
    device.start()
    device.call("SetName", "ubs", 0, True, r"C:\quarry")
    device.stop()
    conf, settings = tmp_path / "conf.xml", tmp_path / "portd.conf"
    conf.write_text(ports)
    settings.write_text(device.read_settings())
    assert "quarry" in settings.read_text()
    assert check(conf, "--settings", settings, "--strict") == []
    device.start()
