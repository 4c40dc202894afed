"""The look-up of the hardware id, which limits ports to hardware variants, against a played policy
service."""

import time

import pytest

from harness import Device, hwdesc, port
from neighbours import Neighbourhood, neighbourhood_fixture

neighbourhood = pytest.fixture(neighbourhood_fixture)

NAME = "com.kelv.PolicyKitSystem"
PATH = "/com/kelv/PolicyKitSystem"
NOT_HAD = "Could not get the hardware id"
REFUSED = "INFO: portd: Failed to request policykit system: "

DOCUMENT = hwdesc(
    port("always", 0),
    port("same", 1, hwid="A1:77"),
    port("listed", 2, hwid="B2:A1"),
    port("other", 3, hwid="B2:C3"),
)


@pytest.fixture
def device(make_device) -> Device:
    device = make_device()
    device.conf(DOCUMENT)
    return device


def play(neighbourhood: Neighbourhood, device: Device, signature: str, code: str, **behaviour):
    methods = [("ReadBootblockParam", "s", signature, code)]
    return neighbourhood.play(device, NAME, {PATH: (NAME, {}, methods)}, **behaviour)


def ids(device: Device) -> set[str]:
    return {props.id for props in device.port_props()}


EVERYTHING = {"always", "same", "listed", "other"}


def test_the_id_of_the_policy_service_decides_which_ports_there_are(device, neighbourhood):
    service = play(neighbourhood, device, "s", "ret = 'A1:7' if args[0] == 'HWID' else 'B2'")
    device.start()
    assert ids(device) == {"always", "same", "listed"}
    assert service.calls(PATH, "ReadBootblockParam") == [("HWID",)]
    assert device.log_count(NOT_HAD) == 0


def test_each_document_that_filters_asks_once(device, neighbourhood):
    service = play(neighbourhood, device, "s", "ret = 'A1'")
    device.fragment("filters.xml", hwdesc(port("more", 4, hwid="A1"), port("less", 5, hwid="B2")))
    device.fragment("plain.xml", hwdesc(port("plain", 6)))
    device.start()
    assert ids(device) == {"always", "same", "listed", "more", "plain"}
    assert len(service.calls(PATH, "ReadBootblockParam")) == 2


def test_without_the_service_every_port_is_kept(device):
    device.start()
    assert ids(device) == EVERYTHING
    assert device.log_count(NOT_HAD) == 3
    assert device.log_count(REFUSED) == 3


def test_a_port_is_filtered_by_the_first_answer_that_is_one(device, neighbourhood):
    code = "self.asked = getattr(self, 'asked', 0) + 1; ret = 'A1' if self.asked > 1 else 1 / 0"
    service = play(neighbourhood, device, "s", code)
    device.start()
    assert ids(device) == {"always", "same", "listed"}
    assert device.log_count(NOT_HAD) == device.log_count(REFUSED) == 1
    assert len(service.calls(PATH, "ReadBootblockParam")) == 2


def test_the_service_is_watched_only_while_the_ports_are_loaded(device, neighbourhood):
    play(neighbourhood, device, "s", "ret = 'A1'")
    device.start()
    bus, stats = "org.freedesktop.DBus", "org.freedesktop.DBus.Debug.Stats"
    rules = device.bus.call(bus, "/org/freedesktop/DBus", stats, "GetAllMatchRules")
    assert not [rule for of_one in rules.values() for rule in of_one if NAME in rule]


def test_an_error_as_the_answer_keeps_every_port(device, neighbourhood):
    play(neighbourhood, device, "s", "raise ValueError('no boot block')")
    device.start()
    assert ids(device) == EVERYTHING
    assert device.log_count(NOT_HAD) == 3
    assert sum("no boot block" in line for line in device.log().splitlines()) == 3


@pytest.mark.parametrize("signature, code", [("", ""), ("i", "ret = 7"), ("ss", "ret = ('A1', 'A1')"),
                                             ("as", "ret = ['A1']"),
                                             ("v", "ret = dbus.String('A1', variant_level=1)")])  # fmt: skip
def test_an_answer_of_the_wrong_type_keeps_every_port(device, neighbourhood, signature, code):
    play(neighbourhood, device, signature, code)
    device.start()
    assert ids(device) == EVERYTHING
    assert device.log_count(NOT_HAD) == 3


def test_a_service_that_appears_after_the_start_changes_nothing(device, neighbourhood):
    device.start()
    play(neighbourhood, device, "s", "ret = 'A1'")
    assert ids(device) == EVERYTHING
    device.restart()
    assert ids(device) == {"always", "same", "listed"}


def test_a_late_answer_is_waited_for(device, neighbourhood):
    play(neighbourhood, device, "s", "time.sleep(5); ret = 'A1'")
    began = time.monotonic()
    device.start()
    assert time.monotonic() - began >= 5
    assert ids(device) == {"always", "same", "listed"}
