"""Fixtures of the package tier: the packages that were built, and clean machines to install them on."""

import os
import shutil
from pathlib import Path
from typing import Optional

import pytest

from machine import CannotBoot, Machine, Root

# Three ports without special hardware: a polled file, an output, a virtual port.
DESCRIPTION = """\
<ports>
  <port name="door"><port_type type="input"/><port_no nbr="0"/><properties ioport="true"/>
    <backend name="sysfs"><device path="/var/lib/door" timeout="50"/></backend></port>
  <port name="relay"><port_type type="output"/><port_no nbr="1"/><properties ioport="true"/>
    <backend name="check"/></port>
  <port name="alarm"><port_type type="output"/><port_no nbr="2"/>
    <properties ioport="true" virtual="true"/><backend name="virtual"/></port>
</ports>
"""

_FOLDER = Path(os.environ["PORTD_PACKAGE_FOLDER"])
# What runs where the machine boots, and what runs where it can't.
_BOOTED, _NOT_BOOTED = "test_booted.py", "test_unbooted.py"


class _Session:
    root: Root
    machine: Machine
    reason = ""


def pytest_configure() -> None:
    folder = _FOLDER / "machine"
    shutil.rmtree(folder, ignore_errors=True)
    _Session.root = Root(folder / "root", _FOLDER / "debian" / "root.tar")
    _Session.root.write("/usr/share/portd/conf.xml", DESCRIPTION)
    _Session.root.write("/var/lib/door", "0\n")
    _Session.machine = Machine(_Session.root)
    try:
        _Session.machine.boot()
    except CannotBoot as reason:
        _Session.reason = str(reason)


def pytest_unconfigure() -> None:
    _Session.machine.close()
    _Session.root.close()


def pytest_terminal_summary(terminalreporter) -> None:
    if not _Session.reason:
        return
    terminalreporter.write_line(
        f"THIS COMPUTER CAN'T BOOT A CONTAINER: {_Session.reason}\n"
        f"Instead of {_BOOTED}, which needs a service manager, {_NOT_BOOTED} ran.",
        red=True,
    )


def pytest_ignore_collect(collection_path: Path) -> Optional[bool]:
    left_out = _BOOTED if _Session.reason else _NOT_BOOTED
    return True if collection_path.name == left_out else None


@pytest.fixture(scope="session")
def packages() -> dict[str, Path]:
    """The packages by name, without those of debugging symbols."""
    files = (_FOLDER / "packages").glob("*.deb")
    return {file.name.split("_")[0]: file for file in files if "dbgsym" not in file.name}


@pytest.fixture(scope="session")
def root() -> Root:
    return _Session.root


@pytest.fixture(scope="session")
def machine() -> Machine:
    return _Session.machine
