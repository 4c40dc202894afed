"""What several test files need of the control interface beyond single calls."""

import itertools
from typing import Any, Iterable

import pytest

from harness import DBusError, Device

ERROR = "com.kelv.IOControl.Error."

# Method, in signature, out signature, in the order that clients see in the introspection data.
METHODS = [
    ("DropIOPorts", "as", "as"),
    ("RefreshIOPorts", "", ""),
    ("GetNbrPorts", "", "uu"),
    ("GetPortProps", "", "ia(sibbbba(sb))"),
    ("SetState", "ub", ""),
    ("GetState", "u", "b"),
    ("IsConfigurable", "u", "b"),
    ("GetDirection", "u", "s"),
    ("SetDirection", "us", ""),
    ("GetActive", "u", "ss"),
    ("SetActive", "ubs", ""),
    ("StartActionSequence", "uba(bi)", ""),
    ("GetNames", "u", "ss"),
    ("SetName", "ubs", ""),
    ("SetVirtual", "ub", ""),
]

# Numbers that no sensible client sends: beyond the signed range, at its ends, and -1 as unsigned.
ODD_NUMBERS = (0, 1, 6, 7, 999, 2**31 - 1, 2**31, 2**31 + 1, 2**32 - 2, 2**32 - 1)


def expect_error(
    device: Device, name: str, message: str, method: str, signature: str = "", *args: Any
) -> None:
    """The call is answered with exactly this error."""
    with pytest.raises(DBusError) as caught:
        device.call(method, signature, *args)
    assert (caught.value.name, caught.value.message) == (ERROR + name, message)


def expect_no_port(device: Device, method: str, signature: str, *args: Any) -> None:
    expect_error(device, "No_port", "No such port.", method, signature, *args)


def numbered_calls(number: int) -> list[tuple]:
    """Every method that takes a port number, with good and bad further arguments."""
    return [
        ("GetState", "u", number),
        ("SetState", "ub", number, True),
        ("SetState", "ub", number, False),
        ("IsConfigurable", "u", number),
        ("GetDirection", "u", number),
        ("SetDirection", "us", number, "output"),
        ("SetDirection", "us", number, "input"),
        ("SetDirection", "us", number, "sideways"),
        ("GetActive", "u", number),
        ("SetActive", "ubs", number, True, "open"),
        ("SetActive", "ubs", number, False, "open"),
        ("SetActive", "ubs", number, True, "closed"),
        ("SetActive", "ubs", number, False, "ajar"),
        ("GetNames", "u", number),
        ("SetName", "ubs", number, True, "some input"),
        ("SetName", "ubs", number, False, "some output"),
        ("SetVirtual", "ub", number, True),
        ("SetVirtual", "ub", number, False),
        ("StartActionSequence", "uba(bi)", number, False, []),
    ]


def call_everything(device: Device, numbers: Iterable[int] = ODD_NUMBERS) -> None:
    """Every method for every number: each is answered, errors are the interface's own."""
    plain = [("GetNbrPorts",), ("GetPortProps",), ("DropIOPorts", "as", ["nobody", ""])]
    calls = itertools.chain(plain, *(numbered_calls(number) for number in numbers))
    for call in [*calls, ("RefreshIOPorts",)]:
        try:
            device.call(*call)
        except DBusError as error:
            assert error.name.startswith(ERROR), f"{call}: {error}"
    assert device.running
