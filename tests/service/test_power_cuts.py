"""What the settings file and the files for the legacy service look like after a power cut.

The daemon's writes are recorded at the system calls. A journaling file system may then show, for a
cut after each of them: every rename so far that its folder was synced behind, and of the later ones
any number, in their order; and of a file whose bytes were not synced any beginning of them.
"""

import os
import random
import re
from dataclasses import dataclass, field
from pathlib import Path
from typing import Iterator

import pytest

from harness import Device, hwdesc, is_real_root, port, wait_for

SETTINGS = "/etc/portd/portd.conf"
MAPPING = "/etc/legacyconfig/legacymappings.d/portd.xml"
SERVICES = "/etc/service_registry/services.d/portd_service_registry.conf"
TARGETS = (SETTINGS, MAPPING, SERVICES)
TRACE = "/run/trace"

_CALLS = "openat,write,pwrite64,fsync,fdatasync,rename,renameat,renameat2,unlink,unlinkat,ftruncate"
_BEGUN = re.compile(r"^(?P<thread>\d+) +(?P<rest>.*) <unfinished \.\.\.>$")
_ENDED = re.compile(r"^(?P<thread>\d+) +<\.\.\. \w+ resumed>(?P<rest>.*)$")
_LINE = re.compile(r"^\d+ +(?P<call>\w+)\((?P<arguments>.*)\) += (?P<result>-?\d+)")
_DESCRIPTOR = re.compile(r"^\d+<(?P<path>[^>]*)>")
_TEXT = re.compile(r'"((?:\\x[0-9a-f]{2})*)"')

KILLS = int(os.environ.get("PORTD_TEST_KILLS", "8"))


def unhex(text: str) -> bytes:
    return bytes.fromhex(text.replace("\\x", ""))


@dataclass
class Operation:
    """One system call on a file that matters."""

    call: str
    path: str
    other: str = ""
    data: bytes = b""


def whole_lines(trace: str) -> Iterator[str]:
    """Each call where it ended, also those that another thread's calls came between."""
    begun: dict[str, str] = {}
    for line in trace.splitlines():
        if match := _BEGUN.match(line):
            begun[match["thread"]] = match["rest"]
        elif match := _ENDED.match(line):
            yield f"{match['thread']} {begun.pop(match['thread'], '')}{match['rest']}"
        else:
            yield line


def operations(trace: str) -> Iterator[Operation]:
    for line in whole_lines(trace):
        match = _LINE.match(line)
        if not match or int(match["result"]) < 0:
            continue
        call, arguments = match["call"], match["arguments"]
        texts = [unhex(text) for text in _TEXT.findall(arguments)]
        if call in ("write", "pwrite64", "fsync", "fdatasync", "ftruncate"):
            descriptor = _DESCRIPTOR.match(arguments)
            path = unhex(descriptor["path"]).decode() if descriptor else ""
            if path.startswith("/etc/"):
                data = texts[0][: int(match["result"])] if texts else b""
                yield Operation(call.removesuffix("64"), path, data=data)
        elif call.startswith("rename"):
            yield Operation("rename", texts[0].decode(), texts[1].decode())
        elif call.startswith("unlink"):
            yield Operation("unlink", texts[0].decode())
        elif "O_TRUNC" in arguments and texts:
            yield Operation("truncate", texts[0].decode())


@dataclass
class File:
    """Contents as they are written, and how many bytes of them were on storage at the last sync."""

    data: bytes = b""
    synced: int = -1  # not even that it is there

    def after_a_cut(self) -> list[bytes]:
        least = max(self.synced, 0)
        return sorted({self.data[:least], self.data[: (least + len(self.data)) // 2], self.data})


@dataclass
class Disk:
    """What is written, what of it is on storage, and what a cut may leave."""

    files: dict[str, File]
    stored: dict[str, list[bytes]] = field(default_factory=dict)  # by target: what a cut may show
    pending: list[tuple[str, File]] = field(default_factory=list)
    whole: dict[str, set[bytes]] = field(default_factory=dict)

    def apply(self, operation: Operation) -> None:
        getattr(self, f"_{operation.call}")(operation)

    def _write(self, operation: Operation) -> None:
        self.files.setdefault(operation.path, File()).data += operation.data

    _pwrite = _write

    def _truncate(self, operation: Operation) -> None:
        self.files[operation.path] = File()
        if operation.path in TARGETS:
            self.pending.append((operation.path, self.files[operation.path]))

    _ftruncate = _truncate

    def _fsync(self, operation: Operation) -> None:
        if operation.path in self.files:
            file = self.files[operation.path]
            file.synced = len(file.data)
        else:
            self._sync_folder(operation.path)

    _fdatasync = _fsync

    def _sync_folder(self, folder: str) -> None:
        for target, file in self.pending:
            if os.path.dirname(target) == folder.rstrip("/"):
                self.stored[target] = file.after_a_cut()
        self.pending = [entry for entry in self.pending if os.path.dirname(entry[0]) != folder]

    def _rename(self, operation: Operation) -> None:
        file = self.files.pop(operation.path, None)
        if file is not None:
            self.files[operation.other] = file
            if operation.other in TARGETS:
                self.pending.append((operation.other, file))
                self.whole[operation.other].add(file.data)

    def _unlink(self, operation: Operation) -> None:
        self.files.pop(operation.path, None)

    def after_a_cut(self, target: str) -> set[bytes]:
        """Everything that the file may hold if the power goes now."""
        shown = set(self.stored.get(target, []))
        for path, file in self.pending:
            if path == target:
                shown.update(file.after_a_cut())
        return shown


@pytest.fixture
def described(device) -> Device:
    relay, siren = port("relay", 1, "output"), port("siren", 2, "output", optional=True)
    device.conf(hwdesc(port("door", 0), relay, siren))
    return device


def exercise(device: Device) -> None:
    """Everything that has the daemon store something, described."""
    # A process that is traced can't look for its leaks.
    device.environment = {"ASAN_OPTIONS": "detect_leaks=0"}
    options = ["-D", "-f", "-y", "-xx", "-s", "1000000", "-e", f"trace={_CALLS}", "-o", TRACE]
    device.start(launcher=["strace", *options])
    for n in range(3):
        device.call("SetName", "ubs", 1, False, f"Relay {n}")
        device.call("SetActive", "ubs", 0, True, ("open", "closed")[n % 2])
    device.call("DropIOPorts", "as", ["siren"])
    device.call("RefreshIOPorts")
    device.stop()


def first_contents(device: Device, path: str) -> list[bytes]:
    file = device.path(path)
    return [file.read_bytes()] if file.exists() else []


def test_after_a_cut_each_file_is_the_old_or_the_new_one_whole(described):
    stored = {target: first_contents(described, target) for target in TARGETS}
    exercise(described)
    trace = list(operations(described.read(TRACE)))
    disk = Disk({}, stored, whole={target: set(stored[target]) for target in TARGETS})
    shown: dict[str, set[bytes]] = {target: set() for target in TARGETS}
    for operation in trace:
        disk.apply(operation)
        for target in TARGETS:
            shown[target] |= disk.after_a_cut(target)
    assert [target for target in TARGETS if not disk.whole[target]] == []
    for target in TARGETS:
        torn = shown[target] - disk.whole[target]
        assert not torn, f"{target} may hold {min(torn)!r} after a cut"


def test_the_next_start_after_a_cut_is_clean(described, make_device):
    """What a cut leaves beside the settings is a file half written."""
    exercise(described)
    whole = described.path(SETTINGS).read_bytes()
    after = make_device()
    after.conf(described.read("/usr/share/portd/conf.xml"))
    after.settings(whole.decode())
    leftover = after.write(f"{SETTINGS}.tmp-Ab3dEf", whole.decode()[: len(whole) // 2])
    if is_real_root():
        os.chown(leftover, after.path(SETTINGS).stat().st_uid, -1)
    after.start()
    assert after.call("GetNames", "u", 1) == ("", "Relay 2")
    assert sorted(entry.name for entry in leftover.parent.iterdir()) == ["portd.conf"]


def test_killed_at_any_moment_the_daemon_leaves_a_whole_file(device):
    rng = random.Random(KILLS)
    device.conf(hwdesc(*(port(f"out{n}", n, "output") for n in range(8))))
    device.start()
    for turn in range(KILLS):
        pending = [device.begin_call("SetName", "ubs", n, False, f"{turn}") for n in range(8)]
        limit = rng.randrange(9)
        wait_for(lambda: sum(call.done for call in pending) >= limit, "some of the replies")  # noqa: B023
        device.kill()
        device.start()
        for n in range(8):
            name = device.call("GetNames", "u", n)[1]
            assert name == f"Output {n + 1}" or int(name) <= turn
    assert [entry.name for entry in Path(device.path(SETTINGS)).parent.iterdir()] == ["portd.conf"]
