"""Neighbours that take a call and never answer: who asked for it waits, nobody else does, and the
daemon ends all the same."""

import time
from typing import Any, Callable

import pytest

from harness import Device, Pending, hwdesc, port, scale, wait_for
from legacy_tool import SERVICE
from neighbours import (
    Coordinator, IoBox, Streamer, arrived, longest_wait, neighbourhood_fixture, threads,
)  # fmt: skip

neighbourhood = pytest.fixture(neighbourhood_fixture)

# What nobody else may have to wait for longer, in seconds.
STALL = 0.25
# How long the end may take.
END = 5

INPUT, OUTPUT, EITHER, OTHER = 1, 2, 3, 0
FIRST = 20
DOCUMENT = hwdesc(
    port("other", OTHER, kind="output"),
    port("input", INPUT, backend="iobox", optional=True),
    port("output", OUTPUT, kind="output", backend="iobox", optional=True),
    port("either", EITHER, kind="io_ctrl", backend="iobox"),
    f'<first_virtual_input nbr="{FIRST}"/>',
)
POLICY = "com.kelv.PolicyKitSystem"
SUPERVISED = "com.kelv.IOSupervised.Supervised"
LONG_STEP = [(True, 600_000)]


@pytest.fixture
def device(make_device) -> Device:
    device = make_device()
    device.conf(DOCUMENT)
    return device


@pytest.fixture
def box(device, neighbourhood) -> IoBox:
    box = IoBox(neighbourhood, device)
    device.start()
    device.wait_name(SUPERVISED)
    device.wait_name(SERVICE)
    return box


def begin(device: Device, method: str, signature: str = "", *args: Any) -> Pending:
    name = "com.kelv.IOControl.State"
    return device.bus.begin_call(
        name, "/com/kelv/IOControl/State", name, method, signature, *args, timeout=60
    )


def begin_supervision(device: Device) -> Pending:
    path = "/com/kelv/IOSupervised/Supervised"
    return device.bus.begin_call(
        SUPERVISED, path, SUPERVISED, "SetSupervised", "ub", INPUT, True, timeout=60
    )


def stop_in_time(device: Device) -> None:
    """Ends the daemon, with status 0, before it is ended by force."""
    began = time.monotonic()
    device.stop()
    assert time.monotonic() - began < END * scale()


CALLS: dict[str, tuple[Callable[[Device], Pending], tuple]] = {
    "SetState": (lambda device: begin(device, "SetState", "ub", OUTPUT, True), (OUTPUT, 1, "out")),
    "SetDirection": (
        lambda device: begin(device, "SetDirection", "us", EITHER, "output"), (EITHER, 0, "out"),
    ),
    "SetActive": (
        lambda device: begin(device, "SetActive", "ubs", OUTPUT, False, "open"), (OUTPUT, 1, "out"),
    ),
    "SetSupervised": (begin_supervision, (INPUT, 0, "supervised_in")),
}  # fmt: skip


# A box that hangs while the daemon serves


@pytest.mark.parametrize("call", CALLS)
def test_only_the_caller_waits_for_a_box_that_hangs(device, box, call):
    ask, mode = CALLS[call]
    box.service.hang()
    reply = ask(device)
    assert longest_wait(device) < STALL
    arrived()
    assert not reply.done
    box.service.resume()
    reply.result()
    assert box.modes()[-1] == mode


def test_only_who_asked_waits_for_a_refresh_of_a_box_that_hangs(device, box):
    device.call("DropIOPorts", "as", ["input", "output"])
    box.service.hang()
    replies = [begin(device, "RefreshIOPorts"), begin(device, "RefreshIOPorts")]
    assert longest_wait(device) < STALL
    arrived()
    assert not any(reply.done for reply in replies)
    assert len(device.port_props()) == 3
    box.service.resume()
    for reply in replies:
        reply.result()
    assert {props.id for props in device.port_props()} >= {"input", "output"}
    assert box.modes()[-1] == (OUTPUT, 0, "out")


def test_a_step_that_waits_for_the_box_keeps_nobody_waiting(device, box):
    box.service.hang()
    device.call("StartActionSequence", "uba(bi)", OUTPUT, False, LONG_STEP)
    began = time.monotonic()
    device.call("SetName", "ubs", OUTPUT, False, "Siren")
    assert time.monotonic() - began < 5
    assert longest_wait(device) < STALL
    assert device.call("GetNames", "u", OUTPUT) == ("", "Siren")
    box.service.resume()
    wait_for(lambda: box.modes()[-1] == (OUTPUT, 1, "out"), "the step")


def test_a_sequence_that_waits_for_the_box_is_ended_at_once(device, box):
    box.service.hang()
    with device.signals("ActionSequenceDone") as done:
        device.call("StartActionSequence", "uba(bi)", OUTPUT, False, [(True, 0), (False, 600_000)])
        reply = begin(device, "SetActive", "ubs", OUTPUT, False, "open")
        done.wait()
        assert longest_wait(device) < STALL
    box.service.resume()
    reply.result()
    assert box.modes() == [(OUTPUT, 0, "out"), (OUTPUT, 1, "out"), (OUTPUT, 0, "out")]


def test_a_box_that_hangs_is_told_everything_in_its_order_when_it_recovers(device, box):
    box.service.hang()
    levels = [True, True, False, True, False]
    replies = [begin(device, "SetState", "ub", OUTPUT, level) for level in levels]
    begin(device, "SetDirection", "us", EITHER, "output")
    replies.append(begin(device, "SetState", "ub", EITHER, True))
    assert longest_wait(device) < STALL
    box.service.resume()
    for reply in replies:
        reply.result()
    assert box.modes()[1:] == [
        *((OUTPUT, int(level), "out") for level in levels), (EITHER, 0, "out"), (EITHER, 1, "out"),
    ]  # fmt: skip


def test_what_was_asked_for_is_reported_and_read_at_once_while_the_box_hangs(device, box):
    box.service.hang()
    with device.signals() as changes:
        reply = begin(device, "SetState", "ub", OUTPUT, True)
        assert changes.wait().state is True
    assert device.call("GetState", "u", OUTPUT) is True
    box.service.stop()
    reply.result()
    assert device.log_count("Failed to call method SetIOMode: ") == 1
    assert device.call("GetState", "u", OUTPUT) is True


def test_settings_are_stored_when_the_box_has_failed_to_answer(device, box):
    box.service.hang()
    reply = begin(device, "SetDirection", "us", EITHER, "output")
    assert longest_wait(device) < STALL
    box.service.stop()
    reply.result()
    wait_for(lambda: "input=false" in device.read_settings(), "the settings to be stored")


def test_ports_that_are_dropped_while_the_box_hangs_are_gone_at_once(device, box):
    box.service.hang()
    reply = begin(device, "SetState", "ub", OUTPUT, True)
    assert device.call("DropIOPorts", "as", ["input", "output"]) == ["input", "output"]
    assert longest_wait(device) < STALL
    refreshed = begin(device, "RefreshIOPorts")
    box.service.resume()
    reply.result()
    refreshed.result()
    assert box.modes() == [(OUTPUT, 0, "out"), (OUTPUT, 1, "out"), (OUTPUT, 0, "out")]


# A streamer and a coordinator that hang


def test_a_streamer_that_comes_and_hangs_keeps_nobody_waiting(device, neighbourhood):
    device.start()
    streamer = Streamer(neighbourhood, device, {1: True}, silent=f"{Streamer.ROOT}/")
    assert longest_wait(device) < STALL
    streamer.service.stop()
    Streamer(neighbourhood, device, {1: True, 2: True})
    trigger = lambda props: props.id == "manualtrigger2"  # noqa: E731
    wait_for(lambda: any(map(trigger, device.port_props())), "the triggers of the next streamer")


def test_a_coordinator_that_comes_and_hangs_keeps_nobody_waiting(device, neighbourhood):
    device.start()
    Coordinator(neighbourhood, device, True, silent="/")
    assert longest_wait(device) < STALL
    stop_in_time(device)


# The end


def test_the_daemon_ends_in_time_while_callers_wait_for_the_box(device, box):
    box.service.hang()
    begin_supervision(device)  # whose caller also waits for storage, and then finds no daemon
    replies = [ask(device) for name, (ask, _mode) in CALLS.items() if name != "SetSupervised"]
    replies.append(begin(device, "RefreshIOPorts"))
    device.call("GetNbrPorts")
    stop_in_time(device)
    for reply in replies:
        reply.result()
    assert "supervised_input=true" in device.read_settings()


def test_the_daemon_ends_in_time_while_a_step_waits_for_the_box(device, box):
    box.service.hang()
    device.call("StartActionSequence", "uba(bi)", OUTPUT, False, [(True, 0), (False, 0)] * 100)
    stop_in_time(device)


def test_the_daemon_ends_in_time_while_it_waits_for_the_box_at_start(device, neighbourhood):
    IoBox(neighbourhood, device).service.hang()
    device.start(wait=False)
    wait_for(lambda: "I/O box" in threads(device), "the thread that waits for the box")
    stop_in_time(device)


def test_the_daemon_ends_in_time_while_it_waits_for_the_hardware_id_at_start(make_device, neighbourhood):
    device = make_device()
    device.conf(hwdesc(port("same", 1, hwid="A1"), port("other", 2, hwid="B2")))
    methods = [("ReadBootblockParam", "s", "s", "ret = 'A1'")]
    service = neighbourhood.play(device, POLICY, {"/com/kelv/PolicyKitSystem": (POLICY, {}, methods)})
    service.hang()
    device.start(wait=False)
    wait_for(lambda: "Hardware id" in threads(device), "the thread that asks for the hardware id")
    stop_in_time(device)


def test_the_daemon_ends_in_time_beside_a_streamer_that_hangs(device, neighbourhood):
    Streamer(neighbourhood, device, {1: True}, silent="/")
    device.start()
    wait_for(lambda: "Streamer" in threads(device), "the thread that looks for channels")
    stop_in_time(device)


# The start


def test_neighbours_that_are_all_silent_hold_the_start_once_each(make_device, neighbourhood):
    device = make_device()
    numbers = range(30, 50)
    device.conf(hwdesc(
        port("same", 1, hwid="A1"), port("other", 2, hwid="B2"),
        *(port(f"box{number}", number, backend="iobox", optional=True) for number in numbers),
        f'<first_virtual_input nbr="{FIRST}"/>',
    ))  # fmt: skip
    for number in range(4):
        device.fragment(f"{number}.xml", hwdesc(port(f"more{number}", 10 + number, hwid="A1")))
    methods = [("ReadBootblockParam", "s", "s", "ret = 'A1'")]
    neighbourhood.play(
        device, POLICY, {"/com/kelv/PolicyKitSystem": (POLICY, {}, methods)}
    ).hang()
    IoBox(neighbourhood, device).service.hang()
    Streamer(neighbourhood, device, {1: True}).service.hang()
    Coordinator(neighbourhood, device, True).service.hang()
    began = time.monotonic()
    device.start()
    assert 49 < time.monotonic() - began < 60
    assert longest_wait(device) < STALL
    known = {"same", "other", *(f"more{number}" for number in range(4))}
    assert {props.id for props in device.port_props()} == known
