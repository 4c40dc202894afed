"""How long a caller that only reads has to wait: asks again and again, and prints the longest waits.

Of each wait the time is taken off in which the daemon, the bus or this program were ready to run and
had no processor: on a busy machine that says nothing of the daemon. (Where they wait at the same time
it is taken off twice, so that a stall of the daemon's own may look that much shorter.)
"""

import sys
import time
from pathlib import Path

from gi.repository import Gio

NAME, PATH = "com.kelv.IOControl.State", "/com/kelv/IOControl/State"
PAUSE = 0.01  # seconds between two questions


def waited(pids: tuple[str, ...]) -> dict[str, int]:
    """For how many nanoseconds each thread of these processes has waited for a processor so far."""
    times = {}
    for pid in pids:
        for task in Path(f"/proc/{pid}/task").iterdir():
            try:
                times[task.name] = int((task / "schedstat").read_text().split()[1])
            except (FileNotFoundError, ProcessLookupError):  # it has ended meanwhile
                pass
    return times


def main(address: str, *pids: str) -> None:
    flags = (Gio.DBusConnectionFlags.AUTHENTICATION_CLIENT
             | Gio.DBusConnectionFlags.MESSAGE_BUS_CONNECTION)  # fmt: skip
    connection = Gio.DBusConnection.new_for_address_sync(address, flags, None, None)
    connection.set_exit_on_close(False)
    longest = longest_seen = 0.0
    while True:
        before, began = waited((*pids, "self")), time.monotonic()
        connection.call_sync(NAME, PATH, NAME, "GetNbrPorts", None, None, 0, 600_000, None)
        took = time.monotonic() - began
        after = waited((*pids, "self"))
        without = sum(ns - before.get(task, 0) for task, ns in after.items()) / 1e9
        own = max(0.0, took - without)
        if own > longest or took > longest_seen:
            longest, longest_seen = max(longest, own), max(longest_seen, took)
            print(f"{longest:.6f} {longest_seen:.6f}", flush=True)
        time.sleep(PAUSE)


main(*sys.argv[1:])
