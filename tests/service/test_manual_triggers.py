"""Manual triggers, against a played video streamer and a played camera-control coordinator."""

import pytest

from harness import Device, hwdesc, port, wait_for
from neighbours import (
    COORDINATOR, Coordinator, Streamer, longest_wait, neighbourhood_fixture, threads,
)  # fmt: skip
from producer import Producer

neighbourhood = pytest.fixture(neighbourhood_fixture)

FIRST = 20
CONTACT = 1
EVENT = "com.kelv.Event.Pcd.ManualTrigger"
DOCUMENT = hwdesc(port("contact", CONTACT), f'<first_virtual_input nbr="{FIRST}"/>')


@pytest.fixture
def device(make_device) -> Device:
    device = make_device()
    device.conf(DOCUMENT)
    return device


def triggers(device: Device) -> set[int]:
    """The channels that have a trigger port."""
    prefix = "manualtrigger"
    ids = [props.id for props in device.port_props() if props.id.startswith(prefix)]
    assert len(ids) == len(set(ids)), "two ports of one name"
    return {int(id.removeprefix(prefix)) for id in ids}


def declared(device: Device) -> set[int]:
    """The channels whose event is declared."""
    events = [
        entry["keys"]["port"]
        for entry in Producer(device).declarations().values()
        if entry["type"] == EVENT
    ]
    assert len(events) == len(set(events)), "two events of one channel"
    return set(events)


def expect(device: Device, ports: set[int], events: set[int]) -> None:
    """The triggers that exist and those that are declared, soon."""
    wait_for(lambda: triggers(device) == ports, f"the triggers {ports}")
    wait_for(lambda: declared(device) == events, f"the declared triggers {events}")
    assert triggers(device) == ports


def switch(device: Device, coordinator: Coordinator, enabled: bool) -> None:
    """Has a coordinator that has just come say something that the daemon is sure to hear."""
    bus, stats = "org.freedesktop.DBus", "org.freedesktop.DBus.Debug.Stats"

    def is_followed() -> bool:
        rules = device.bus.call(bus, "/org/freedesktop/DBus", stats, "GetAllMatchRules")
        owner = device.bus.bus_call("GetNameOwner", "s", COORDINATOR)
        return any(f"sender='{owner}'" in rule for of_one in rules.values() for rule in of_one)

    wait_for(is_followed, "the daemon to follow the coordinator")
    coordinator.enable(enabled)


def all_enabled(count: int) -> dict[int, bool]:
    return {channel: True for channel in range(1, count + 1)}


# The ports


def test_a_trigger_is_a_virtual_output_with_a_number_of_its_own(device, neighbourhood):
    Streamer(neighbourhood, device, all_enabled(2))
    device.start()
    expect(device, {1, 2}, {1, 2})
    (props,) = [props for props in device.port_props() if props.id == "manualtrigger2"]
    assert props.number == 21
    assert (props.input, props.configurable) == (False, False)
    assert props.flags == {"virtual": True}
    assert device.call("GetNbrPorts") == (1, 0)


def test_a_trigger_that_is_switched_is_reported(device, neighbourhood):
    Streamer(neighbourhood, device, all_enabled(1))
    device.start()
    expect(device, {1}, {1})
    with device.signals() as changes:
        for active in (True, False):
            device.call("SetVirtual", "ub", FIRST, active)
        changes.wait_count(2)
        assert [(change.port, change.virtual, change.state) for change in changes.received] == [
            (FIRST, True, True), (FIRST, True, False),
        ]  # fmt: skip


def test_a_trigger_that_is_switched_raises_its_event(device, neighbourhood):
    Streamer(neighbourhood, device, all_enabled(2))
    device.start()
    expect(device, {1, 2}, {1, 2})
    producer = Producer(device)
    (number,) = producer.ids(EVENT, port=2)
    assert producer.declarations()[number]["property"] == "state"
    with producer.signals("Sent") as sent:
        for active in (True, False):
            device.call("SetVirtual", "ub", FIRST + 1, active)
        sent.wait_count(2)
        assert [(id, values["port"], values["state"]) for id, values in sent.received] == [
            (number, 2, True), (number, 2, False),
        ]  # fmt: skip


def test_without_a_first_virtual_input_there_are_no_triggers(make_device, neighbourhood):
    device = make_device()
    device.conf(hwdesc(port("contact", CONTACT)))
    Streamer(neighbourhood, device, all_enabled(2))
    Coordinator(neighbourhood, device, True)
    device.start()
    assert triggers(device) == set()


# What is there at start


def test_without_any_service_the_first_channel_has_its_trigger(device):
    device.start()
    expect(device, {1}, {1})
    assert device.log_count("Error creating proxy") == 0


@pytest.mark.parametrize(
    "ptz, channels, events",
    [
        (None, {1: True, 2: True}, {1, 2}),
        (True, {1: True, 2: True, 3: True}, {1, 2, 3}),
        (True, {1: False, 2: True}, {2}),
        (True, {1: False, 2: False}, {1}),  # no channel is enabled, so the first one serves
        (False, {1: True, 2: True}, {1}),
        (False, {1: False, 2: True}, {1}),
        (False, {1: False, 2: False}, {1}),
    ],
)
def test_triggers_at_start(device, neighbourhood, ptz, channels, events):
    Streamer(neighbourhood, device, channels)
    if ptz is not None:
        Coordinator(neighbourhood, device, ptz)
    device.start()
    expect(device, set(channels), events)


def test_a_coordinator_that_does_not_say_counts_as_unknown(device, neighbourhood):
    Streamer(neighbourhood, device, all_enabled(2))
    Coordinator(neighbourhood, device, None)
    device.start()
    expect(device, {1, 2}, {1, 2})


def test_a_channel_that_does_not_say_counts_as_enabled_and_is_not_followed(device, neighbourhood):
    streamer = Streamer(neighbourhood, device, {1: True, 2: None})
    device.start()
    expect(device, {1, 2}, {1, 2})
    streamer.enable(2, False)
    streamer.enable(1, False)
    expect(device, {1, 2}, {2})


def test_the_scan_stops_at_the_first_channel_that_does_not_exist(device, neighbourhood):
    Streamer(neighbourhood, device, {1: True, 2: True, 4: True})
    device.start()
    expect(device, {1, 2}, {1, 2})


# Channels and camera control that change


def test_a_disabled_channel_loses_its_event_and_keeps_its_port(device, neighbourhood):
    streamer = Streamer(neighbourhood, device, {1: True, 2: False, 3: True})
    Coordinator(neighbourhood, device, True)
    device.start()
    expect(device, {1, 2, 3}, {1, 3})
    streamer.enable(3, False)
    expect(device, {1, 2, 3}, {1})
    streamer.enable(2, True)
    expect(device, {1, 2, 3}, {1, 2})


def test_without_camera_control_the_first_channel_keeps_its_event_when_disabled(device, neighbourhood):
    streamer = Streamer(neighbourhood, device, all_enabled(2))
    coordinator = Coordinator(neighbourhood, device, False)
    device.start()
    expect(device, {1, 2}, {1})
    streamer.enable(1, False)
    coordinator.enable(True)
    expect(device, {1, 2}, {1, 2})


def test_without_camera_control_a_new_channel_gets_its_port_without_the_event(device, neighbourhood):
    Coordinator(neighbourhood, device, False)
    device.start()
    expect(device, {1}, {1})
    Streamer(neighbourhood, device, all_enabled(2))
    expect(device, {1, 2}, {1})


def test_camera_control_that_is_switched_on_declares_every_enabled_channel(device, neighbourhood):
    Streamer(neighbourhood, device, {1: True, 2: True, 3: False})
    coordinator = Coordinator(neighbourhood, device, False)
    device.start()
    expect(device, {1, 2, 3}, {1})
    coordinator.enable(True)
    expect(device, {1, 2, 3}, {1, 2})


def test_camera_control_that_is_switched_off_keeps_what_is_declared(device, neighbourhood):
    streamer = Streamer(neighbourhood, device, all_enabled(2))
    coordinator = Coordinator(neighbourhood, device, True)
    device.start()
    expect(device, {1, 2}, {1, 2})
    coordinator.enable(False)
    streamer.enable(2, False)
    # Once it is on again, the first channel shows that the earlier signals were served.
    coordinator.enable(True)
    streamer.enable(1, False)
    expect(device, {1, 2}, {2})


def test_a_coordinator_that_appears_and_vanishes_is_followed(device, neighbourhood):
    streamer = Streamer(neighbourhood, device, {1: True, 2: False})
    device.start()
    expect(device, {1, 2}, {1})
    for _ in range(3):
        coordinator = Coordinator(neighbourhood, device, False)
        switch(device, coordinator, False)
        streamer.enable(2, True)
        assert declared(device) == {1}  # what has its port already stays as it is
        coordinator.service.stop()
        expect(device, {1, 2}, {1, 2})
        streamer.enable(2, False)
        expect(device, {1, 2}, {1})


# The streamer coming and going


def test_a_streamer_that_appears_later_brings_its_triggers(device, neighbourhood):
    device.start()
    expect(device, {1}, {1})
    Streamer(neighbourhood, device, {1: False, 2: True})
    expect(device, {1, 2}, {2})


def test_a_streamer_that_vanishes_takes_its_triggers_along(device, neighbourhood):
    streamer = Streamer(neighbourhood, device, all_enabled(3))
    device.start()
    expect(device, {1, 2, 3}, {1, 2, 3})
    streamer.service.stop()
    expect(device, set(), set())


def test_channels_of_a_streamer_that_vanished_do_not_come_back_with_camera_control(
    device, neighbourhood
):
    streamer = Streamer(neighbourhood, device, all_enabled(3))
    coordinator = Coordinator(neighbourhood, device, False)
    device.start()
    expect(device, {1, 2, 3}, {1})
    streamer.service.stop()
    expect(device, set(), set())
    coordinator.enable(True)
    expect(device, {1}, {1})


@pytest.mark.parametrize("ptz", [True, False])
def test_a_streamer_that_restarts_many_times_gives_the_right_triggers_again(device, neighbourhood, ptz):
    Coordinator(neighbourhood, device, ptz)
    device.start()
    for channels in [{1: True, 2: True}, {1: True}, {1: False, 2: True, 3: True}, {1: True, 2: False},
                     {1: True, 2: True}] * 3:  # fmt: skip
        streamer = Streamer(neighbourhood, device, channels)
        events = {channel for channel, enabled in channels.items() if enabled} if ptz else {1}
        expect(device, set(channels), events)
        streamer.service.stop()
        expect(device, set(), set())


def test_a_streamer_that_another_one_replaces_leaves_only_the_channels_of_the_new_one(
    device, neighbourhood
):
    Streamer(neighbourhood, device, all_enabled(4))
    device.start()
    expect(device, {1, 2, 3, 4}, {1, 2, 3, 4})
    second = Streamer(neighbourhood, device, {1: True, 2: False})
    expect(device, {1, 2}, {1})
    second.enable(2, True)
    expect(device, {1, 2}, {1, 2})


def test_a_trigger_whose_sequence_runs_goes_with_its_channel(device, neighbourhood):
    streamer = Streamer(neighbourhood, device, all_enabled(1))
    device.start()
    expect(device, {1}, {1})
    with device.signals("ActionSequenceDone") as done:
        steps = [(True, 60_000), (False, 0)]
        device.call("StartActionSequence", "uba(bi)", FIRST, True, steps)
        streamer.service.stop()
        done.wait()
    expect(device, set(), set())


def test_a_restart_of_the_daemon_finds_the_triggers_again(device, neighbourhood):
    Streamer(neighbourhood, device, {1: True, 2: False})
    device.start()
    expect(device, {1, 2}, {1})
    for _ in range(2):
        device.restart()
        expect(device, {1, 2}, {1})


def test_the_daemon_ends_well_while_a_trigger_runs_a_sequence(device, neighbourhood):
    Streamer(neighbourhood, device, all_enabled(2))
    device.start()
    expect(device, {1, 2}, {1, 2})
    device.call("StartActionSequence", "uba(bi)", FIRST, True, [(True, 60_000), (False, 0)])
    device.stop()


# Services that misbehave


@pytest.mark.parametrize("value", ["yes", 1, -1.5, ["true"]])
def test_properties_of_the_wrong_type_count_as_missing(device, neighbourhood, value):
    Streamer(neighbourhood, device, {1: True, 2: value})
    Coordinator(neighbourhood, device, value)
    device.start()
    expect(device, {1, 2}, {1, 2})
    assert device.log_count("that is not a boolean") == 2


def test_signals_of_unexpected_names_and_signatures_are_ignored(device, neighbourhood):
    streamer = Streamer(neighbourhood, device, all_enabled(2))
    coordinator = Coordinator(neighbourhood, device, True)
    device.start()
    expect(device, {1, 2}, {1, 2})
    for signature, arguments in (("", ()), ("s", ("false",)), ("i", (0,)), ("bb", (False, False)),
                                 ("u", (0,))):  # fmt: skip
        streamer.emit(2, "EnabledChanged", signature, *arguments)
    streamer.emit(2, "Disabled", "b", False)
    for signature, arguments in (("", ()), ("b", (False,)), ("bi", (False, 1)),
                                 ("ss", ("1", "false")), ("ubs", (1, False, "x"))):  # fmt: skip
        coordinator.emit("PtzEnabledChanged", signature, *arguments)
    coordinator.emit("PtzDisabled", "ib", 1, False)
    streamer.enable(1, False)
    expect(device, {1, 2}, {2})  # with camera control off, the first channel would have kept it


def test_services_that_answer_with_errors_have_no_channels_and_no_camera_control(device, neighbourhood):
    Streamer(neighbourhood, device, all_enabled(2), error="com.kelv.Error.Broken")
    Coordinator(neighbourhood, device, False, error="com.kelv.Error.Broken")
    device.start()
    expect(device, {1}, {1})


def test_a_hundred_channels_have_their_triggers(device, neighbourhood):
    streamer = Streamer(neighbourhood, device, all_enabled(100))
    device.start()
    wait_for(lambda: triggers(device) == set(range(1, 101)), "a hundred triggers")
    assert declared(device) == set(range(1, 101))
    for channel in (1, 50, 100):
        streamer.enable(channel, False)
    left = set(range(1, 101)) - {1, 50, 100}
    wait_for(lambda: declared(device) == left, "three disabled channels")
    streamer.service.stop()
    expect(device, set(), set())


def test_a_streamer_with_channels_without_end_is_not_searched_for_ever(device, neighbourhood):
    Streamer(neighbourhood, device, {}, endless=Streamer.ROOT)
    device.start()
    wait_for(lambda: "stopping after channel 1024" in device.log(), "the end of the search", 60)
    assert triggers(device) == set(range(1, 1025))


def test_services_that_answer_late_are_waited_for(device, neighbourhood):
    Streamer(neighbourhood, device, {1: True, 2: True}, delay=1)
    Coordinator(neighbourhood, device, False, delay=5)
    device.start()
    expect(device, {1, 2}, {1})


def test_a_streamer_that_hangs_at_start_is_found_when_it_is_started_anew(device, neighbourhood):
    streamer = Streamer(neighbourhood, device, all_enabled(2))
    streamer.service.hang()
    device.start()
    assert longest_wait(device) < 0.25
    streamer.service.stop()
    expect(device, {1}, {1})
    Streamer(neighbourhood, device, all_enabled(2))
    expect(device, {1, 2}, {1, 2})


def test_a_streamer_that_does_not_answer_is_warned_of(device, neighbourhood):
    streamer = Streamer(neighbourhood, device, all_enabled(1))
    streamer.service.hang()
    device.start()
    device.wait_log("The streamer does not answer", timeout=40)
    expect(device, {1}, {1})


def test_what_a_streamer_says_while_it_is_asked_counts(device, neighbourhood):
    streamer = Streamer(neighbourhood, device, all_enabled(2), delay=1)
    device.start()
    wait_for(lambda: "Streamer" in threads(device), "the search for channels")
    streamer.enable(2, False)
    expect(device, {1, 2}, {1})
