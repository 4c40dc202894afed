"""A whole device around the unmodified daemon: its own files, system bus and neighbours.

Nothing outside the device's folder is touched, and everything that runs ends with the harness, even
when the harness itself is killed.
"""

from .bus import DBusError, Mock, Pending, Signals, SystemBus
from .device import Device, PortChanged, PortProps, default_binary
from .documents import hwdesc, port
from .sandbox import NoMounts, Sandbox, become_root, is_real_root
from .waiting import scale, wait_for

__all__ = [
    "DBusError",
    "Device",
    "Mock",
    "NoMounts",
    "Pending",
    "PortChanged",
    "PortProps",
    "Sandbox",
    "Signals",
    "SystemBus",
    "become_root",
    "default_binary",
    "hwdesc",
    "is_real_root",
    "port",
    "scale",
    "wait_for",
]
