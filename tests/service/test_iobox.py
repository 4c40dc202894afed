"""Ports of an external I/O box, against a played I/O box monitor."""

import time

import pytest

from harness import Device, hwdesc, port, wait_for
from neighbours import IoBox, barrier, neighbourhood_fixture

neighbourhood = pytest.fixture(neighbourhood_fixture)

INPUT, OUTPUT, EITHER, FIXED, OTHER = 1, 2, 3, 4, 9

# Messages with their levels, by which the log collector files them.
UNKNOWN_WORD = "WARNING: portd: iobox_state_to_portd_state@67: Unrecognized iobox supervised state: "
NO_CALL = "LEVEL256: portd: iobox_dbus_call@44: Failed to call method "
NO_CONNECTION_STATUS = "LEVEL256: portd: iobox_port_setup@180: Could not get IO box connection status"
NO_PORT_STATUS = "LEVEL256: portd: iobox_port_setup@193: Could not get IO port status"
NO_INITIAL_STATE = "LEVEL256: portd: iobox_port_setup@219: Could not get initial IO state"

DOCUMENT = hwdesc(
    port("input", INPUT, backend="iobox", optional=True),
    port("output", OUTPUT, kind="output", backend="iobox", optional=True),
    port("either", EITHER, kind="io_ctrl", backend="iobox", optional=True),
    port("fixed", FIXED, backend="iobox"),
    port("other", OTHER),
)
ON_THE_BOX = {"input", "output", "either", "fixed"}
OPTIONAL = ["input", "output", "either"]

INPUT_SIDE = "input_name=Loop\ninput_activelow=false\n"
OUTPUT_SIDE = (
    "output_name=Relay\noutput_activelow={activelow}\n"
    "button_type=none\npulse_time=0\nport_mode=bistable\ndelay_time=0\n"
)
PLAIN = "supervised_input_ranges=@a(suu) []\nsupervised_input=false\n"
SUPERVISED = "supervised_input_ranges=[('cut', uint32 10, uint32 20)]\nsupervised_input=true\n"
SUPERVISED_INPUT = "[input]\n" + INPUT_SIDE + SUPERVISED


@pytest.fixture
def device(make_device) -> Device:
    device = make_device()
    device.conf(DOCUMENT)
    return device


def ids(device: Device) -> set[str]:
    return {props.id for props in device.port_props()} - {"other"}


def state(device: Device, number: int) -> bool:
    return device.call("GetState", "u", number)


def is_silent(device: Device, number: int) -> bool:
    """Whether the port's events are off: then nothing is reported of it, whatever clients report."""
    with device.signals() as changes:
        device.call("SetVirtual", "ub", number, True)
        barrier(device, changes, OTHER)
        return changes.received == []


def expect_working(device: Device, box: IoBox) -> None:
    """An input that follows the box and an output that drives it."""
    with device.signals() as changes:
        box.report(INPUT, "closed")
        assert changes.wait(lambda change: change.port == INPUT).state is True
        assert state(device, INPUT) is True
        box.report(INPUT, "open")
        changes.wait(lambda change: change.port == INPUT and not change.state)
        barrier(device, changes, OTHER)
        assert [change.state for change in changes.received] == [True, False]
    for active in (True, False):
        device.call("SetState", "ub", OUTPUT, active)
        assert box.modes()[-1] == (OUTPUT, int(active), "out")


# Coming and going


def test_a_box_that_is_present_at_start_is_in_service(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    assert ids(device) == ON_THE_BOX
    expect_working(device, box)


def test_an_absent_monitor_parks_the_optional_ports_and_leaves_the_others_inactive(device):
    device.start()
    assert ids(device) == {"fixed"}
    assert state(device, FIXED) is False
    assert is_silent(device, FIXED)
    assert device.log_count(NO_CONNECTION_STATUS) == 4


def test_a_monitor_that_appears_later_brings_the_optional_ports_with_a_refresh(device, neighbourhood):
    device.start()
    box = IoBox(neighbourhood, device)
    assert ids(device) == {"fixed"}
    device.call("RefreshIOPorts")
    assert ids(device) == ON_THE_BOX
    expect_working(device, box)


def test_a_refresh_without_a_monitor_changes_nothing(device):
    device.start()
    for _ in range(3):
        device.call("RefreshIOPorts")
    assert ids(device) == {"fixed"}


def test_ports_keep_their_state_when_the_monitor_vanishes_and_calls_are_still_answered(
    device, neighbourhood
):
    box = IoBox(neighbourhood, device, GetIOState=("s", "ret = 'closed'"))
    device.start()
    box.service.stop()
    assert state(device, INPUT) is True
    device.call("SetState", "ub", OUTPUT, True)
    assert state(device, OUTPUT) is True
    assert device.log_count(f"{NO_CALL}SetIOMode") == 1
    assert device.call("DropIOPorts", "as", OPTIONAL) == OPTIONAL
    device.call("RefreshIOPorts")
    assert ids(device) == {"fixed"}


def test_many_drops_and_refreshes_leave_one_reaction_to_a_change(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    for _ in range(25):
        assert device.call("DropIOPorts", "as", OPTIONAL) == OPTIONAL
        device.call("RefreshIOPorts")
        device.call("RefreshIOPorts")
    assert ids(device) == ON_THE_BOX
    expect_working(device, box)


def test_a_refused_set_up_that_is_tried_again_leaves_one_reaction_to_a_change(device, neighbourhood):
    box = IoBox(neighbourhood, device, GetIOPortStatus=("s", "ret = 'disabled'"))
    device.start()
    for _ in range(10):
        device.call("RefreshIOPorts")
        assert ids(device) == {"fixed"}
    box.answer("GetIOPortStatus", "s", "ret = 'enabled'")
    device.call("RefreshIOPorts")
    expect_working(device, box)


def test_dropped_ports_no_longer_react(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    device.call("DropIOPorts", "as", OPTIONAL)
    with device.signals() as changes:
        for word in ("closed", "cut", "open"):
            box.report(INPUT, word)
        box.report(FIXED, "closed")
        changes.wait(lambda change: change.port == FIXED)
        assert [change.port for change in changes.received] == [FIXED]


# What the box says at set-up


@pytest.mark.parametrize("word, active", [("open", False), ("closed", True), ("short", True),
                                          ("cut", False)])  # fmt: skip
def test_an_input_starts_with_the_state_that_the_box_reports(device, neighbourhood, word, active):
    IoBox(neighbourhood, device, GetIOState=("s", f"ret = {word!r}"))
    device.start()
    assert state(device, INPUT) is active


def test_the_box_is_asked_for_each_port_by_its_number(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    assert sorted(box.service.calls(IoBox.PATH, "GetIOPortStatus")) == [(1,), (2,), (3,), (4,)]
    assert sorted(box.service.calls(IoBox.PATH, "GetIOState")) == [(INPUT,), (EITHER,), (FIXED,)]
    assert box.modes() == [(OUTPUT, 0, "out")]


def test_an_active_low_output_starts_at_the_high_level(device, neighbourhood):
    device.settings("[output]\n" + OUTPUT_SIDE.format(activelow="true") + PLAIN)
    box = IoBox(neighbourhood, device)
    device.start()
    assert box.modes() == [(OUTPUT, 1, "out")]
    assert state(device, OUTPUT) is False


def test_a_disconnected_box_parks_its_ports_without_a_word(device, neighbourhood):
    box = IoBox(neighbourhood, device, GetIOBoxConnected=("b", "ret = False"))
    device.start()
    assert ids(device) == {"fixed"}
    assert is_silent(device, FIXED)
    assert device.log_count("iobox") == 0
    assert box.service.calls(IoBox.PATH, "GetIOPortStatus") == []


@pytest.mark.parametrize("status", ["disabled", "Enabled", "enabled ", ""])
def test_a_port_that_is_not_enabled_is_parked_silently_with_its_events_undeclared(
    device, neighbourhood, status
):
    IoBox(neighbourhood, device, GetIOPortStatus=("s", f"ret = {status!r}"))
    device.start()
    assert ids(device) == {"fixed"}
    assert is_silent(device, FIXED)
    assert device.log_count("iobox") == 0


def test_only_the_enabled_ports_of_a_box_come_into_service(device, neighbourhood):
    box = IoBox(neighbourhood, device,
                GetIOPortStatus=("s", "ret = 'enabled' if args[0] == 2 else 'disabled'"))  # fmt: skip
    device.start()
    assert ids(device) == {"fixed", "output"}
    box.answer("GetIOPortStatus", "s", "ret = 'enabled'")
    device.call("RefreshIOPorts")
    assert ids(device) == ON_THE_BOX


# What goes wrong at set-up

SETUP_CALLS = [
    ("GetIOBoxConnected", NO_CONNECTION_STATUS),
    ("GetIOPortStatus", NO_PORT_STATUS),
    ("GetIOState", NO_INITIAL_STATE),
]
INPUT_ONLY = {"GetIOState": {"output"}}  # the ports that do without the method


@pytest.mark.parametrize("method, message", SETUP_CALLS)
def test_an_error_as_the_answer_parks_the_port(device, neighbourhood, method, message):
    box = IoBox(neighbourhood, device, **{method: ("s", "raise ValueError('out of order')")})
    device.start()
    unaffected = INPUT_ONLY.get(method, set())
    assert ids(device) == {"fixed"} | unaffected
    assert state(device, FIXED) is False
    assert device.log_count(f"{NO_CALL}{method}: ") == 4 - len(unaffected)
    assert device.log_count(message) == 4 - len(unaffected)
    box.answer(method, *IoBox.METHODS[method][1:])
    device.call("RefreshIOPorts")
    expect_working(device, box)


def test_events_stay_on_when_only_the_state_can_not_be_had(device, neighbourhood):
    IoBox(neighbourhood, device, GetIOState=("s", "raise ValueError('out of order')"))
    device.start()
    assert ids(device) == {"fixed", "output"}
    assert not is_silent(device, FIXED)


WRONG_ANSWERS = [("", ""), ("i", "ret = 1"), ("v", "ret = dbus.String('enabled', variant_level=1)"),
                 ("as", "ret = ['enabled']"), ("u", "ret = 2**32 - 1")]  # fmt: skip


@pytest.mark.parametrize("answer", WRONG_ANSWERS, ids=[answer[0] or "nothing" for answer in WRONG_ANSWERS])
@pytest.mark.parametrize("method, message", SETUP_CALLS)
def test_an_answer_of_the_wrong_type_parks_the_port(device, neighbourhood, method, message, answer):
    box = IoBox(neighbourhood, device, **{method: answer})
    device.start()
    unaffected = INPUT_ONLY.get(method, set())
    assert ids(device) == {"fixed"} | unaffected
    assert device.log_count(message) == 4 - len(unaffected)
    box.answer(method, *IoBox.METHODS[method][1:])
    device.call("RefreshIOPorts")
    expect_working(device, box)


def test_the_answer_to_a_mode_means_nothing(device, neighbourhood):
    box = IoBox(neighbourhood, device, SetIOMode=("ai", "ret = [1, 2]"))
    device.start()
    assert ids(device) == ON_THE_BOX
    device.call("SetState", "ub", OUTPUT, True)
    box.answer("SetIOMode", "", "raise ValueError('no')")
    device.call("SetState", "ub", OUTPUT, False)
    assert state(device, OUTPUT) is False
    assert device.log_count(f"{NO_CALL}SetIOMode") == 1


def test_a_monitor_that_answers_late_is_waited_for(make_device, neighbourhood):
    device = make_device()
    device.conf(hwdesc(port("input", INPUT, backend="iobox"), port("other", OTHER)))
    IoBox(neighbourhood, device, GetIOState=("s", "time.sleep(5); ret = 'closed'"))
    began = time.monotonic()
    device.start()
    assert time.monotonic() - began >= 5
    assert state(device, INPUT) is True


@pytest.mark.parametrize(
    "method, kind, in_service", [("GetIOState", "input", 0), ("SetIOMode", "output", 20)]
)
def test_a_method_that_is_never_answered_holds_start_up_once_and_not_for_every_port(
    make_device, neighbourhood, method, kind, in_service
):
    device = make_device()
    device.conf(hwdesc(
        *(port(f"port{number}", number, kind, backend="iobox", optional=True)
          for number in range(20, 40)),
        port("other", OTHER),
    ))  # fmt: skip
    IoBox(neighbourhood, device, ignored=[method])
    began = time.monotonic()
    device.start()
    assert 24 < time.monotonic() - began < 35
    assert len(ids(device)) == in_service
    assert device.log_count(f"{NO_CALL}{method}: ") == 20


# Line states


def test_a_word_that_is_not_known_is_warned_of_and_reads_undefined(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    with device.signals() as changes:
        box.report(INPUT, "closed")
        changes.wait(lambda change: change.state)
        box.report(INPUT, "ajar")
        changes.wait(lambda change: not change.state)
    assert state(device, INPUT) is False
    assert device.log_count(f"{UNKNOWN_WORD}ajar") == 1


def test_the_word_undefined_at_start_is_warned_of_too(device, neighbourhood):
    IoBox(neighbourhood, device, GetIOState=("s", "ret = ''"))
    device.start()
    assert ids(device) == ON_THE_BOX
    assert device.log_count(UNKNOWN_WORD) == 3


def test_a_supervised_input_follows_the_line_and_reports_each_of_its_states(device, neighbourhood):
    device.settings(SUPERVISED_INPUT)
    box = IoBox(neighbourhood, device)
    device.start()
    with device.signals() as changes:
        for word, active in (("closed", True), ("cut", False), ("short", False), ("closed", True)):
            box.report(INPUT, word)
            assert changes.wait(lambda change: change.port == INPUT).state is active
            changes.take()


def test_the_ranges_of_a_port_outlive_a_drop(device, neighbourhood):
    device.settings(SUPERVISED_INPUT)
    IoBox(neighbourhood, device)
    device.start()
    device.call("DropIOPorts", "as", ["input"])
    device.call("RefreshIOPorts")
    device.call("SetName", "ubs", INPUT, True, "Cable")
    # The reply comes before the settings are stored.
    wait_for(lambda: "input_name=Cable" in device.read_settings(), "the settings to be stored")
    assert "supervised_input_ranges=[('cut', uint32 10, uint32 20)]" in device.read_settings()
    assert "supervised_input=true" in device.read_settings()


# Modes


def test_a_port_tells_the_box_its_new_direction_and_its_last_level(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    device.call("SetDirection", "us", EITHER, "output")
    device.call("SetState", "ub", EITHER, True)
    device.call("SetDirection", "us", EITHER, "input")
    assert [mode for mode in box.modes() if mode[0] == EITHER] == [
        (EITHER, 0, "out"), (EITHER, 1, "out"), (EITHER, 1, "in"),
    ]  # fmt: skip


def test_a_supervised_port_is_set_to_the_supervised_mode_when_it_becomes_an_input(device, neighbourhood):
    output_side = OUTPUT_SIDE.format(activelow="false")
    device.settings("[either]\ninput=false\n" + INPUT_SIDE + output_side + SUPERVISED)
    box = IoBox(neighbourhood, device)
    device.start()
    device.call("SetDirection", "us", EITHER, "input")
    assert [mode for mode in box.modes() if mode[0] == EITHER] == [
        (EITHER, 0, "out"), (EITHER, 0, "supervised_in"),
    ]  # fmt: skip


def test_a_sequence_drives_an_output_of_the_box_in_its_order(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    with device.signals("ActionSequenceDone") as done:
        steps = [(True, 20), (False, 20), (True, 20)]
        device.call("StartActionSequence", "uba(bi)", OUTPUT, False, steps)
        done.wait()
    assert box.modes() == [(OUTPUT, level, "out") for level in (0, 1, 0, 1)]


def test_a_sequence_a_storm_and_setting_changes_meet_on_one_port(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    device.call("SetDirection", "us", EITHER, "output")
    with device.signals("ActionSequenceDone") as done:
        storm = box.storm(EITHER)
        for activelow in ("open", "closed") * 5:
            device.call("StartActionSequence", "uba(bi)", EITHER, False, [(True, 1), (False, 1)] * 50)
            device.call("SetActive", "ubs", EITHER, False, activelow)
        storm.result(timeout=60)
        done.wait_count(10)
    device.call("SetState", "ub", EITHER, True)
    assert box.modes()[-1] == (EITHER, 1, "out")


def test_a_drop_during_a_sequence_ends_it(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    with device.signals("ActionSequenceDone") as done:
        device.call("StartActionSequence", "uba(bi)", OUTPUT, False, [(True, 60_000), (False, 0)])
        wait_for(lambda: (OUTPUT, 1, "out") in box.modes(), "the first step")
        assert device.call("DropIOPorts", "as", ["output"]) == ["output"]
        done.wait()
    device.call("RefreshIOPorts")
    expect_working(device, box)


# Odd and many signals


def test_signals_for_unknown_ports_and_of_unexpected_signatures_are_ignored(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    with device.signals() as changes:
        for number in (0, -1, 5, OTHER, 2**31 - 1, -(2**31)):
            box.report(number, "closed")
        for signature, arguments in (("", ()), ("i", (INPUT,)), ("si", ("closed", INPUT)),
                                     ("us", (INPUT, "closed")), ("iss", (INPUT, "closed", "cut")),
                                     ("ii", (INPUT, 1)), ("xs", (INPUT, "closed"))):  # fmt: skip
            box.service.emit(IoBox.PATH, "IOStateChanged", signature, *arguments)
        box.service.emit(IoBox.PATH, "IOStateChangedAgain", "is", INPUT, "closed")
        # The monitor's signals come in order, so the last one marks the end of the others.
        box.report(FIXED, "closed")
        changes.wait(lambda change: change.port == FIXED)
        assert [change.port for change in changes.received] == [FIXED]
    expect_working(device, box)


def test_a_hundred_ports_each_follow_their_own_signals(make_device, neighbourhood):
    device = make_device()
    numbers = range(100, 200)
    device.conf(hwdesc(
        *(port(f"port{number}", number, backend="iobox", optional=True) for number in numbers),
        port("other", OTHER),
    ))  # fmt: skip
    box = IoBox(neighbourhood, device)
    device.start()
    assert len(ids(device)) == 100
    with device.signals() as changes:
        for number in numbers:
            box.report(number, "closed")
        changes.wait_count(100)
        barrier(device, changes, OTHER)
        assert [change.port for change in changes.received] == list(numbers)
    names = [f"port{number}" for number in numbers]
    for _ in range(3):
        assert len(device.call("DropIOPorts", "as", names)) == 100
        assert ids(device) == set()
        device.call("RefreshIOPorts")
    assert ids(device) == set(names)


def test_a_storm_of_signals_is_followed_to_its_end_while_calls_are_answered(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    with device.signals() as changes:
        storm = box.storm(INPUT)
        changes.wait_count(100)
        while not storm.done:
            device.call("GetState", "u", OUTPUT, timeout=5)
            wait_for(lambda: True, "what has arrived")
        storm.result()
        changes.wait_count(10_000, timeout=60)
        barrier(device, changes, OTHER)
        assert [change.state for change in changes.received] == [True, False] * 5000
    assert state(device, INPUT) is False


def test_a_storm_for_ports_that_do_not_exist_changes_nothing(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    with device.signals() as changes:
        box.storm(12345).result(timeout=60)
        box.report(INPUT, "closed")
        changes.wait(lambda change: change.port == INPUT, timeout=60)
        assert len(changes.received) == 1


def test_the_daemon_ends_at_once_while_the_box_storms(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    with device.signals() as changes:
        box.storm(INPUT)
        changes.wait_count(100)
    began = time.monotonic()
    device.stop()
    assert time.monotonic() - began < 10


def test_ports_that_are_dropped_and_refreshed_in_a_storm_stay_right(device, neighbourhood):
    box = IoBox(neighbourhood, device)
    device.start()
    storm = box.storm(INPUT)
    while not storm.done:
        device.call("DropIOPorts", "as", OPTIONAL)
        device.call("RefreshIOPorts")
        wait_for(lambda: True, "what has arrived")
    storm.result()
    assert ids(device) == ON_THE_BOX
    box.report(FIXED, "closed")  # behind the storm
    wait_for(lambda: state(device, FIXED), "the end of the storm", 60)
    expect_working(device, box)
