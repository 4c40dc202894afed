"""Fails one call of the daemon to the system at a time, and sees what becomes of it."""

import errno
import re
import struct
import subprocess
from collections import Counter
from pathlib import Path
from typing import Any, Callable, NamedTuple, Optional

from gi.repository import GLib

from converters import SUPERVISED, SUPERVISED_PATH
from gpio_tree import GpioTree
from harness import DBusError, Device, wait_for
from harness.device import CONTROL
from legacy_tool import INPUT, SERVICE, Tool
from world import LAMP, OPTIONAL, World, make_ports

_SHIM = Path(__file__).with_name("shim.c")
_LIBRARY, _COUNTS = "/run/faults.so", "/run/faults.counts"
_HALF = -1  # of what was to be read or written

_E = errno
# The calls, in the order of shim.c, and what each can fail with.
CALLS: dict[str, tuple[int, ...]] = {
    "open": (_E.EINTR, _E.EIO, _E.EACCES, _E.EMFILE, _E.ENOSPC),
    "read": (_E.EINTR, _E.EIO, _HALF),
    "write": (_E.EINTR, _E.EIO, _E.ENOSPC, _HALF),
    "ioctl": (_E.EINTR, _E.EIO),
    "fsync": (_E.EINTR, _E.EIO, _E.ENOSPC),
    "rename": (_E.EIO, _E.ENOSPC, _E.EACCES),
    "poll": (_E.EINTR,),
    "eventfd": (_E.EMFILE,),
    "pthread_create": (_E.EAGAIN,),
    "stat": (_E.EIO, _E.EACCES),
    "fstat": (_E.EIO,),
    "lstat": (_E.EIO, _E.EACCES),
    "access": (_E.EIO, _E.EACCES),
    "fchmod": (_E.EIO, _E.EPERM),
    "fchown": (_E.EIO, _E.EPERM),
    "unlink": (_E.EIO, _E.EACCES),
    "lseek": (_E.EIO,),
    "ftruncate": (_E.EINTR, _E.EIO),
    "opendir": (_E.EIO, _E.EACCES, _E.EMFILE),
    "mkdir": (_E.EIO, _E.EACCES, _E.ENOSPC),
    "setgid": (_E.EPERM,),
    "initgroups": (_E.EPERM,),
    "setuid": (_E.EPERM, _E.EAGAIN),
    "setrlimit": (_E.EPERM,),
    "socket": (_E.EMFILE,),
    "send": (_E.EIO,),
    "readlinkat": (_E.EIO,),
}
# GLib ends the program when it can't make these for itself, whatever the program does.
NOT_OURS = ("eventfd",)

SETTINGS = """# Kept by hand.
[relay]
output_name=Old relay
output_activelow=false
button_type=none
pulse_time=0
port_mode=bistable
delay_time=0
"""
_COMPLAINT = re.compile("(ERROR|CRITICAL|WARNING|LEVEL256): portd: ")
RELAY, GATE, LAMP_PORT, FLAG, LINE, BOX_IN, BOX_OUT = 1, 3, 4, 5, 6, 7, 8


class Fault(NamedTuple):
    call: str
    nth: int
    error: int

    def __str__(self) -> str:
        name = "a part" if self.error == _HALF else errno.errorcode[self.error]
        return f"{self.call} {self.nth}: {name}"


class Faults:
    def __init__(self, device: Device, tree: GpioTree, folder: Path, random: Any):
        self.device, self.tree = device, tree
        library = folder / "faults.so"
        subprocess.run(
            ["cc", "-shared", "-fPIC", "-O1", "-o", str(library), str(_SHIM), "-ldl"], check=True
        )
        device.write(_LIBRARY, "")
        device.sandbox.bind(_LIBRARY, library)
        self.world = World(device, tree, folder, random)
        self._preload()
        self.fault: Optional[Fault] = None
        self.outcomes: Counter = Counter()
        self.ports = make_ports()
        self.tool = Tool(device)
        self._passes = 0
        device.conf(self.world.document(self.ports))

    def _preload(self) -> None:
        plain = self.device._environment

        def environment() -> dict[str, str]:
            env = plain()
            env["LD_PRELOAD"] = f"{_LIBRARY}:{env['LD_PRELOAD']}"
            env["FAULTS_COUNTS"] = _COUNTS
            if self.fault:
                call, nth, error = self.fault
                env |= {"FAULTS_CALL": call, "FAULTS_NTH": str(nth), "FAULTS_ERRNO": str(error)}
            return env

        self.device._environment = environment  # type: ignore[method-assign]

    def close(self) -> None:
        self.world.close()

    # --- Runs ---

    def count(self) -> list[Fault]:
        """Every fault that there can be in a run."""
        self._begin(None)
        assert self._starts(), "the daemon does not start without a fault"
        self._pass(strict=False)
        lived, _ = self._counts()
        self._pass(strict=True)
        at_end, _ = self._counts()
        self.device.stop()
        ended, _ = self._counts()
        return [
            Fault(call, nth, error)
            for call, errors in CALLS.items() if call not in NOT_OURS
            for nth in (*range(1, lived[call] + 1), *range(at_end[call] + 1, ended[call] + 1))
            for error in errors
        ]  # fmt: skip

    def inject(self, fault: Fault) -> Optional[str]:
        """What is wrong with how the daemon takes the fault, or nothing."""
        self._begin(fault)
        try:
            self._live_through()
            self._settings_are_whole()
        except (AssertionError, TimeoutError, DBusError, GLib.Error, RuntimeError) as error:
            return f"{fault}: {error}\n{self._last_words()}"
        finally:
            self._end()
        return None

    def _begin(self, fault: Optional[Fault]) -> None:
        self.fault = fault
        self.device.write(_COUNTS, "\0" * 4 * (len(CALLS) + 1)).chmod(0o666)
        self.device.settings(SETTINGS)
        self.world.heal()

    def _end(self) -> None:
        if self.device.running:
            self.device.kill()
        elif self.device._process is not None:
            self.device.wait_exit()

    def _counts(self) -> tuple[dict[str, int], bool]:
        data = self.device.path(_COUNTS).read_bytes()
        *counts, came = struct.unpack(f"{len(CALLS) + 1}I", data)
        return dict(zip(CALLS, counts)), bool(came)

    def _starts(self) -> bool:
        self.device.start(wait=False)
        wait_for(lambda: not self.device.running or self.device.bus.has_owner(CONTROL), "the start", 30)
        return self.device.running

    def _live_through(self) -> None:
        if not self._starts():
            self._has_refused()
            self._start_again()
            return
        at_start = self._counts()[1]
        self._pass(strict=False)
        try:
            self._works()
            outcome = "alive"
        except (AssertionError, TimeoutError, DBusError):
            # What is read once, at the start, is missing until the next one, and the log says so.
            if not at_start or not self.device.running:
                raise
            said = [line for line in self.device.log().splitlines() if _COMPLAINT.match(line)]
            assert said, "a part is missing, and the log says nothing"
            outcome = "alive without a part, until the next start"
        came = self._counts()[1]
        self.device.stop()
        if outcome != "alive":
            self._start_again()
        self.outcomes[outcome if came else "not reached"] += 1

    def _works(self) -> None:
        """All of it, or all of it the next time where the fault has only come now."""
        came_before = self._counts()[1]
        try:
            self._pass(strict=True)
        except (AssertionError, TimeoutError, DBusError):
            if came_before or not self._counts()[1] or not self.device.running:
                raise
            self._pass(strict=True)

    def _start_again(self) -> None:
        self.fault = None
        assert self._starts(), "the daemon does not start after the fault"
        self._pass(strict=True)
        self.device.stop()

    def _has_refused(self) -> None:
        status, log = self.device.wait_exit(), self.device.log() + self.device.stderr()
        assert status == 1, f"it ended with status {status}"
        said = [line for line in log.splitlines() if _COMPLAINT.match(line)]
        assert said, "it ended without a word"
        self.outcomes["status 1 with a message"] += 1

    def _settings_are_whole(self) -> None:
        file = GLib.KeyFile()
        text = self.device.read_settings()
        file.load_from_data(text, len(text.encode()), GLib.KeyFileFlags.KEEP_COMMENTS)
        assert "# Kept by hand." in text and file.has_group("relay"), f"the settings are {text!r}"
        lacking = {"output_name", "output_activelow", "delay_time"} - set(file.get_keys("relay")[0])
        assert not lacking, f"the settings lack {lacking}: {text!r}"

    def _last_words(self) -> str:
        return "\n".join((self.device.log() + self.device.stderr()).splitlines()[-12:])

    # --- The scenario ---

    def _pass(self, strict: bool) -> None:
        """Everything once. Strict: all of it works; otherwise each call is answered, be it by an error."""
        self._passes += 1
        # A port that has to do without a line gets it with the next set-up.
        first = self._drop_and_refresh if strict else self._refresh
        steps = (first, self._name, self._states, self._flag, self._supervision, self._sequence,
                 self._drop_and_refresh, self._legacy)  # fmt: skip
        for step in steps:
            try:
                step(strict)
            except (DBusError, AssertionError):
                if strict:
                    raise
            except TimeoutError:
                if strict or not self.device.running:
                    raise
            assert self.device.running, f"it ended in {step.__name__}"

    def _until(self, condition: Callable[[], Any], what: str, strict: bool) -> None:
        wait_for(lambda: not self.device.running or condition(), what, 5 if strict else 0.5)

    def _refresh(self, strict: bool) -> None:
        self.device.call("RefreshIOPorts")
        ids = {port.id for port in self.ports}
        self._until(lambda: ids <= {props.id for props in self.device.port_props()}, "all ports", strict)

    def _name(self, strict: bool) -> None:
        name = f"Relay {self._passes}"
        self.device.call("SetName", "ubs", RELAY, False, name)
        assert self.device.call("GetNames", "u", RELAY) == ("", name)
        self._until(lambda: name in self.device.read_settings(), "the name to be stored", strict)

    def _states(self, strict: bool) -> None:
        for state in (True, False):
            for number in (RELAY, LAMP_PORT, BOX_OUT):
                self.device.call("SetState", "ub", number, state)
                assert self.device.call("GetState", "u", number) is state
            assert self.tree.read(LAMP, "value")[0] == str(int(state))
            self.device.call("SetVirtual", "ub", GATE, state)
            assert self.device.call("GetState", "u", GATE) is state

    def _flag(self, strict: bool) -> None:
        for state in (True, False):
            self.world.flag = state
            self.world._write_flags()
            self._until(lambda: self.device.call("GetState", "u", FLAG) is state, "the flag", strict)

    def _supervised(self, method: str, signature: str, *args: Any) -> Any:
        return self.device.bus.call(SUPERVISED, SUPERVISED_PATH, SUPERVISED, method, signature, *args)

    def _supervision(self, strict: bool) -> None:
        self.device.wait_name(SUPERVISED)
        for number in (LINE, BOX_IN):
            for on in (True, False):
                self._supervised("SetSupervised", "ub", number, on)
        level = self._supervised("GetSupervisedReadout", "u", LINE)[1]
        assert level == self.world.level, f"the level is {level}"

    def _sequence(self, strict: bool) -> None:
        with self.device.signals("ActionSequenceDone") as done:
            self.device.call("StartActionSequence", "uba(bi)", RELAY, False, [(True, 2), (False, 2)])
            done.wait(timeout=5 if strict else 0.5)

    def _drop_and_refresh(self, strict: bool) -> None:
        self.device.call("DropIOPorts", "as", OPTIONAL)
        self._refresh(strict)

    def _legacy(self, strict: bool) -> None:
        if strict:
            self.device.wait_name(SERVICE)
        name = f"Contact {self._passes}"
        self.tool.set(0, INPUT, "Name", name)
        assert self.tool.get(0, INPUT, "Name") == name
        self._until(lambda: name in self.device.read_settings(), "the name to be stored", strict)
