"""A device: the daemon in its sandbox, with all that a test wants to say to it or read of it."""

import os
import re
import signal
import subprocess
from functools import lru_cache
from pathlib import Path
from typing import Any, NamedTuple, Optional, Sequence

from .bus import Mock, Pending, Signals, SystemBus
from .sandbox import Sandbox, is_real_root
from .waiting import scale, wait_for

REPOSITORY = Path(__file__).resolve().parents[3]
POLICY = REPOSITORY / "data/dbus/com.kelv.portd.conf"

CONTROL = "com.kelv.IOControl.State"
CONTROL_PATH = "/com/kelv/IOControl/State"
CONF = "/usr/share/portd/conf.xml"
FRAGMENTS = "/etc/portd.d"
SETTINGS = "/etc/portd/portd.conf"

PCD_ID = 990
_PASSWD = "root:x:0:0:root:/root:/bin/sh\nnobody:x:65534:65534::/nonexistent:/bin/false\n"
_GROUP = "root:x:0:\nnogroup:x:65534:\n"
_PCD_USER = f"pcd:x:{PCD_ID}:{PCD_ID}::/run/portd:/bin/false\n"
_PCD_GROUP = f"pcd:x:{PCD_ID}:\n"

# The folders that an installed system has, and the one of them that the service account may write.
_PCD_FOLDER = "/etc/portd"
_FOLDERS = (
    _PCD_FOLDER,
    FRAGMENTS,
    "/etc/dynamic/portd",
    "/etc/service_registry/services.d",
    "/etc/legacyconfig/legacymappings.d",
    "/usr/share/portd",
)

_BINARY = "/run/test-binaries/portd"
_SUPPRESSIONS = "/run/test-binaries/tsan.supp"
_PASSED_ON = ("ASAN_OPTIONS", "UBSAN_OPTIONS", "LSAN_OPTIONS", "LLVM_PROFILE_FILE")
_SANITIZER_REPORT = re.compile(
    r"ERROR: AddressSanitizer|runtime error:|WARNING: ThreadSanitizer|LeakSanitizer"
)
_EXIT_DEADLINE = 20


def default_binary() -> Path:
    return Path(os.environ.get("PORTD_BINARY", REPOSITORY / "build/src/portd")).absolute()


@lru_cache(maxsize=None)
def is_sanitized(binary: Path) -> bool:
    """Whether memory use and speed of this build say nothing about those of the real one."""
    text = binary.read_bytes()
    return b"__asan_init" in text or b"__tsan_init" in text


class PortChanged(NamedTuple):
    """The arguments of the signal PortChanged."""

    port: int
    virtual: bool
    hidden: bool
    input: bool
    virtual_trig: bool
    state: bool
    activelow: bool


class PortProps(NamedTuple):
    """One entry of GetPortProps."""

    id: str
    number: int
    state: bool
    input: bool
    configurable: bool
    activelow: bool
    flags: dict[str, bool]


class Device:
    """The files are prepared first, in any order; sandbox and bus come up when first needed.

    After the test, close() demands that the daemon ended as the test says it should have, and that
    its output holds neither a sanitizer's report nor an unexpected critical message.
    """

    def __init__(
        self,
        folder: Path,
        binary: Optional[Path] = None,
        pcd_user: bool = True,
        pcd_group: bool = True,
        binds: Optional[dict[str, Path]] = None,
        tmpfs: Optional[dict[str, str]] = None,
    ):
        """`binds` shows host folders at paths of the device; `tmpfs` maps folders to their size."""
        self.folder = folder
        self.binary = binary or default_binary()
        if not self.binary.is_file():
            raise FileNotFoundError(f"no daemon at {self.binary}: build it or set PORTD_BINARY")
        self.sandbox = Sandbox(folder / "root")
        for target, source in (binds or {}).items():
            self.sandbox.bind(target, source)
        owner = f",uid={PCD_ID},gid={PCD_ID}" if is_real_root() else ""
        for target, size in (tmpfs or {}).items():
            self.sandbox.tmpfs(target, f"size={size},mode=755{owner}")
        self.bus = SystemBus(self.sandbox, [POLICY])
        self._process: Optional[subprocess.Popen] = None
        self._runs = 0
        self._allowed_criticals: list[str] = []
        # What a test adds to the daemon's environment, from its next start on.
        self.environment: dict[str, str] = {}
        self._problems: list[str] = []
        self._furnish(pcd_user, pcd_group)

    def _furnish(self, pcd_user: bool, pcd_group: bool) -> None:
        # A file of its own to mount the binary on, so that it is found wherever it was built.
        self.sandbox.bind(_BINARY, self.binary)
        self.write(_BINARY, "").chmod(0o755)
        self.sandbox.bind(_SUPPRESSIONS, REPOSITORY / "tests/tsan.supp")
        self.write(_SUPPRESSIONS, "")
        self.write("/etc/passwd", _PASSWD + (_PCD_USER if pcd_user else ""))
        self.write("/etc/group", _GROUP + (_PCD_GROUP if pcd_group else ""))
        self.write("/etc/nsswitch.conf", "passwd: files\ngroup: files\n")
        self.write("/etc/machine-id", "00000000000000000000000000000001\n")
        for path in _FOLDERS:
            folder = self.sandbox.under_root(path)
            folder.mkdir(parents=True)
            if is_real_root() and path == _PCD_FOLDER:
                os.chown(folder, PCD_ID, PCD_ID)

    # Files

    def path(self, path: str) -> Path:
        """Where the test finds the device's file `path`."""
        return self.sandbox.path(path)

    def mkdir(self, path: str) -> Path:
        target = self.path(path)
        target.mkdir(parents=True, exist_ok=True)
        return target

    def write(self, path: str, text: str) -> Path:
        """Writes a file in place, as an attribute changes: whoever has it open sees the text."""
        target = self.path(path)
        target.parent.mkdir(parents=True, exist_ok=True)
        target.write_text(text)
        return target

    def read(self, path: str) -> str:
        return self.path(path).read_text()

    def conf(self, xml: str) -> None:
        """The main hardware description."""
        self.write(CONF, xml)

    def fragment(self, name: str, xml: str) -> None:
        """One more hardware description."""
        self.write(f"{FRAGMENTS}/{name}", xml)

    def settings(self, text: str) -> None:
        """The settings file as an earlier run left it."""
        target = self.write(SETTINGS, text)
        if is_real_root():
            os.chown(target, PCD_ID, PCD_ID)

    def read_settings(self) -> str:
        return self.read(SETTINGS)

    # Life

    def start(
        self, *args: str, wait: bool = True, bus: bool = True, launcher: Sequence[str] = (),
        stdout: Optional[int] = None,
    ) -> "Device":  # fmt: skip
        """Starts the daemon and, unless told otherwise, waits until it serves calls.

        `launcher` is a command that becomes the daemon; `stdout` takes the log in place of a file.
        """
        assert self._process is None, "the daemon runs already"
        if bus:
            self.bus.start()
        self._runs += 1
        argv = [*launcher, _BINARY, *args]
        with self._output("out").open("wb") as out, self._output("err").open("wb") as err:
            output = out if stdout is None else stdout
            self._process = self.sandbox.spawn(argv, self._environment(), output, err)
        if wait:
            self.wait_up()
        return self

    def start_another(self, *args: str) -> tuple[subprocess.Popen, Path]:
        """A second instance beside the daemon, which the test has to end, and its log."""
        log = self.folder / "another.out"
        with log.open("wb") as out:
            argv = [_BINARY, *args]
            return self.sandbox.spawn(argv, self._environment(), out, subprocess.DEVNULL), log

    def _environment(self) -> dict[str, str]:
        env = {name: os.environ[name] for name in _PASSED_ON if name in os.environ}
        env.setdefault("UBSAN_OPTIONS", "print_stacktrace=1")
        # As the sandbox sees the file: the repository may lie below a folder that is covered.
        env["TSAN_OPTIONS"] = f"suppressions={_SUPPRESSIONS}"
        env["PATH"] = os.environ["PATH"]
        env["DBUS_SYSTEM_BUS_ADDRESS"] = "unix:path=/run/dbus/system_bus_socket"
        return {**env, **self.environment}

    def wait_up(self) -> None:
        """Waits until the daemon serves calls."""
        process = self._process
        assert process is not None
        wait_for(
            lambda: process.poll() is not None or self.bus.has_owner(CONTROL),
            "the daemon's bus name",
            60,
        )
        if process.poll() is not None:
            self._process = None
            status = process.returncode
            raise RuntimeError(f"portd ended early with status {status}\n{self.output()}")

    @property
    def pid(self) -> int:
        """The daemon's process id as /proc of the test knows it."""
        assert self._process is not None, "the daemon is not running"
        return self._process.pid

    @property
    def running(self) -> bool:
        return self._process is not None and self._process.poll() is None

    def send_signal(self, number: int) -> None:
        os.kill(self.pid, number)

    def wait_exit(self, timeout: float = _EXIT_DEADLINE) -> int:
        """Waits for the daemon's end, expected by the test, and gives its exit status."""
        assert self._process is not None, "the daemon is not running"
        process, self._process = self._process, None
        try:
            return process.wait(timeout * scale())
        except subprocess.TimeoutExpired:
            process.kill()
            process.wait()
            raise TimeoutError("portd does not end") from None

    def stop(self) -> None:
        """Ends the daemon the regular way, which must succeed."""
        self.send_signal(signal.SIGTERM)
        status = self.wait_exit()
        assert status == 0, f"portd ended with status {status} on SIGTERM"

    def kill(self) -> None:
        """Power cut."""
        self.send_signal(signal.SIGKILL)
        self.wait_exit()

    def restart(self, *args: str) -> "Device":
        self.stop()
        return self.start(*args)

    def close(self) -> list[str]:
        """Ends everything and tells what was wrong with the daemon's end or output."""
        problems = []
        if self._process is not None:
            early = self._process.poll()
            try:
                if early is None:
                    self.stop()
                else:
                    problems.append(f"portd ended by itself with status {early}")
            except (AssertionError, TimeoutError) as error:
                problems.append(str(error))
        self.bus.stop()
        self.sandbox.stop()
        return problems + self._complaints()

    # Output

    def _output(self, kind: str, run: Optional[int] = None) -> Path:
        return self.folder / f"portd-{self._runs if run is None else run}.{kind}"

    def log(self) -> str:
        """What the daemon's latest run wrote to standard output so far."""
        return self._output("out").read_text(errors="replace")

    def stderr(self) -> str:
        return self._output("err").read_text(errors="replace")

    def output(self) -> str:
        """Everything that every run wrote, for reports."""
        parts = []
        for run in range(1, self._runs + 1):
            for kind in ("out", "err"):
                text = self._output(kind, run).read_text(errors="replace")
                parts.append(f"--- run {run}, std{kind} ---\n{_shorten(text)}")
        return "\n".join(parts)

    def log_count(self, text: str) -> int:
        return sum(text in line for line in self.log().splitlines())

    def wait_log(self, text: str, count: int = 1, timeout: float = 10) -> None:
        wait_for(lambda: self.log_count(text) >= count, f"the log line {text!r}", timeout)

    def allow_critical(self, text: str) -> None:
        """Critical messages that hold `text` are what the test wants to see."""
        self._allowed_criticals.append(text)

    def _complaints(self) -> list[str]:
        complaints = []
        for line in self.output_lines():
            if _SANITIZER_REPORT.search(line):
                complaints.append(f"sanitizer: {line}")
            elif "CRITICAL" in line and not any(text in line for text in self._allowed_criticals):
                complaints.append(f"unexpected critical message: {line}")
        return complaints

    def output_lines(self) -> list[str]:
        lines: list[str] = []
        for run in range(1, self._runs + 1):
            for kind in ("out", "err"):
                lines += self._output(kind, run).read_text(errors="replace").splitlines()
        return lines

    # The bus

    def call(self, method: str, signature: str = "", *args: Any, timeout: float = 25) -> Any:
        """Calls a method of the control interface."""
        return self.bus.call(
            CONTROL, CONTROL_PATH, CONTROL, method, signature, *args, timeout=timeout
        )

    def begin_call(
        self, method: str, signature: str = "", *args: Any, timeout: float = 25
    ) -> Pending:
        """The same without waiting for the reply."""
        return self.bus.begin_call(
            CONTROL, CONTROL_PATH, CONTROL, method, signature, *args, timeout=timeout
        )

    def wait_name(self, name: str) -> None:
        self.bus.wait_name(name)

    def mock(self, name: str, path: Optional[str] = None, interface: Optional[str] = None) -> Mock:
        """A neighbour service; path and interface follow from the name unless given."""
        return self.bus.mock(name, path or "/" + name.replace(".", "/"), interface or name)

    def signals(
        self, member: str = "PortChanged", interface: str = CONTROL, path: str = CONTROL_PATH
    ) -> Signals:
        """Records a signal of the daemon from now on."""

        def convert(name: str, arguments: tuple) -> Any:
            return PortChanged(*arguments) if name == "PortChanged" else arguments

        return Signals(self.bus.connection, interface, member, path, convert)

    def port_props(self) -> list[PortProps]:
        """GetPortProps; the flags of each port as a dictionary, whose order is not defined."""
        number, entries = self.call("GetPortProps")
        assert number == len(entries)
        return [PortProps(*entry[:6], flags=dict(entry[6])) for entry in entries]

    # The process

    def descriptors(self) -> list[str]:
        """What the daemon's open file descriptors point to."""
        links = []
        for link in Path(f"/proc/{self.pid}/fd").iterdir():
            try:
                links.append(os.readlink(link))
            except FileNotFoundError:  # closed meanwhile
                pass
        # In a chroot the kernel names the files from outside of it.
        root = os.readlink(f"/proc/{self.pid}/root").rstrip("/")
        return [link.removeprefix(root) if link.startswith(root + "/") else link for link in links]

    def descriptors_at_rest(self) -> list[str]:
        """The same once nothing is being stored: settings are stored on a thread of their own."""

        def at_rest() -> list[str]:
            now = self.descriptors()
            return [] if any(link.startswith("/etc/") for link in now) else now

        return wait_for(at_rest, "the settings to be stored")

    def status(self, field: str) -> str:
        """One field of the kernel's view of the process, such as VmRSS or Uid."""
        text = Path(f"/proc/{self.pid}/status").read_text()
        return re.search(rf"^{field}:\s*(.*)$", text, re.MULTILINE)[1]  # type: ignore[index]

    @property
    def sanitized(self) -> bool:
        return is_sanitized(self.binary)


def _shorten(text: str, limit: int = 20000) -> str:
    half = limit // 2
    return text if len(text) <= limit else f"{text[:half]}\n[...]\n{text[-half:]}"
