"""The device's private system bus: its daemon, a client's view of it, and mocked neighbours."""

import os
import signal
import subprocess
from pathlib import Path
from typing import Any, Callable, Optional

from gi.repository import Gio, GLib

from .sandbox import Sandbox
from .waiting import scale, wait_for

SOCKET = "/run/dbus/system_bus_socket"
_POLICY_FOLDER = "/etc/dbus-1/system.d"
_PYTHON = "/usr/bin/python3"

# The rules of a stock system bus: owning a name and calling a service need a policy that allows it.
# Only the limit on calls that wait for their reply is raised: one client can stand for many.
_CONFIG = f"""<!DOCTYPE busconfig PUBLIC "-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN"
 "http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd">
<busconfig>
  <type>system</type>
  <listen>unix:path={SOCKET}</listen>
  <auth>EXTERNAL</auth>
  <limit name="max_replies_per_connection">50000</limit>
  <policy context="default">
    <allow user="*"/>
    <deny own="*"/>
    <deny send_type="method_call"/>
    <allow send_type="signal"/>
    <allow send_requested_reply="true" send_type="method_return"/>
    <allow send_requested_reply="true" send_type="error"/>
    <allow receive_type="method_call"/>
    <allow receive_type="method_return"/>
    <allow receive_type="error"/>
    <allow receive_type="signal"/>
    <allow send_destination="org.freedesktop.DBus"/>
  </policy>
  <includedir>{_POLICY_FOLDER}</includedir>
</busconfig>
"""

_MOCK_POLICY = """<busconfig>
  <policy user="root"><allow own="{name}"/></policy>
  <policy context="default"><allow send_destination="{name}"/></policy>
</busconfig>
"""


class DBusError(Exception):
    """An error reply: its D-Bus error name and its message."""

    def __init__(self, error: GLib.Error):
        self.name: str = Gio.DBusError.get_remote_error(error) or "local"
        self.message: str = error.message.removeprefix(f"GDBus.Error:{self.name}: ")
        super().__init__(f"{self.name}: {self.message}")


def _unwrap(reply: GLib.Variant) -> Any:
    """Nothing, the one value, or the tuple of values that a method returned."""
    values = reply.unpack()
    if len(values) == 0:
        return None
    return values[0] if len(values) == 1 else values


class Pending:
    """A call whose reply is yet to come."""

    def __init__(self) -> None:
        self._reply: Optional[Any] = None
        self._error: Optional[GLib.Error] = None
        self.done = False

    def finish(self, connection: Gio.DBusConnection, result: Gio.AsyncResult) -> None:
        try:
            self._reply = connection.call_finish(result)
        except GLib.Error as error:
            self._error = error
        self.done = True

    def result(self, timeout: float = 10) -> Any:
        wait_for(lambda: self.done, "the reply of a call", timeout)
        if self._error is not None:
            raise DBusError(self._error)
        return _unwrap(self._reply)


class Signals:
    """Records one signal from the moment it is made, in the order of arrival."""

    def __init__(
        self,
        connection: Gio.DBusConnection,
        interface: str,
        member: Optional[str],
        path: Optional[str],
        convert: Callable[[str, tuple], Any],
    ):
        self.received: list[Any] = []
        self._connection = connection
        self._convert = convert
        self._id = connection.signal_subscribe(
            None, interface, member, path, None, Gio.DBusSignalFlags.NONE, self._on_signal
        )
        # The bus has served the subscription once it answers a later call of the same connection.
        connection.call_sync(
            "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus", "GetId",
            None, None, Gio.DBusCallFlags.NONE, -1, None,
        )  # fmt: skip

    def _on_signal(self, _connection, _sender, _path, _interface, member, arguments) -> None:
        self.received.append(self._convert(member, arguments.unpack()))

    def wait(self, matches: Callable[[Any], bool] = lambda _: True, timeout: float = 10) -> Any:
        """The first recorded signal that matches, which stays recorded."""
        wait_for(
            lambda: any(matches(signal) for signal in self.received),
            f"a signal; got only {self.received}",
            timeout,
        )
        return next(signal for signal in self.received if matches(signal))

    def wait_count(self, count: int, timeout: float = 10) -> list[Any]:
        wait_for(lambda: len(self.received) >= count, f"{count} signals", timeout)
        return self.received

    def take(self) -> list[Any]:
        """Everything recorded so far, which is then forgotten."""
        taken, self.received = self.received, []
        return taken

    def close(self) -> None:
        self._connection.signal_unsubscribe(self._id)

    def __enter__(self) -> "Signals":
        return self

    def __exit__(self, *_exception) -> None:
        self.close()


class Mock:
    """A neighbour service played by python-dbusmock in a process of its own."""

    def __init__(self, bus: "SystemBus", name: str, path: str, interface: str, log: Path):
        self.name, self.path, self.interface = name, path, interface
        self._bus = bus
        env = dict(os.environ, DBUS_SYSTEM_BUS_ADDRESS=bus.address)
        with log.open("wb") as output:
            self._process = subprocess.Popen(
                [_PYTHON, "-m", "dbusmock", "--system", name, path, interface],
                stdin=subprocess.DEVNULL, stdout=output, stderr=output, env=env,
                start_new_session=True,
            )  # fmt: skip
        bus.wait_name(name)

    def _control(self, method: str, signature: str, *args: Any) -> Any:
        return self._bus.call(
            self.name, self.path, "org.freedesktop.DBus.Mock", method, signature, *args
        )

    def method(self, name: str, in_signature: str, out_signature: str, code: str) -> "Mock":
        """Adds a method; `code` is Python that sees `args` and sets `ret`."""
        self._control("AddMethod", "sssss", self.interface, name, in_signature, out_signature, code)
        return self

    def add_object(
        self, path: str, interface: str, properties: dict[str, GLib.Variant],
        methods: list[tuple[str, str, str, str]],
    ) -> "Mock":  # fmt: skip
        """Adds one more object; methods are (name, in signature, out signature, code)."""
        self._control("AddObject", "ssa{sv}a(ssss)", path, interface, properties, methods)
        return self

    def emit(self, name: str, signature: str, *arguments: GLib.Variant) -> None:
        self._control("EmitSignal", "sssav", self.interface, name, signature, list(arguments))

    def calls(self, method: str) -> list[tuple]:
        """The arguments of every call of a method so far."""
        return [args for _time, args in self._control("GetMethodCalls", "s", method)]

    def stop(self) -> None:
        self._process.terminate()
        self._process.wait()


class SystemBus:
    """The bus daemon inside a sandbox, and one client connection to it from outside."""

    def __init__(self, sandbox: Sandbox, policies: list[Path]):
        self._sandbox = sandbox
        self._policies = policies
        self._config = _CONFIG
        self._process: Optional[subprocess.Popen] = None
        self._connection: Optional[Gio.DBusConnection] = None
        self._mocks: list[Mock] = []

    @property
    def address(self) -> str:
        """The bus as seen from outside of the sandbox. The detour keeps the socket's path short."""
        return f"unix:path=/proc/{self._sandbox.pid}/root{SOCKET}"

    def _write(self, path: str, text: str) -> None:
        target = self._sandbox.under_root(path)
        target.parent.mkdir(parents=True, exist_ok=True)
        target.write_text(text)

    def use_config(self, text: str) -> None:
        """Rules in place of the harness's own; to be called before the bus starts."""
        assert self._process is None, "the bus runs already"
        self._config = text

    def start(self) -> None:
        if self._process is not None:
            return
        self._write("/etc/dbus-1/bus.conf", self._config)
        for policy in self._policies:
            self._write(f"{_POLICY_FOLDER}/{policy.name}", policy.read_text())
        self._sandbox.under_root(SOCKET).parent.mkdir(parents=True, exist_ok=True)
        with self._sandbox.under_root("/run/bus.log").open("wb") as log:
            self._process = self._sandbox.spawn(
                ["dbus-daemon", "--nofork", "--nopidfile", "--nosyslog",
                 "--config-file=/etc/dbus-1/bus.conf", "--print-address"],
                {"PATH": os.environ["PATH"]}, subprocess.PIPE, log,
            )  # fmt: skip
        assert self._process.stdout is not None
        if not self._process.stdout.readline():
            log_text = self._sandbox.under_root("/run/bus.log").read_text()
            raise RuntimeError(f"the bus daemon does not start: {log_text}")

    def connect(self) -> Gio.DBusConnection:
        """A new connection of its own, for what must not share the common one."""
        flags = (
            Gio.DBusConnectionFlags.AUTHENTICATION_CLIENT
            | Gio.DBusConnectionFlags.MESSAGE_BUS_CONNECTION
        )
        connection = Gio.DBusConnection.new_for_address_sync(self.address, flags, None, None)
        connection.set_exit_on_close(False)
        return connection

    @property
    def connection(self) -> Gio.DBusConnection:
        self.start()
        if self._connection is None:
            self._connection = self.connect()
        return self._connection

    def begin_call(
        self, name: str, path: str, interface: str, method: str, signature: str = "", *args: Any,
        timeout: float = 25,
    ) -> Pending:  # fmt: skip
        pending = Pending()
        self.connection.call(
            name, path, interface, method, GLib.Variant(f"({signature})", args), None,
            Gio.DBusCallFlags.NO_AUTO_START, int(timeout * scale() * 1000), None, pending.finish,
        )  # fmt: skip
        return pending

    def call(
        self, name: str, path: str, interface: str, method: str, signature: str = "", *args: Any,
        timeout: float = 25,
    ) -> Any:  # fmt: skip
        """Calls a method and returns its unpacked reply; an error reply raises DBusError."""
        try:
            reply = self.connection.call_sync(
                name, path, interface, method, GLib.Variant(f"({signature})", args), None,
                Gio.DBusCallFlags.NO_AUTO_START, int(timeout * scale() * 1000), None,
            )  # fmt: skip
        except GLib.Error as error:
            raise DBusError(error) from None
        return _unwrap(reply)

    def bus_call(self, method: str, signature: str = "", *args: Any) -> Any:
        """Calls the bus itself."""
        name = "org.freedesktop.DBus"
        return self.call(name, "/org/freedesktop/DBus", name, method, signature, *args)

    def has_owner(self, name: str) -> bool:
        return self.bus_call("NameHasOwner", "s", name)

    def wait_name(self, name: str, timeout: float = 10) -> None:
        wait_for(lambda: self.has_owner(name), f"the bus name {name}", timeout)

    def mock(self, name: str, path: str, interface: str) -> Mock:
        """Starts a neighbour, which the bus is told to let own its name."""
        self.start()
        self._write(f"{_POLICY_FOLDER}/mock-{name}.conf", _MOCK_POLICY.format(name=name))
        self.bus_call("ReloadConfig")
        log = self._sandbox.root / f"mock-{name}.log"
        self._mocks.append(Mock(self, name, path, interface, log))
        return self._mocks[-1]

    def pause(self) -> None:
        """The bus takes nothing and answers nothing, until it is resumed or stopped."""
        assert self._process is not None
        self._process.send_signal(signal.SIGSTOP)

    def resume(self) -> None:
        assert self._process is not None
        self._process.send_signal(signal.SIGCONT)

    def kill(self) -> None:
        """The bus goes away under its clients."""
        assert self._process is not None
        self._process.kill()
        self._process.wait()

    def stop(self) -> None:
        for mock in self._mocks:
            mock.stop()
        self._mocks.clear()
        if self._process is not None:
            self.resume()
        if self._connection is not None and not self._connection.is_closed():
            self._connection.close_sync(None)
        self._connection = None
        if self._process is not None:
            self.kill()
            assert self._process.stdout is not None
            self._process.stdout.close()
            self._process = None
