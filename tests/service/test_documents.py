"""Manual pages, the schema for editors, the checker and the daemon agree with each other."""

import subprocess
from pathlib import Path

import pytest

import portctl as client
from harness import Device, default_binary
from portctl import OK, REFUSED
from test_portctl_check import GOOD, MISTAKES

BUILD = default_binary().parents[1]
SCHEMA = Path(__file__).resolve().parents[2] / "data/schema/portd-conf.rng"
PAGES = ("portctl.1", "portd-conf.xml.5", "portd.conf.5", "portd-dbus.7", "portd.8")

# What no schema can tell: the order of attributes, other ports, the type of the port, or meaning.
BEYOND_THE_SCHEMA = {
    "a duplicate number", "a hole", "a duplicate name", "ioports", "IOport", "overlapping ranges",
    "a range in another order", "an interval of nothing", "a missing line",
    "a name after another", "an empty range",
}  # fmt: skip


def examples() -> str:
    """One port for every backend, from the vocabulary."""
    printer = BUILD / "src/vocabulary/print-vocabulary"
    return subprocess.run([printer, "examples"], check=True, capture_output=True, text=True).stdout


def obeys_schema(path: Path) -> bool:
    command = ["xmllint", "--nonet", "--noout", "--relaxng", SCHEMA, path]
    return subprocess.run(command, capture_output=True).returncode == 0


@pytest.mark.parametrize("page", PAGES)
def test_a_manual_page_is_built_and_clean(page):
    done = subprocess.run(
        ["mandoc", "-T", "lint", "-W", "warning", BUILD / "doc" / page],
        capture_output=True, text=True,
    )  # fmt: skip
    # Newer versions of lowdown begin the text below a heading with a paragraph.
    known = "skipping paragraph macro: PP after SH"
    told = [line for line in done.stdout.splitlines() if not line.endswith(known)]
    assert (told, done.stderr) == ([], "")


def test_every_command_and_option_has_its_place_in_the_manual():
    page = (SCHEMA.parents[2] / "doc/portctl.1.md").read_text()
    for line in client.run("__words", "commands").stdout.splitlines():
        command = line.split(":")[0]
        assert f"- **{command}**" in page
        for option in client.run(command, "--help").stdout.split():
            if option.strip("[]").startswith("--"):
                assert option.strip("[]").split("|")[0].rstrip(".") in page, (command, option)


@pytest.mark.parametrize("name", [None, *MISTAKES])
def test_schema_and_checker_agree(tmp_path, name):
    conf = tmp_path / "conf.xml"
    mistake = MISTAKES.get(name)
    conf.write_text(GOOD.replace(mistake.before, mistake.after, 1) if mistake else GOOD)
    checked = client.run("check", "--strict", str(conf)).returncode
    assert checked == (REFUSED if mistake else OK)
    assert obeys_schema(conf) == (name is None or name in BEYOND_THE_SCHEMA)


def test_the_worked_examples_pass_and_the_daemon_makes_a_port_of_each(device: Device, tmp_path):
    conf = tmp_path / "conf.xml"
    conf.write_text(examples())
    done = client.run("check", "--strict", str(conf))
    assert (done.returncode, done.stdout) == (OK, "")
    assert obeys_schema(conf)
    device.allow_critical("")  # there is no hardware behind them
    device.conf(conf.read_text())
    device.start()
    backends = [line.split('"')[1] for line in examples().splitlines() if line.startswith("<port ")]
    made = {entry.id for entry in device.port_props()}
    assert {name for name in made if not name.startswith("manualtrigger")} == set(backends)


HINT = '"portctl check" lists them'


@pytest.mark.parametrize("name", ["nr for nbr", "port-type", "Port", "an unclosed tag"])
def test_the_daemon_goes_on_and_points_to_the_checker(device: Device, name):
    device.allow_critical("")
    device.conf(GOOD.replace(MISTAKES[name].before, MISTAKES[name].after, 1))
    device.start()
    device.wait_log(HINT)
    assert device.log_count(HINT) == 1


def test_the_daemon_has_nothing_to_say_of_what_the_checker_passes(device: Device):
    device.allow_critical("")
    device.conf(GOOD)
    device.start()
    assert device.log_count(HINT) == 0
