"""Some of the faults that tests/faults/run injects one by one: a call to the system that fails, once, at
the start or in a scenario on every backend.

PORTD_TEST_FAULTS is how many of them, spread over all.
"""

import os
import random
import sys
from pathlib import Path

import pytest

from gpio_tree import device_on_lines

TESTS = Path(__file__).resolve().parents[1]
sys.path += [str(TESTS / "soak"), str(TESTS / "faults")]

SHARES = 4
COUNT = int(os.environ.get("PORTD_TEST_FAULTS", "40"))

device = pytest.fixture(device_on_lines)


@pytest.fixture
def faults(device, tree, tmp_path):
    from faults import Faults

    device.allow_critical("CRITICAL: portd: ")  # but none of GLib's
    faults = Faults(device, tree, tmp_path, random.Random(0))
    yield faults
    faults.close()


def expect_no_problem(faults, chosen) -> None:
    problems = [problem for problem in map(faults.inject, chosen) if problem]
    print(faults.outcomes)
    assert not problems, "\n".join(problems)


@pytest.mark.parametrize("share", range(SHARES))
def test_a_call_that_fails_once_is_lived_through_or_ends_the_daemon_with_a_message(faults, share):
    every = faults.count()
    step = max(1, len(every) // COUNT)
    expect_no_problem(faults, every[share * step::SHARES * step])


def test_a_thread_that_can_not_be_started_is_lived_through_or_ends_the_daemon_with_a_message(faults):
    if faults.device.sanitized:
        return  # the sanitizer stands between, so that nobody knows whose thread it is
    chosen = [fault for fault in faults.count() if fault.call == "pthread_create"]
    assert chosen
    expect_no_problem(faults, chosen)
