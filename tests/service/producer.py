"""The daemon's event producer, as any service sees it on the bus."""

from typing import Any

from harness import DBusError, Device, Signals, wait_for

PATH = "/com/kelv/Event/pcd"
INTERFACE = "com.kelv.Event.Producer"
SUPERVISED = "com.kelv.Event.Pcd.SupervisedPort"


class Producer:
    """The daemon's event producer, looked at from a neighbour service."""

    def __init__(self, device: Device):
        """Returns when the producer has said what it has to say of the start."""
        self._device = device
        self.declarations()

    def declarations(self) -> dict[int, dict[str, Any]]:
        (declared,) = wait_for(self._list, "the producer's object")
        return dict(declared)

    def _list(self) -> tuple | None:
        """None as long as the object is not there, which comes soon after the daemon's name."""
        try:
            return (self._device.bus.call("com.kelv.IOControl.State", PATH, INTERFACE, "List"),)
        except DBusError as error:
            if error.name != "org.freedesktop.DBus.Error.UnknownMethod":
                raise
            return None

    def signals(self, member: str) -> Signals:
        return self._device.signals(member, interface=INTERFACE, path=PATH)

    def ids(self, kind: str, **keys: Any) -> list[int]:
        """Declarations of a type ("" for the built-in ones) that hold the given key values."""
        return [
            number
            for number, entry in self.declarations().items()
            if entry["type"] == kind and keys.items() <= entry["keys"].items()
        ]

    def only(self, kind: str, **keys: Any) -> dict[str, Any]:
        (number,) = self.ids(kind, **keys)
        return self.declarations()[number]
