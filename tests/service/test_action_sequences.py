"""Action sequences over D-Bus: timed outputs, their signals and how they are cut short."""

import threading
import time
from pathlib import Path

import pytest
from gi.repository import GLib

from harness import DBusError, Device, hwdesc, port, scale, wait_for

OUTPUT, INPUT, VIRTUAL, CONFIGURABLE = 0, 1, 2, 3
FOREVER = 2_000_000

DOCUMENT = hwdesc(
    port("relay", OUTPUT, kind="output"),
    port("contact", INPUT),
    port("flag", VIRTUAL, kind="output", backend="virtual"),
    port("either", CONFIGURABLE, kind="io_ctrl"),
    port("spare", 4, kind="output", optional=True),
    port("siren", 5, kind="output"),
)


@pytest.fixture
def device(make_device) -> Device:
    device = make_device()
    device.conf(DOCUMENT)
    return device.start()


def start(device: Device, number: int, *steps: tuple[bool, int], virtual: bool = False) -> None:
    device.call("StartActionSequence", "uba(bi)", number, virtual, list(steps))


def refused(device: Device, number: int, *steps: tuple[bool, int], virtual: bool = False) -> str:
    with pytest.raises(DBusError) as error:
        start(device, number, *steps, virtual=virtual)
    return f"{error.value.name.rpartition('.')[2]}: {error.value.message}"


def states(changes, number: int) -> list[bool]:
    return [change.state for change in changes if change.port == number]


def test_a_sequence_lasts_for_the_sum_of_its_times_and_reports_its_steps_in_order(device):
    with device.signals() as changes, device.signals("ActionSequenceDone") as done:
        began = time.monotonic()
        start(device, OUTPUT, (True, 100), (False, 50), (True, 50))
        done.wait()
        lasted = time.monotonic() - began
        assert states(changes.received, OUTPUT) == [True, False, True]
        assert lasted >= 0.2
        assert done.received == [(OUTPUT,)]
    assert device.call("GetState", "u", OUTPUT) is True


def test_a_step_without_a_time_moves_on_at_once(device):
    with device.signals() as changes, device.signals("ActionSequenceDone") as done:
        start(device, OUTPUT, (True, 0), (False, -5), (True, -2_000_000), (False, 0))
        done.wait(timeout=5)
        assert states(changes.received, OUTPUT) == [True, False, True, False]


def test_a_time_whose_microseconds_overflow_wraps_to_the_past(device):
    with device.signals("ActionSequenceDone") as done:
        # 2,147,484 ms are 2^31 + 352 us: in 32 bits a large negative number.
        start(device, OUTPUT, (True, 2_147_484))
        done.wait(timeout=5)


def test_a_sequence_without_steps_is_refused_and_starts_nothing(device):
    with device.signals("ActionSequenceDone") as done:
        assert refused(device, OUTPUT) == "Generic: The sequence has no steps."
        start(device, SIREN := 5, (True, 0))
        done.wait(lambda signal: signal == (SIREN,))
        assert done.received == [(SIREN,)]


@pytest.mark.parametrize("number", [INPUT, VIRTUAL, CONFIGURABLE])
def test_only_a_real_output_can_be_driven(device, number):
    assert refused(device, number, (True, 10)) == "Not_output: Port not output."
    device.wait_log("Set action seq on incorrect port")


@pytest.mark.parametrize("number", [OUTPUT, INPUT, VIRTUAL, CONFIGURABLE])
def test_a_virtual_sequence_runs_on_every_port_and_drives_none(device, number):
    with device.signals() as changes, device.signals("ActionSequenceDone") as done:
        start(device, number, (True, 10), (False, 10), virtual=True)
        done.wait()
        received = [change for change in changes.received if change.port == number]
    assert [change.state for change in received] == [True, False]
    assert all(change.virtual_trig for change in received)
    assert device.call("GetState", "u", number) is False


def test_a_virtual_output_keeps_the_last_state_of_a_virtual_sequence(device):
    with device.signals("ActionSequenceDone") as done:
        start(device, VIRTUAL, (False, 1), (True, 1), virtual=True)
        done.wait()
    assert device.call("GetState", "u", VIRTUAL) is True


def test_a_port_with_a_running_sequence_is_busy_and_others_are_not(device):
    with device.signals("ActionSequenceDone") as done:
        start(device, OUTPUT, (True, FOREVER))
        assert refused(device, OUTPUT, (True, 1)) == "Busy: The port is busy."
        start(device, 5, (True, 1))
        done.wait(lambda signal: signal == (5,))
        assert (OUTPUT,) not in done.received


def test_changing_the_active_level_ends_a_sequence_at_once(device):
    with device.signals("ActionSequenceDone") as done:
        start(device, OUTPUT, (True, FOREVER), (False, FOREVER))
        began = time.monotonic()
        device.call("SetActive", "ubs", OUTPUT, False, "open")
        done.wait(timeout=5)
        assert time.monotonic() - began < 1
    assert device.call("GetState", "u", OUTPUT) is True
    start(device, OUTPUT, (False, 1))


def test_changing_the_direction_ends_a_sequence_at_once(device):
    device.call("SetDirection", "us", CONFIGURABLE, "output")
    with device.signals("ActionSequenceDone") as done:
        start(device, CONFIGURABLE, (True, FOREVER))
        device.call("SetDirection", "us", CONFIGURABLE, "input")
        done.wait(timeout=5)
        assert done.received == [(CONFIGURABLE,)]


def test_dropping_a_port_ends_its_sequence(device):
    with device.signals("ActionSequenceDone") as done:
        start(device, 4, (True, FOREVER))
        assert device.call("DropIOPorts", "as", ["spare"]) == ["spare"]
        done.wait(timeout=5)
    device.call("RefreshIOPorts")
    with device.signals("ActionSequenceDone") as done:
        start(device, 4, (True, 1))
        done.wait()


def test_driving_a_port_by_hand_slips_in_between_two_steps(device):
    with device.signals() as changes:
        start(device, OUTPUT, (True, FOREVER))
        changes.wait(lambda change: change.state)
        device.call("SetState", "ub", OUTPUT, False)
        changes.wait(lambda change: not change.state)
    assert refused(device, OUTPUT, (True, 1)) == "Busy: The port is busy."


def test_the_daemon_stops_cleanly_while_sequences_run_on_several_ports(device):
    for number in (OUTPUT, 4, 5):
        start(device, number, *[(True, 1), (False, 1)] * 1000, (True, FOREVER))
    start(device, INPUT, (True, FOREVER), virtual=True)
    device.stop()


MOST_STEPS = 65536


def test_a_sequence_of_too_many_steps_is_refused_and_starts_nothing(device):
    steps = [(True, 0)] * MOST_STEPS
    too_many = "Generic: The sequence has too many steps."
    assert refused(device, OUTPUT, *steps, (True, 0)) == too_many
    with device.signals("ActionSequenceDone") as done:
        start(device, OUTPUT, *steps)
        done.wait(timeout=60)


class Lateness:
    """How late a thread that only sleeps wakes up at most: what the machine does to everybody."""

    def __enter__(self) -> "Lateness":
        self.longest, self._ended = 0.0, threading.Event()
        self._thread = threading.Thread(target=self._sleep)
        self._thread.start()
        return self

    def __exit__(self, *_error) -> None:
        self._ended.set()
        self._thread.join()

    def _sleep(self) -> None:
        while not self._ended.is_set():
            began = time.monotonic()
            time.sleep(0.01)
            self.longest = max(self.longest, time.monotonic() - began - 0.01)


def waits_too_long(device: Device, *steps: tuple[bool, int]) -> bool:
    with Lateness() as lateness:
        longest = longest_wait_during(device, *steps)
    # The caller, the bus and the daemon are each woken up, and the caller again.
    return longest > 0.25 * scale() + 4 * lateness.longest


def longest_wait_during(device: Device, *steps: tuple[bool, int]) -> float:
    """How long another call took at most, in seconds, while the siren's sequence ran."""
    longest = 0.0
    with device.signals("ActionSequenceDone") as done:
        start(device, 5, *steps)
        while not done.received:
            began = time.monotonic()
            device.call("GetState", "u", INPUT)
            longest = max(longest, time.monotonic() - began)
            GLib.MainContext.default().iteration(False)
    return longest


def test_a_sequence_without_pauses_keeps_nobody_waiting(make_device):
    events = '<event declaration="IOPort"/><event declaration="PortAny"/>'
    device = make_device()
    device.environment["G_SLICE"] = "always-malloc"  # as the unit has it
    device.conf(hwdesc(port("contact", INPUT), port("siren", 5, kind="output", extra=events)))
    device.start()
    steps = [(index % 2 == 0, 0) for index in range(MOST_STEPS)]
    longest_wait_during(device, *steps[:1000])
    resident = resident_kib(device)
    # The longest of thousands of waits: a machine with other work too gets several attempts.
    assert not all(waits_too_long(device, *steps) for _attempt in range(3))
    memory_comes_back(device, resident)


def test_the_memory_of_a_sequence_that_is_refused_comes_back(make_device):
    device = make_device()
    device.environment["G_SLICE"] = "always-malloc"  # as the unit has it
    device.conf(hwdesc(port("siren", OUTPUT, kind="output")))
    device.start()
    resident = resident_kib(device)
    refused(device, OUTPUT, *[(True, 0)] * (MOST_STEPS + 1))
    memory_comes_back(device, resident)


def memory_comes_back(device: Device, resident: int) -> None:
    if not device.sanitized:  # which keeps what is freed
        wait_for(lambda: resident_kib(device) - resident < 2048, "the memory to come back")


def resident_kib(device: Device) -> int:
    return int(device.status("VmRSS").split()[0])


def test_the_limit_of_descriptors_is_the_highest_that_the_system_allows(device):
    limits = Path(f"/proc/{device.pid}/limits").read_text().splitlines()
    words = next(line.split() for line in limits if line.startswith("Max open files"))
    soft, hard = words[3:5]
    assert soft == hard


def test_a_sequence_of_many_steps_keeps_their_order(device):
    steps = [(index % 2 == 0, 0) for index in range(2000)]
    with device.signals() as changes, device.signals("ActionSequenceDone") as done:
        start(device, OUTPUT, *steps)
        done.wait(timeout=30)
        assert states(changes.received, OUTPUT) == [state for state, _time in steps]


def test_many_starts_and_cancels_give_one_done_each(device):
    rounds = 200
    with device.signals("ActionSequenceDone") as done:
        for index in range(rounds):
            start(device, OUTPUT, (index % 2 == 0, FOREVER))
            device.call("SetActive", "ubs", OUTPUT, False, "open" if index % 2 else "closed")
        done.wait_count(rounds)
        device.call("GetState", "u", OUTPUT)
        assert done.received == [(OUTPUT,)] * rounds
