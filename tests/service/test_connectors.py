"""The connector interface: how many connectors the device has, and which are plugged in."""

import pytest

from harness import DBusError, Device, hwdesc, port

NAME = "com.kelv.PCD.Connector"
PATH = "/com/kelv/PCD/Connector"

# Ports are listed from the newest to the oldest.
PORTS = (
    port("video", 0, kind="output", flags="ioport video_connector"),
    port("audio", 1, kind="output", flags="ioport audio_connector"),
    port("both", 2, kind="output", flags="video_connector audio_connector"),
    port("neither", 3, kind="output"),
    port("bare", 4, backend=None, flags="video_connector"),
)


@pytest.fixture
def device(make_device) -> Device:
    device = make_device()
    device.conf(hwdesc(*PORTS))
    device.start()
    device.wait_name(NAME)
    return device


def number(device: Device, description: str) -> int:
    return device.bus.call(NAME, PATH, NAME, "GetNumConnectors", "s", description)


def states(device: Device, description: str) -> list[int]:
    return device.bus.call(NAME, PATH, NAME, "GetConnectorStates", "s", description)


def test_a_star_selects_all_connectors_and_counts_one_with_both_flags_once(device):
    assert number(device, "*") == 3
    assert states(device, "*") == [0, 0, 0]


def test_a_description_selects_the_connectors_of_one_kind(device):
    assert number(device, "video connector") == 2
    assert number(device, "audio connector") == 2


@pytest.mark.parametrize("description", ["VIDEO CONNECTOR", "Video Connector", "Audio connector"])
def test_the_letter_case_of_a_description_means_nothing(device, description):
    assert number(device, description) == 2
    assert states(device, description) == [0, 0]


@pytest.mark.parametrize("description", ["video_connector", "", "video", "**", " *", "vidéo connector"])
def test_any_other_description_selects_nothing(device, description):
    assert number(device, description) == 0
    assert states(device, description) == []


def test_states_come_in_registry_order_and_follow_the_ports(device):
    device.call("SetState", "ub", 0, True)
    assert states(device, "*") == [0, 0, 1]
    assert states(device, "video connector") == [0, 1]
    assert states(device, "audio connector") == [0, 0]
    device.call("SetState", "ub", 1, True)
    assert states(device, "*") == [0, 1, 1]
    device.call("SetActive", "ubs", 0, False, "open")
    device.call("SetState", "ub", 0, False)
    assert states(device, "*") == [0, 1, 0]


@pytest.mark.parametrize("value, count", [("true", 1), ("TRUE", 1), ("True", 1), ("yes", 0), ("1", 0),
                                          ("false", 0), ("", 0), (" true", 0)])  # fmt: skip
def test_a_flag_counts_only_when_its_value_is_true_in_any_letter_case(make_device, value, count):
    device = make_device()
    flag = f'<properties ioport="true" video_connector="{value}"/>'
    device.conf(hwdesc(port("jack", 0, flags="", extra=flag)))
    device.start()
    device.wait_name(NAME)
    assert number(device, "video connector") == count


def test_a_device_without_connectors_answers_with_nothing(make_device):
    device = make_device()
    device.conf(hwdesc(port("contact", 0)))
    device.start()
    device.wait_name(NAME)
    assert number(device, "*") == 0
    assert states(device, "*") == []


def test_a_parked_connector_is_none_until_it_comes_back(make_device):
    device = make_device()
    device.conf(hwdesc(port("jack", 0, flags="ioport video_connector", optional=True)))
    device.start()
    device.wait_name(NAME)
    assert device.call("DropIOPorts", "as", ["jack"]) == ["jack"]
    assert number(device, "*") == 0
    device.call("RefreshIOPorts")
    assert number(device, "*") == 1


def test_emitting_an_snmp_event_is_not_implemented(device):
    with pytest.raises(DBusError) as error:
        device.bus.call(NAME, PATH, NAME, "EmitSNMPEvent", "ii", 1, 1)
    assert error.value.name == "org.freedesktop.DBus.Error.UnknownMethod"
    assert error.value.message == f"Method EmitSNMPEvent is not implemented on interface {NAME}"


def test_the_interface_has_just_its_three_methods(device):
    xml = device.bus.call(NAME, PATH, "org.freedesktop.DBus.Introspectable", "Introspect")
    interface = xml.split(f'<interface name="{NAME}">')[1].split("</interface>")[0]
    members = [line.strip() for line in interface.splitlines() if "<method" in line]
    assert members == [f'<method name="{name}">' for name in
                       ("GetNumConnectors", "GetConnectorStates", "EmitSNMPEvent")]  # fmt: skip
    arguments = [line.strip() for line in interface.splitlines() if "<arg" in line]
    assert arguments == [
        '<arg type="s" name="connector_descr" direction="in"/>',
        '<arg type="i" name="num_connectors" direction="out"/>',
        '<arg type="s" name="connector_descr" direction="in"/>',
        '<arg type="ai" name="states" direction="out"/>',
        '<arg type="i" name="connector_id" direction="in"/>',
        '<arg type="i" name="connector_state" direction="in"/>',
    ]
    assert "<signal" not in interface and "<property" not in interface


def test_both_names_belong_to_the_daemon_and_go_with_it(device):
    assert device.bus.bus_call("GetNameOwner", "s", NAME) == device.bus.bus_call(
        "GetNameOwner", "s", "com.kelv.IOControl.State"
    )
    device.stop()
    assert not device.bus.has_owner(NAME)
