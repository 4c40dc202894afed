"""An I/O box monitor that is started anew, or replaced by another one, beside the daemon."""

import pytest

from converters import supervise
from harness import Device, Signals, hwdesc, port, wait_for
from neighbours import IoBox, arrived, barrier, longest_wait, neighbourhood_fixture
from producer import Producer

neighbourhood = pytest.fixture(neighbourhood_fixture)

INPUT, OUTPUT, EITHER, OTHER = 1, 2, 3, 9
EVENT = '<event declaration="IOPort" input="true" output="false"/>'
DOCUMENT = hwdesc(
    port("input", INPUT, backend="iobox", optional=True, extra=EVENT),
    port("output", OUTPUT, kind="output", backend="iobox", optional=True),
    port("either", EITHER, kind="io_ctrl", backend="iobox"),
    port("other", OTHER),
)
MODES = {(INPUT, 0, "in"), (OUTPUT, 0, "out"), (EITHER, 0, "in")}


@pytest.fixture
def device(make_device) -> Device:
    device = make_device()
    device.conf(DOCUMENT)
    return device


def told(device: Device, box: IoBox, modes: set[tuple] = MODES) -> None:
    """Returns when the box was told all modes and the daemon has taken what it answered."""
    box.wait_told(modes)
    # A mode is answered behind everything that was asked before.
    device.call("SetState", "ub", OUTPUT, device.call("GetState", "u", OUTPUT))
    arrived()


def reported(changes: Signals) -> list[tuple[int, bool]]:
    return [(change.port, change.state) for change in changes.received if not change.virtual_trig]


def expect_working(device: Device, box: IoBox) -> None:
    with device.signals() as changes:
        box.report(INPUT, "closed")
        box.report(INPUT, "open")
        wait_for(lambda: len(reported(changes)) == 2, "both changes")
        barrier(device, changes, OTHER)
        assert reported(changes) == [(INPUT, True), (INPUT, False)]
    for active in (True, False):
        device.call("SetState", "ub", OUTPUT, active)
        assert box.modes()[-1] == (OUTPUT, int(active), "out")


def test_a_monitor_that_is_restarted_is_told_the_modes_of_all_ports(device, neighbourhood):
    first = IoBox(neighbourhood, device)
    device.start()
    device.wait_name("com.kelv.IOSupervised.Supervised")
    device.call("SetState", "ub", OUTPUT, True)
    device.call("SetDirection", "us", EITHER, "output")
    supervise(device, number=INPUT)
    first.service.stop()
    second = IoBox(neighbourhood, device)
    told(device, second, {(INPUT, 0, "supervised_in"), (OUTPUT, 1, "out"), (EITHER, 0, "out")})
    assert set(second.service.calls(IoBox.PATH, "GetIOState")) == {(INPUT,)}


def test_a_state_that_has_changed_over_a_restart_is_reported_like_any_other(device, neighbourhood):
    first = IoBox(neighbourhood, device)
    device.start()
    first.service.stop()
    with device.signals() as changes, Producer(device).signals("Sent") as sent:
        second = IoBox(
            neighbourhood, device, GetIOState=("s", f"ret = 'closed' if args[0] == {INPUT} else 'open'")
        )
        told(device, second)
        assert reported(changes) == [(INPUT, True)]
        assert sent.wait()[1]["state"] is True
    assert device.call("GetState", "u", INPUT) is True


def test_a_restart_that_changes_nothing_is_not_reported(device, neighbourhood):
    first = IoBox(neighbourhood, device)
    device.start()
    first.service.stop()
    with device.signals() as changes:
        told(device, IoBox(neighbourhood, device))
        assert reported(changes) == []


def test_a_restart_tells_nothing_of_ports_that_are_dropped(device, neighbourhood):
    first = IoBox(neighbourhood, device)
    device.start()
    device.call("DropIOPorts", "as", ["input"])
    first.service.stop()
    second = IoBox(neighbourhood, device)
    told(device, second, MODES - {(INPUT, 0, "in")})
    assert INPUT not in {number for number, _level, _mode in second.modes()}


def test_a_monitor_that_hangs_after_a_restart_keeps_nobody_waiting(device, neighbourhood):
    first = IoBox(neighbourhood, device)
    device.start()
    first.service.stop()
    second = IoBox(neighbourhood, device, ignored=["SetIOMode"])
    assert longest_wait(device) < 0.25
    second.service.stop()
    third = IoBox(neighbourhood, device)
    told(device, third)
    expect_working(device, third)


def test_a_monitor_that_hangs_and_is_restarted_gets_what_was_asked_for_meanwhile(device, neighbourhood):
    first = IoBox(neighbourhood, device)
    device.start()
    first.service.hang()
    replies = [device.bus.begin_call(
        "com.kelv.IOControl.State", "/com/kelv/IOControl/State", "com.kelv.IOControl.State",
        "SetState", "ub", OUTPUT, active,
    ) for active in (True, False, True)]  # fmt: skip
    device.call("GetNbrPorts")
    first.service.stop()
    second = IoBox(neighbourhood, device)
    for reply in replies:
        reply.result()
    told(device, second, {(INPUT, 0, "in"), (OUTPUT, 1, "out"), (EITHER, 0, "in")})


def test_ports_follow_a_monitor_that_is_restarted_many_times(device, neighbourhood):
    IoBox(neighbourhood, device).service.stop()
    device.start()
    device.call("RefreshIOPorts")
    box = IoBox(neighbourhood, device)
    device.call("RefreshIOPorts")
    for _ in range(3):
        expect_working(device, box)
        box.service.stop()
        box = IoBox(neighbourhood, device)
        told(device, box, {(INPUT, 0, "in"), (OUTPUT, 0, "out")})
    device.call("DropIOPorts", "as", ["input", "output"])
    device.call("RefreshIOPorts")
    expect_working(device, box)


def test_ports_follow_a_monitor_that_another_one_replaces(device, neighbourhood):
    first = IoBox(neighbourhood, device)
    device.start()
    second = IoBox(neighbourhood, device)
    told(device, second)
    expect_working(device, second)
    with device.signals() as changes:
        first.service.emit(IoBox.PATH, "IOStateChanged", "is", INPUT, "closed")
        barrier(device, changes, OTHER)
        assert reported(changes) in ([], [(INPUT, True)])
