"""Waiting for conditions with a deadline; there are no fixed sleeps in this tier."""

import os
import time
from typing import Callable, TypeVar

from gi.repository import GLib

T = TypeVar("T")

# Short enough not to slow a test down, long enough to leave the processor to the daemon.
POLL_INTERVAL = 0.005


def scale() -> float:
    """How much longer everything may take here, for sanitizer builds and slow machines."""
    return float(os.environ.get("PORTD_TEST_TIMEOUT_SCALE", "1"))


def wait_for(condition: Callable[[], T], what: str, timeout: float = 10) -> T:
    """The first true value of the condition, serving D-Bus replies and signals meanwhile."""
    deadline = time.monotonic() + timeout * scale()
    context = GLib.MainContext.default()
    while True:
        while context.iteration(False):
            pass
        value = condition()
        if value:
            return value
        if time.monotonic() > deadline:
            raise TimeoutError(f"waited {timeout * scale():g} s in vain for {what}")
        time.sleep(POLL_INTERVAL)
