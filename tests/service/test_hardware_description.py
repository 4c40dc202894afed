"""Which documents make which ports."""

import os

import pytest

from control import call_everything, expect_no_port
from harness import hwdesc, port

PARSE_FAILURE = "Couldn't parse markup file"
LOAD_FAILURE = "Couldn't load XML"
NO_HARDWARE_ID = "Could not get the hardware id"
RENUMBERED = "You have a port with higher number than FIRST_VIRTUAL_PORT"


def identifiers(device) -> list[str]:
    return [entry.id for entry in device.port_props()]


@pytest.fixture
def hardware_id(device):
    """A neighbour that tells the hardware id A1:7."""
    mock = device.mock("com.kelv.PolicyKitSystem")
    return mock.method("ReadBootblockParam", "s", "s", "ret = 'A1:7' if args[0] == 'HWID' else ''")


def test_the_hardware_id_selects_ports(device, hardware_id):
    device.conf(
        hwdesc(
            port("prefix", 0, hwid="A1"),
            port("other", 1, hwid="A2", extra="<first_virtual_input nbr='3'/>"),
            port("neither", 2, kind="output", hwid="B1:B2", names={"output": "Gone"}),
            port("one_of_two", 3, hwid="B1:A"),
            port("too_long", 4, hwid="A1:77:XX"),
            port("none_needed", 5),
        )
    )
    device.start()
    # A filter is split at each colon: what matches "too_long" is its first piece.
    assert identifiers(device) == ["none_needed", "too_long", "one_of_two", "prefix"]
    assert device.call("GetNbrPorts") == (4, 0)
    expect_no_port(device, "GetState", "u", 1)
    expect_no_port(device, "GetState", "u", 2)


def test_the_hardware_id_is_asked_for_once_a_file(device, hardware_id):
    device.conf(hwdesc(port("a", 0, hwid="A1"), port("b", 1, hwid="A1"), port("c", 2, hwid="X")))
    device.fragment("more.xml", hwdesc(port("d", 3, hwid="A1")))
    device.start()
    assert identifiers(device) == ["d", "b", "a"]
    assert [list(call) for call in hardware_id.calls("ReadBootblockParam")] == [["HWID"], ["HWID"]]


def test_nobody_is_asked_without_a_filter(device, hardware_id):
    device.conf(hwdesc(port("a", 0)))
    device.start()
    assert hardware_id.calls("ReadBootblockParam") == []


def test_without_a_hardware_id_ports_are_kept(device):
    device.conf(hwdesc(port("a", 0, hwid="B9"), port("b", 1)))
    device.start()
    assert identifiers(device) == ["b", "a"]
    assert device.log_count(NO_HARDWARE_ID) == 1
    assert device.log_count("Failed to request policykit system: ") == 1


def test_a_failing_hardware_id_service_keeps_ports(device):
    mock = device.mock("com.kelv.PolicyKitSystem")
    mock.method("ReadBootblockParam", "s", "s", "raise ValueError('no bootblock')")
    device.conf(hwdesc(port("a", 0, hwid="B9")))
    device.start()
    assert identifiers(device) == ["a"]
    assert device.log_count(NO_HARDWARE_ID) == 1


def test_a_fragment_replaces_a_port_of_the_same_name(device):
    device.conf(hwdesc(port("a", 0), port("b", 1)))
    device.fragment("override.xml", hwdesc(port("a", 7, kind="output")))
    device.start()
    assert [(entry.id, entry.number, entry.input) for entry in device.port_props()] == [
        ("a", 7, False),
        ("b", 1, True),
    ]


def test_a_fragment_replaces_behind_the_filter_too(device, hardware_id):
    device.conf(hwdesc(port("a", 0)))
    device.fragment("override.xml", hwdesc(port("a", 7, hwid="A1")))
    device.start()
    assert [(entry.id, entry.number) for entry in device.port_props()] == [("a", 7)]


def test_a_filtered_out_fragment_replaces_nothing(device, hardware_id):
    device.conf(hwdesc(port("a", 0)))
    device.fragment("override.xml", hwdesc(port("a", 7, hwid="XX")))
    device.start()
    assert [(entry.id, entry.number) for entry in device.port_props()] == [("a", 0)]


def test_a_name_that_comes_late_adds_a_second_port(device):
    device.conf(hwdesc(port("a", 0)))
    late = port("a", 7).replace('<port name="a">', '<port optional="true" name="a">')
    device.fragment("second.xml", hwdesc(late))
    device.start()
    assert [(entry.id, entry.number) for entry in device.port_props()] == [("a", 7), ("a", 0)]
    assert device.call("DropIOPorts", "as", ["a"]) == ["a"]
    assert [(entry.id, entry.number) for entry in device.port_props()] == [("a", 0)]


def test_a_broken_fragment_ends_the_reading_of_fragments(device):
    device.allow_critical(PARSE_FAILURE)
    names = [f"f{number}" for number in range(6)]
    for number, name in enumerate(names):
        device.fragment(name, hwdesc(port(name, number)))
    # The folder is read in its own order, which rewriting a file in place doesn't change.
    order = os.listdir(device.path("/etc/portd.d"))
    device.fragment(order[3], "<ports>" + port("before_the_error", 9) + "<oops></ports>")
    device.conf(hwdesc())
    device.start()
    assert identifiers(device) == ["before_the_error", *reversed(order[:3])]
    complaints = [line for line in device.log().splitlines() if PARSE_FAILURE in line]
    assert len(complaints) == 1 and complaints[0].endswith(f"/{order[3]})")


def test_an_unreadable_fragment_ends_the_reading_of_fragments(device):
    device.allow_critical(LOAD_FAILURE)
    for name in ("a", "b", "c"):
        device.fragment(name, hwdesc(port(name, 0)))
    order = os.listdir(device.path("/etc/portd.d"))
    hidden = device.path(f"/etc/portd.d/{order[1]}")
    hidden.unlink()
    hidden.mkdir()
    # A new entry may have another place in the folder.
    order = os.listdir(device.path("/etc/portd.d"))
    device.conf(hwdesc())
    device.start()
    assert identifiers(device) == list(reversed(order[: order.index(hidden.name)]))
    assert device.log_count(LOAD_FAILURE) == 1


def test_a_missing_folder_of_fragments_is_no_error(device):
    device.path("/etc/portd.d").rmdir()
    device.conf(hwdesc(port("a", 0)))
    device.start()
    assert identifiers(device) == ["a"]


def test_fragments_alone_will_do(device):
    device.allow_critical(LOAD_FAILURE)
    device.fragment("only.xml", hwdesc(port("a", 0)))
    device.start()
    assert identifiers(device) == ["a"]
    assert device.log_count(f"{LOAD_FAILURE} (/usr/share/portd/conf.xml)") == 1


def test_sections_belong_to_the_backend_until_its_end_tag(device):
    device.write("/run/right", "1\n")
    device.write("/run/wrong", "0\n")
    inside = {"path": "/run/right", "timeout": "20"}
    after = '<device path="/run/wrong"/>'
    device.conf(hwdesc(port("a", 0, backend="sysfs", device=inside, extra=after)))
    with device.signals() as signals:
        device.start()
        assert signals.wait().state
    assert device.call("GetState", "u", 0)


def test_port_types(device):
    device.allow_critical("Unsupported port type")
    kinds = ["input", "output", "io_ctrl", "Output"]
    device.conf(hwdesc(*(port(f"p{number}", number, kind) for number, kind in enumerate(kinds))))
    device.start()
    assert [(entry.input, entry.configurable) for entry in reversed(device.port_props())] == [
        (True, False),
        (False, False),
        (True, True),
        (True, False),
    ]
    assert device.log_count("Unsupported port type Output") == 1


def test_an_unsupported_type_leaves_the_earlier_one(device):
    device.allow_critical("Unsupported port type")
    again = '<port_type type="nonsense"/>'
    device.conf(hwdesc(port("out", 0, "output", extra=again), port("in", 1, extra=again)))
    device.start()
    assert device.call("GetDirection", "u", 0) == "output"
    assert device.call("GetDirection", "u", 1) == "input"


def test_only_a_second_number_warns(device):
    device.conf(hwdesc(port("a", 7), port("b", 30)))
    device.fragment("more.xml", hwdesc(port("c", 7, extra='<port_no nbr="2"/>')))
    device.start()
    assert {entry.id: entry.number for entry in device.port_props()} == {"a": 7, "b": 30, "c": 2}
    assert device.log_count(RENUMBERED) == 1


def test_a_second_number_after_a_low_one_is_silent(device):
    device.conf(hwdesc(port("a", 5, extra='<port_no nbr="70"/>')))
    device.start()
    assert device.port_props()[0].number == 70
    assert device.log_count(RENUMBERED) == 0


def test_flags_are_true_in_any_case_and_nothing_else_is(device):
    flags = '<properties ioport="TRUE" hidden="True" virtual="yes" own="true" empty=""/>'
    device.conf(hwdesc(port("a", 0, flags="", extra=flags)))
    device.start()
    assert device.port_props()[0].flags == {
        "ioport": True, "hidden": True, "virtual": False, "own": True, "empty": False,
    }  # fmt: skip


@pytest.mark.parametrize("text, number", [("junk", 0), ("", 0), ("12x", 12), ("-5", -5), (" 3", 3)])
def test_numbers_are_read_leniently(device, text, number):
    device.conf(hwdesc(port("a", text)))
    device.start()
    assert device.port_props()[0].number == number


@pytest.mark.parametrize(
    "text",
    ["2147483648", "4294967295", "4294967296", "4294967298", "9223372036854775807",
     "99999999999999999999999", "-99999999999999999999999", "-2147483649"],
)  # fmt: skip
def test_numbers_beyond_32_bits_do_no_harm(device, text):
    device.conf(hwdesc(port("a", text), port("b", 1)))
    device.start()
    assert identifiers(device) == ["b", "a"]
    call_everything(device)
    assert device.call("IsConfigurable", "u", 1) is False


def test_a_port_without_a_number_can_not_be_reached_by_one(device):
    device.conf(hwdesc(port("a", None)))
    device.start()
    assert [(entry.id, entry.number) for entry in device.port_props()] == [("a", -1)]
    expect_no_port(device, "GetState", "u", 2**32 - 1)


def test_the_whole_vocabulary_is_accepted(device):
    events = """
      <event declaration="IOPort" input="TRUE" output="false" supervised_input="maybe">
        <keyvalue key="port" value="1" type="int" key-nice-name="Port" value-nice-name="One"
                  property="true"/>
        <keyvalue/>
      </event>
      <event declare_only="True"/>
      <unheard_of with="attributes"/>"""
    device.conf(hwdesc(port("a", 0, extra=events), "<first_virtual_input nbr='9'/>"))
    device.start()
    call_everything(device)


STRAY = [
    '<port_type type="input"/>', '<port_no nbr="1"/>', '<properties ioport="true"/>',
    '<param_default_name input="x" output="y"/>', '<backend name="check"/>',
    '<backend name="sysfs"><device path="/x"/></backend>', '<device path="/x"/>', "<event/>",
    '<event declaration="IOPort"/>', '<keyvalue key="k"/>', '<first_virtual_input nbr="3"/>',
]  # fmt: skip


@pytest.mark.parametrize("element", [*STRAY, "".join(STRAY)])
def test_elements_before_the_first_port(device, element):
    device.conf(hwdesc(element, port("a", 0)))
    device.start()
    # A first virtual input may bring manual triggers along.
    described = [name for name in identifiers(device) if not name.startswith("manualtrigger")]
    assert described == ["a"]
    call_everything(device)


def test_a_key_without_an_event(device):
    device.conf(hwdesc(port("a", 0, extra='<keyvalue key="k" value="v" property="true"/>')))
    device.start()
    call_everything(device)


@pytest.mark.parametrize("backend", [None, "unheard_of", "Virtual", ""])
@pytest.mark.parametrize("kind", ["input", "output", "io_ctrl"])
def test_a_port_without_a_usable_backend(device, backend, kind):
    sections = {"path": "/x", "setup": "fail"}
    device.conf(
        hwdesc(
            port("broken", 0, kind, backend, device=sections, flags="ioport virtual"),
            port("whole", 1, "output"),
        )
    )
    device.start()
    assert identifiers(device) == ["whole", "broken"]
    expect_no_port(device, "GetState", "u", 0)
    call_everything(device)
    device.call("SetState", "ub", 1, True)
    assert device.call("GetState", "u", 1)


def test_an_optional_port_without_a_backend(device):
    device.conf(hwdesc(port("broken", 0, backend=None, optional=True)))
    device.start()
    device.call("DropIOPorts", "as", ["broken"])
    device.call("RefreshIOPorts")
    call_everything(device)


def test_a_port_without_a_name(device):
    device.conf(hwdesc(port("x", 0).replace('<port name="x">', "<port>"), port("b", 1)))
    device.start()
    assert device.call("GetNames", "u", 0) == ("Input 1", "")
    call_everything(device)


@pytest.mark.parametrize("name", ["a]b", "[a", "a\tb", "a&#10;b", "ü", "a b", "", "x" * 5000])
def test_odd_identifiers(device, name):
    device.conf(hwdesc(port("x", 0).replace('"x"', f'"{name}"'), port("whole", 1)))
    device.start()
    call_everything(device)
    device.call("SetName", "ubs", 1, True, "Saved all the same")
    device.restart()
    assert device.call("GetNames", "u", 1) == ("Saved all the same", "")


BROKEN_DOCUMENTS = {
    "no markup": "ports: none",
    "wrong nesting": "<ports><port></ports></port>",
    "not utf-8": "<ports>\udcff</ports>",
    "two roots": hwdesc(port("a", 0)) + hwdesc(port("b", 1)),
    "entity": "<ports>&unknown;</ports>",
}


@pytest.mark.parametrize("text", BROKEN_DOCUMENTS.values(), ids=BROKEN_DOCUMENTS)
def test_broken_documents(device, text):
    device.allow_critical(PARSE_FAILURE)
    device.path("/usr/share/portd/conf.xml").write_bytes(text.encode(errors="surrogateescape"))
    device.start()
    call_everything(device)


@pytest.mark.parametrize("text", ["", "  \n\n"], ids=["empty", "blank"])
def test_an_empty_fragment_is_no_error_and_no_end_of_the_folder(device, text):
    device.conf(hwdesc(port("a", 0)))
    for number in range(1, 4):
        device.fragment(f"{number}.xml", hwdesc(port(f"f{number}", number)))
        device.fragment(f".keep{number}", text)
    device.start()
    assert sorted(identifiers(device)) == ["a", "f1", "f2", "f3"]


def test_what_is_wrong_with_a_document_is_said_with_its_place(device):
    device.allow_critical(PARSE_FAILURE)
    device.conf("<ports>\n  <port name='a'>\n  </prot>\n</ports>\n")
    device.start()
    (line,) = [line for line in device.log().splitlines() if "/conf.xml:3:" in line]
    assert line.startswith("WARNING: ")
    assert "prot" in line


def test_no_document_at_all(device):
    device.allow_critical(LOAD_FAILURE)
    device.start()
    assert device.call("GetPortProps") == (0, [])
    assert device.call("GetNbrPorts") == (0, 0)
    call_everything(device)


def test_a_directory_as_document(device):
    device.allow_critical(LOAD_FAILURE)
    device.mkdir("/usr/share/portd/conf.xml")
    device.start()
    assert device.call("GetPortProps") == (0, [])


def test_a_pipe_as_document_does_not_hold_the_start(device):
    device.allow_critical(LOAD_FAILURE)
    os.mkfifo(device.path("/usr/share/portd/conf.xml"))
    device.start()
    assert device.log_count(f"CRITICAL: portd: {LOAD_FAILURE} (/usr/share/portd/conf.xml)") == 1
    assert identifiers(device) == []


def test_a_pipe_as_fragment_does_not_hold_the_start(device):
    device.allow_critical(LOAD_FAILURE)
    device.conf(hwdesc(port("a", 0)))
    os.mkfifo(device.path("/etc/portd.d/pipe.xml"))
    device.start()
    assert device.log_count(f"CRITICAL: portd: {LOAD_FAILURE} (/etc/portd.d//pipe.xml)") == 1
    assert identifiers(device) == ["a"]


def test_links_to_documents_are_followed(device):
    device.allow_critical(LOAD_FAILURE)
    device.write("/usr/share/portd/real.xml", hwdesc(port("a", 0)))
    device.path("/usr/share/portd/conf.xml").symlink_to("real.xml")
    os.mkfifo(device.path("/usr/share/portd/pipe"))
    device.path("/etc/portd.d/link.xml").symlink_to("/usr/share/portd/pipe")
    device.start()
    assert device.log_count(f"{LOAD_FAILURE} (/etc/portd.d//link.xml)") == 1
    assert identifiers(device) == ["a"]


@pytest.mark.parametrize("tenth", range(1, 10))
def test_a_document_cut_off(device, tenth):
    device.allow_critical(PARSE_FAILURE)
    text = hwdesc(*(port(f"p{number}", number, "output") for number in range(5)))
    device.conf(text[: len(text) * tenth // 10])
    device.start()
    # Whole ports stay whole, and the one that was cut is no trap.
    whole = text[: len(text) * tenth // 10].count("</port>")
    assert len(device.port_props()) - whole in (0, 1)
    for number in range(whole):
        device.call("SetState", "ub", number, True)
        assert device.call("GetState", "u", number)
    call_everything(device, range(6))


def test_a_thousand_ports(device):
    kinds = ("input", "output", "io_ctrl")
    backends = ("check", "virtual", "null")
    ports = [
        port(f"p{number}", number, kinds[number % 3], backends[number // 3 % 3])
        for number in range(1000)
    ]
    device.conf(hwdesc(*ports))
    device.start()
    assert device.call("GetNbrPorts") == (667, 333)
    assert identifiers(device) == [f"p{number}" for number in reversed(range(1000))]
    for number in range(1000):
        device.call("GetState", "u", number)
    assert device.call("GetNames", "u", 999) == ("Input 667", "")
    call_everything(device, [0, 1, 2, 500, 998, 999, 1000, 2**32 - 1])
