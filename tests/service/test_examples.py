"""The example descriptions that are installed: the daemon takes each of them as it stands.

The hardware that they describe is not there. What the daemon says of that is no matter here; what
it says of the document is.
"""

import re
import subprocess
from configparser import ConfigParser
from xml.etree import ElementTree

import pytest

import portctl
from harness.device import REPOSITORY

EXAMPLES = sorted((REPOSITORY / "data/examples").glob("*.xml"))

# What a mistake in a description makes the daemon say.
_OF_THE_DOCUMENT = re.compile(
    r"Couldn't (load|parse)|Unsupported port type|Could not parse|configured incorrectly"
    r"|Failed to configure port|FIRST_VIRTUAL_PORT|declaration|populat"
)


def test_there_are_examples():
    assert [path.stem for path in EXAMPLES] == ["board", "camera", "io-box", "manual-triggers"]


@pytest.mark.parametrize("path", EXAMPLES, ids=lambda path: path.stem)
def test_checker_finds_nothing_in_an_example(path):
    result = portctl.run("check", "--strict", str(path))
    assert (result.returncode, result.stdout) == (portctl.OK, "")


@pytest.mark.parametrize("path", EXAMPLES, ids=lambda path: path.stem)
def test_example_obeys_the_schema_for_editors(path):
    schema = REPOSITORY / "data/schema/portd-conf.rng"
    command = ["xmllint", "--nonet", "--noout", "--relaxng", schema, path]
    result = subprocess.run(command, capture_output=True, text=True, timeout=30)
    assert result.returncode == 0, result.stderr


@pytest.mark.parametrize("path", EXAMPLES, ids=lambda path: path.stem)
def test_example_is_taken_without_a_complaint(device, path):
    device.conf(path.read_text())
    device.allow_critical("")
    device.start()

    said = [line for line in device.log().splitlines() if _OF_THE_DOCUMENT.search(line)]
    assert said == []


@pytest.mark.parametrize("path", EXAMPLES, ids=lambda path: path.stem)
def test_every_port_of_an_example_has_its_names_and_ranges(device, path):
    device.conf(path.read_text())
    device.allow_critical("")
    device.start()

    settings = ConfigParser(interpolation=None)
    settings.read_string(device.read_settings())
    for port in ElementTree.fromstring(path.read_text()).iter("port"):
        group = settings[port.get("name")]
        for direction, name in port.find("param_default_name").attrib.items():
            assert group[f"{direction}_name"] == name
        for entry in port.findall("backend/range[@state]"):
            wanted = f"('{entry.get('state')}', {entry.get('lower')}, {entry.get('upper')})"
            assert wanted in group["supervised_input_ranges"].replace("uint32 ", "")
