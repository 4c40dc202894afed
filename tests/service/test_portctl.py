"""portctl's commands against the real daemon."""

import re
import subprocess
from pathlib import Path

import pytest

import portctl as client
from harness import hwdesc, port, wait_for
from portctl import NO_DAEMON, NO_PORT, NOT_ALLOWED, OK, REFUSED, USAGE, Portctl

PORTS = hwdesc(
    port("door", 0, names={"input": "Door"}),
    port("relay", 1, kind="output", names={"output": "Relay"}, extra='<event declaration="IOPort"/>'),
    port("io", 2, kind="io_ctrl", names={"input": "Gate", "output": "Lamp"}),
    port("module", 3, optional=True, names={"input": "Module"}),
    port("plug", 4, flags="video_connector hidden"),
    port("twin", 5, names={"input": "Door"}),
)
REPOSITORY = Path(__file__).resolve().parents[2]
COMMANDS = (
    "list get set toggle direction name active pulse sequence virtual supervised connectors drop "
    "refresh events monitor wait"
).split()


@pytest.fixture
def portctl(device) -> Portctl:
    device.conf(PORTS)
    device.start()
    return Portctl(device)


def test_the_table_shows_every_port_with_its_columns_aligned(portctl):
    heading, *rows = portctl("list").splitlines()
    titles = ["No", "Identifier", "Name", "Role", "State", "Active", "Line", "Flags"]
    assert heading.split() == titles
    assert [row.split()[:2] for row in rows] == [
        ["0", "door"], ["1", "relay"], ["2", "io"], ["3", "module"], ["4", "plug"], ["5", "twin"],
    ]  # fmt: skip
    role = heading.index("Role")
    assert rows[1][role:].split()[:3] == ["output", "inactive", "high"]
    assert rows[2][role:].startswith("configurable input")
    assert rows[4].endswith("hidden video_connector")


def test_json_holds_what_the_daemon_tells(portctl):
    relay = portctl.json("list")[1]
    assert relay == {
        "number": 1, "identifier": "relay", "name": "Relay", "input_name": "",
        "output_name": "Relay", "direction": "output", "configurable": False, "active": False,
        "active_low": False, "flags": {"ioport": True},
    }  # fmt: skip


@pytest.mark.parametrize("word", ["1", "relay", "Relay"])
def test_a_port_is_found_by_number_identifier_and_name(portctl, device, word):
    assert portctl("set", word, "active") == ""
    assert device.call("GetState", "u", 1) is True
    assert portctl("get", word) == "active\n"
    assert portctl.json("get", word) == {"number": 1, "active": True}


def test_a_name_that_two_ports_have_is_refused_with_the_candidates(portctl):
    said = portctl.fails(NO_PORT, "get", "Door")
    assert '0 (door, "Door")' in said and '5 (twin, "Door")' in said


def test_an_unknown_port_is_refused_with_similar_ones(portctl):
    assert '1 (relay, "Relay")' in portctl.fails(NO_PORT, "get", "rela")
    assert "portctl list" in portctl.fails(NO_PORT, "get", "7")


def test_an_output_is_toggled(portctl):
    assert portctl("toggle", "relay") == "active\n"
    assert portctl("toggle", "relay") == "inactive\n"
    assert portctl("get", "relay") == "inactive\n"


def test_refusals_say_what_to_do(portctl):
    assert "portctl direction" in portctl.fails(REFUSED, "set", "0", "on")
    assert "configurable" in portctl.fails(REFUSED, "direction", "relay", "input")
    assert "supervised" in portctl.fails(REFUSED, "supervised", "relay", "on")
    assert "supervised" in portctl.fails(REFUSED, "supervised", "relay", "readout")
    assert "optional" in portctl.fails(REFUSED, "drop", "relay")


def test_a_configurable_port_is_turned(portctl):
    assert portctl("direction", "io") == "input\n"
    portctl("direction", "io", "output")
    assert portctl.json("direction", "io") == {"number": 2, "direction": "output"}


def test_names_and_levels_of_both_sides_are_set_and_read(portctl):
    portctl("name", "io", "Barrier")
    portctl("name", "io", "Light", "--output")
    assert portctl("name", "io") == "input: Barrier\noutput: Light\n"
    portctl("active", "io", "low")
    portctl("active", "io", "closed", "--output")
    assert portctl.json("active", "io") == {"input": "open", "output": "closed"}


def test_a_sequence_runs_and_is_waited_for(portctl, device):
    with device.signals() as changes:
        portctl("sequence", "relay", "on:20,off:10", "--repeat", "2", "--wait")
        wait_for(lambda: len(changes.received) == 4, "the four steps")
        assert [change.state for change in changes.take()] == [True, False, True, False]


def test_a_pulse_ends_inactive(portctl, device):
    with device.signals() as changes:
        portctl("pulse", "relay", "30", "--wait")
        wait_for(lambda: len(changes.received) == 2, "both edges")
        assert [change.state for change in changes.take()] == [True, False]


def test_a_busy_port_says_so(portctl, device):
    portctl("sequence", "relay", "on:60000")
    assert "ended" in portctl.fails(REFUSED, "pulse", "relay", "10")
    portctl("active", "relay", "low")  # ends the sequence


def test_a_state_is_reported_without_driving(portctl, device):
    with device.signals() as changes:
        portctl("virtual", "door", "on")
        assert changes.wait().virtual_trig is True


def test_connectors_are_listed(portctl):
    (connector,) = portctl.json("connectors")
    assert connector == {
        "kind": "video connector", "plugged": False, "number": 4, "identifier": "plug",
    }  # fmt: skip
    assert "not plugged in" in portctl("connectors")


def test_an_optional_port_is_dropped_and_comes_back(portctl, device):
    portctl("drop", "Module")
    assert 3 not in [entry.number for entry in device.port_props()]
    assert portctl("refresh") == "1 ports came back, 6 are in service\n"


def test_declared_events_are_listed(portctl):
    (event,) = portctl.json("events")
    assert event["declaration"]["keys"]["port"] == 1
    assert event["declaration"]["property"] == "state"
    assert "Device/IO/Port" in portctl("events")


def test_names_of_strangers_cannot_reach_the_terminal(portctl, device):
    name = 'a\x1b[31m"\\\n\x9b\u202eb'
    device.call("SetName", "ubs", 0, True, name)
    printed = portctl("list") + portctl("list", "--json") + portctl("name", "0")
    assert not re.search(r"[\x00-\x09\x0b-\x1f\x7f-\x9f\u202e]", printed)
    assert r'a\x1b[31m"\\x0a\x9b\u{202e}b' in printed
    assert portctl.json("list")[0]["name"] == name


def test_colours_stay_away_from_pipes_and_files(portctl):
    done = portctl.run("list", TERM="xterm")
    assert "\x1b" not in done.stdout


def test_every_help_fits_a_screen():
    assert client.run().returncode == USAGE
    for words in ([], *([command] for command in COMMANDS)):
        done = client.run(*words, "--help")
        lines = done.stdout.splitlines()
        assert done.returncode == OK and len(lines) <= 24, words
        assert max(map(len, lines)) <= 80, words
    overview = client.run("--help").stdout
    assert all(re.search(rf"^  {command} ", overview, re.M) for command in COMMANDS)


@pytest.mark.parametrize(
    "words",
    ["shine", "get", "set 1", "set 1 bright", "list more", "set 1 on --json", "get --colour 1",
     "pulse 1 soon", "sequence 1 on", "sequence 1 on:1,", "sequence 1 on:9999999", "active 1 up",
     "sequence 1 on:1 --repeat 0", "direction 1 inwards", "wait 1 active --timeout never"],
)  # fmt: skip
def test_a_senseless_command_line_is_told_before_the_bus_is_asked(words):
    done = client.run("--address", "unix:path=/nonexistent", *words.split())
    assert done.returncode == USAGE and done.stderr.startswith("portctl: "), done


def test_a_missing_bus_and_a_missing_daemon_are_told_apart(device):
    done = client.run("--address", "unix:path=/nonexistent", "list")
    assert done.returncode == NO_DAEMON and "no connection" in done.stderr
    device.bus.start()
    assert "systemctl start portd" in Portctl(device).fails(NO_DAEMON, "list")


def test_who_may_not_change_is_sent_to_the_group(device):
    device.conf(PORTS)
    policy = """<busconfig><policy context="mandatory">
      <deny send_interface="com.kelv.IOControl.State" send_member="SetState"/>
    </policy></busconfig>"""
    device.write("/etc/dbus-1/system.d/zz-deny.conf", policy)
    device.start()
    portctl = Portctl(device)
    assert portctl("get", "1") == "inactive\n"
    assert "membership of the group portd" in portctl.fails(NOT_ALLOWED, "set", "1", "on")


def test_output_that_nobody_reads_ends_quietly(portctl, device):
    running = portctl.start("list")
    assert running.stdout is not None
    running.stdout.close()
    assert running.wait(20) in (OK, -13)
    assert running.stderr is not None and running.stderr.read() == ""
    running.stderr.close()


def test_shells_are_offered_commands_and_ports(portctl, device):
    assert "set:Drive an output" in portctl("__words", "commands")
    words = portctl("__words", "ports").splitlines()
    assert "1:Relay" in words and "relay:Relay" in words
    device.stop()
    assert portctl("__words", "ports") == ""
    device.start()


def test_bash_completes_ports_and_what_a_command_takes(portctl, device):
    completion = REPOSITORY / "data/completions/portctl.bash"
    stand_in = f'portctl() {{ "{client.binary()}" --address "{device.bus.address}" "$@"; }}'

    def offered(*words: str) -> list[str]:
        line = " ".join(f"'{word}'" for word in ("portctl", *words))
        script = (
            f'{stand_in}; source "{completion}"; COMP_WORDS=({line}); '
            f'COMP_CWORD={len(words)}; _portctl; printf "%s\\n" "${{COMPREPLY[@]}}"'
        )
        done = subprocess.run(["bash", "-c", script], capture_output=True, text=True, timeout=30)
        assert done.stderr == ""
        return done.stdout.split()

    assert offered("tog") == ["toggle"]
    assert offered("set", "re") == ["relay"]
    assert offered("set", "relay", "in") == ["inactive"]
    assert "--repeat" in offered("sequence", "relay", "--")
