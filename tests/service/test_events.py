"""Events of ports on the device's event system, as any service sees them on the bus."""

import pytest

from harness import Device, hwdesc, port
from producer import SUPERVISED, Producer

IOPORT = '<event declaration="IOPort"/>'
PORT_ANY = '<event declaration="PortAny" output="false"/>'


def key(name: str, value: str, kind: str, more: str = "") -> str:
    return f'<keyvalue key="{name}" value="{value}" type="{kind}" {more}/>'


def event(declaration: str, *keys: str, attributes: str = "") -> str:
    return f'<event declaration="{declaration}" {attributes}>{"".join(keys)}</event>'


@pytest.fixture
def start(make_device):
    def start_with(*ports: str) -> tuple[Device, Producer]:
        device = make_device()
        device.conf(hwdesc(*ports))
        device.start()
        return device, Producer(device)

    return start_with


def test_an_output_declares_its_event_with_topics_names_and_state(start):
    _device, producer = start(
        port("relay", 0, kind="output", names={"output": "Door"}, extra=IOPORT)
    )
    assert producer.only("", port=0) == {
        "type": "",
        "keys": {"port": 0, "state": False, "topic0": "Device", "topic1": "IO", "topic2": "Port"},
        "namespaces": {"topic0": "tns1", "topic1": "tnskelv", "topic2": "tnskelv"},
        "tags": {"port": "onvif-source", "state": "onvif-data"},
        "nice_names": {
            "port": ("Port", "Door"),
            "state": ("Active", ""),
            "topic1": ("", "Input ports"),
            "topic2": ("", "Digital input port"),
        },
        "property": "state",
    }


def test_a_change_is_sent_with_every_key_and_shows_in_the_list(start):
    device, producer = start(port("relay", 0, kind="output", extra=IOPORT))
    (number,) = producer.ids("", port=0)
    with producer.signals("Sent") as sent:
        device.call("SetState", "ub", 0, True)
        got, values = sent.wait()
    assert got == number
    assert values["state"] is True
    assert values["port"] == 0
    assert values["topic2"] == "Port"
    assert producer.only("", port=0)["keys"]["state"] is True


def test_setting_the_state_that_a_port_has_sends_nothing(start):
    device, producer = start(port("relay", 0, kind="output", extra=IOPORT))
    with producer.signals("Sent") as sent:
        device.call("SetState", "ub", 0, False)
        device.call("SetState", "ub", 0, True)
        sent.wait()
        assert len(sent.received) == 1


def test_an_event_for_inputs_only_is_not_declared_for_an_output(start):
    _device, producer = start(
        port("relay", 0, kind="output", extra='<event declaration="IOPort" output="false"/>')
    )
    assert producer.declarations() == {}


def test_the_events_of_a_configurable_port_follow_its_direction(start):
    device, producer = start(
        port(
            "either",
            0,
            kind="io_ctrl",
            extra='<event declaration="in.only" output="FALSE"/>'
            '<event declaration="out.only" input="False"/>',
        )
    )
    assert producer.ids("in.only") and not producer.ids("out.only")
    device.call("SetDirection", "us", 0, "output")
    assert producer.ids("out.only") and not producer.ids("in.only")
    device.call("SetDirection", "us", 0, "input")
    assert producer.ids("in.only") and not producer.ids("out.only")


def test_a_new_name_is_declared_anew(start):
    device, producer = start(port("contact", 0, extra=IOPORT))
    with producer.signals("Undeclared") as undeclared, producer.signals("Declared") as declared:
        device.call("SetName", "ubs", 0, True, "Back door")
        undeclared.wait()
        _number, entry = declared.wait()
    assert entry["nice_names"]["port"] == ("Port", "Back door")


def test_the_same_name_again_is_not_declared_anew(start):
    device, producer = start(port("contact", 0, extra=IOPORT))
    device.call("SetName", "ubs", 0, True, "Back door")
    before = producer.declarations()
    with producer.signals("Undeclared") as undeclared:
        device.call("SetName", "ubs", 0, True, "Back door")
        assert producer.declarations().keys() == before.keys()
        assert undeclared.received == []


def test_ports_share_one_any_port_declaration_that_is_never_withdrawn(start):
    device, producer = start(
        port("first", 0, extra=PORT_ANY),
        port("second", 1, extra=PORT_ANY),
        port("either", 2, kind="io_ctrl", extra=PORT_ANY),
    )
    entry = producer.only("", port=-1)
    assert entry["nice_names"]["port"] == ("Port", "Any")
    device.call("SetName", "ubs", 0, True, "Other")
    device.call("SetDirection", "us", 2, "output")
    assert len(producer.ids("", port=-1)) == 1


def test_the_any_port_event_is_active_while_any_of_its_ports_is(start):
    device, producer = start(
        port("first", 0, extra=PORT_ANY),
        port("second", 1, extra=PORT_ANY),
    )
    assert producer.only("", port=-1)["keys"]["state"] is False
    with producer.signals("Sent") as sent:
        device.call("SetActive", "ubs", 1, True, "open")
        _number, values = sent.wait()
    assert values["state"] is True
    assert producer.only("", port=-1)["keys"]["state"] is True


def test_a_described_event_gets_its_keys_and_sends_its_first_state(start):
    described = event(
        "com.example.Door",
        key("door", "7", "int", 'key-nice-name="Door" value-nice-name="PORT_NAME"'),
        key("note", "as it stands", "string"),
        key("ratio", "0.5", "double"),
        key("yes", "yes", "bool"),
        key("one", "1", "bool"),
        key("open", "PORT_STATUS", "bool", 'property="TRUE"'),
    )
    device, producer = start(
        port("contact", 0, names={"input": "Gate"}, extra=described),
    )
    entry = producer.only("com.example.Door")
    assert entry["keys"] == {
        "door": 7,
        "note": "as it stands",
        "ratio": 0.5,
        "yes": False,
        "one": True,
        "open": False,
    }
    assert entry["property"] == "open"
    assert entry["nice_names"]["door"] == ("Door", "Gate")
    with producer.signals("Sent") as sent:
        device.call("SetActive", "ubs", 0, True, "open")
        _number, values = sent.wait()
    assert values["open"] is True and values["door"] == 7


@pytest.mark.parametrize(
    "word, kind, low, high",
    [
        ("PORT_STATUS", "int", 0, 1),
        ("PORT_STATUS", "string", "false", "true"),
        ("PORT_ACTIVE", "bool", False, True),
        ("PORT_ACTIVE", "string", "inactive", "active"),
        ("PORT_SUPERVISED_STATUS", "int", 0, 0),
        ("PORT_SUPERVISED_STATUS", "string", "open", "open"),
        ("PORT_SUPERVISED_STATUS", "bool", False, False),
    ],
)
def test_a_state_word_takes_the_form_of_its_key(start, word, kind, low, high):
    device, producer = start(
        port("relay", 0, kind="output", extra=event("t", key("v", word, kind, 'property="true"')))
    )
    assert producer.only("t")["keys"]["v"] == low
    with producer.signals("Sent") as sent:
        device.call("SetState", "ub", 0, True)
        _number, values = sent.wait()
    assert values["v"] == high


def test_an_event_that_is_only_declared_is_never_sent(start):
    quiet = event(
        "quiet", key("v", "PORT_STATUS", "bool", 'property="true"'), attributes='declare_only="true"'
    )
    device, producer = start(port("relay", 0, kind="output", extra=quiet + IOPORT))
    (quiet_id,) = producer.ids("quiet")
    with producer.signals("Sent") as sent:
        device.call("SetState", "ub", 0, True)
        sent.wait()
        device.call("SetState", "ub", 0, False)
        sent.wait_count(2)
        assert quiet_id not in [number for number, _values in sent.received]
    assert "v" not in producer.only("quiet")["keys"]


@pytest.mark.parametrize(
    "bad",
    [
        key("v", "PORT_STATUS", "double"),
        key("v", "PORT_ACTIVE", "double", 'property="true"'),
        key("v", "x", "float"),
        '<keyvalue key="v" value="x"/>',
        '<keyvalue value="x" type="int"/>',
        key("v", "not a number", "int"),
    ],
)
def test_a_bad_key_costs_its_event_and_not_the_daemon(start, bad):
    device, producer = start(port("relay", 0, kind="output", extra=event("bad", bad) + IOPORT))
    assert producer.ids("bad") == []
    with producer.signals("Sent") as sent:
        device.call("SetState", "ub", 0, True)
        sent.wait()
        assert len(sent.received) == 1


def test_an_event_without_a_declaration_name_is_left_out(start):
    device, producer = start(port("relay", 0, kind="output", extra='<event input="true"/>'))
    assert producer.declarations() == {}
    device.wait_log("Failed to create event declaration")


def test_the_supervised_event_is_not_declared_for_a_plain_input(start):
    supervised = f'<event declaration="{SUPERVISED}" input="false" output="false" supervised_input="true"/>'
    _device, producer = start(port("contact", 0, extra=supervised))
    assert producer.declarations() == {}


def test_a_virtual_change_sends_the_events_of_a_port(start):
    device, producer = start(port("contact", 0, extra=IOPORT))
    with producer.signals("Sent") as sent:
        device.call("SetVirtual", "ub", 0, True)
        _number, values = sent.wait()
    assert values["state"] is True


def test_events_and_changes_of_a_sequence_come_in_the_order_of_its_steps(start):
    device, producer = start(port("relay", 0, kind="output", extra=IOPORT))
    steps = [(index % 2 == 0, 1) for index in range(100)]
    with producer.signals("Sent") as sent, device.signals() as changes:
        with device.signals("ActionSequenceDone") as done:
            device.call("StartActionSequence", "uba(bi)", 0, False, steps)
            done.wait()
        assert [values["state"] for _number, values in sent.received] == [s for s, _t in steps]
        assert [change.state for change in changes.received] == [s for s, _t in steps]


def test_renaming_a_port_while_its_sequence_sends_events_harms_neither(start):
    device, producer = start(port("relay", 0, kind="output", extra=IOPORT + PORT_ANY))
    steps = [(index % 2 == 0, 0) for index in range(3000)]
    with (
        device.signals("ActionSequenceDone") as done,
        device.signals("PortChanged") as changed,
        producer.signals("Sent") as sent,
    ):
        device.call("StartActionSequence", "uba(bi)", 0, False, steps)
        for index in range(100):
            device.call("SetName", "ubs", 0, False, f"Name {index}")
        done.wait(timeout=30)
        assert len(changed.received) == len(steps)
        assert [values["state"] for _id, values in sent.received if "port" in values] == [
            state for state, _time in steps
        ]
    assert producer.only("", port=0)["nice_names"]["port"] == ("Port", "Name 99")


def test_dropping_and_refreshing_ports_leaves_one_declaration_each(start):
    device, producer = start(
        port("relay", 0, kind="output", extra=IOPORT),
        port("spare", 1, optional=True, extra=IOPORT + PORT_ANY),
    )
    before = len(producer.declarations())
    for _round in range(20):
        device.call("DropIOPorts", "as", ["spare"])
        device.call("RefreshIOPorts")
    assert len(producer.declarations()) == before


def test_an_event_of_both_roles_names_the_port_as_its_role_does(start):
    names = {"input": "Button", "output": "Lamp"}
    device, producer = start(port("both", 0, "io_ctrl", names=names, extra=IOPORT))
    assert producer.only("", port=0)["nice_names"]["port"] == ("Port", "Button")
    device.call("SetDirection", "us", 0, "output")
    assert producer.only("", port=0)["nice_names"]["port"] == ("Port", "Lamp")


def test_the_same_direction_again_is_not_declared_anew(start):
    device, producer = start(port("both", 0, "io_ctrl", extra=IOPORT))
    before = producer.ids("", port=0)
    device.call("SetDirection", "us", 0, "input")
    assert producer.ids("", port=0) == before


def test_of_several_property_keys_the_last_is_the_property_and_all_are_sent(start):
    keys = (
        key("first", "PORT_STATUS", "bool", 'property="true"'),
        key("last", "PORT_ACTIVE", "string", 'property="true"'),
    )
    device, producer = start(port("relay", 0, "output", extra=event("Own.Type", *keys)))
    # New keys are put in front of the earlier ones.
    assert producer.only("Own.Type")["property"] == "first"
    with producer.signals("Sent") as sent:
        device.call("SetState", "ub", 0, True)
        _, values = sent.wait()
    assert (values["first"], values["last"]) == (True, "active")


def test_a_dropped_port_is_withdrawn_and_comes_back_with_the_state_that_it_has(start):
    device, producer = start(port("siren", 0, "output", optional=True, extra=IOPORT))
    device.call("SetState", "ub", 0, True)
    assert producer.only("", port=0)["keys"]["state"] is True
    device.call("DropIOPorts", "as", ["siren"])
    assert producer.ids("", port=0) == []
    device.call("RefreshIOPorts")
    assert producer.only("", port=0)["keys"]["state"] is False


def test_the_events_are_withdrawn_when_the_daemon_stops(start):
    device, producer = start(
        port("relay", 0, kind="output", extra=IOPORT),
        port("contact", 1, extra=IOPORT),
    )
    ids = set(producer.declarations())
    with producer.signals("Undeclared") as undeclared:
        device.stop()
        undeclared.wait_count(2)
        assert {number for (number,) in undeclared.received} == ids
