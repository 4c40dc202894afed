"""The files that lead older configuration tools to the ports, and the life of the bridge."""

import os
import signal
import subprocess
from pathlib import Path

import pytest

from arrivals import Arrivals
from harness import DBusError, hwdesc, is_real_root, port, wait_for
from legacy_tool import (
    BASE,
    DISABLED,
    INPUT,
    MAPPINGS,
    REGISTRY,
    SERVICE,
    TEMPORARY,
    Tool,
    announcement,
    changes,
    count_of_ports,
    four_ports,
    golden,
    tool_fixture,
)

tool = pytest.fixture(tool_fixture)


# Announcements


def test_counts_are_announced_at_the_start(device):
    device.conf(four_ports())
    with changes(device) as announced:
        device.start()
        assert announced.wait_count(2) == announcement(2, 1)


def test_counts_are_announced_when_a_direction_changes(tool):
    with changes(tool.device) as announced:
        tool.set(2, BASE, "Direction", "input")
        tool.set(1, BASE, "Direction", "output")
        tool.set(2, BASE, "Direction", "output")
        assert announced.wait_count(2) == announcement(1, 2)


# Files


def test_files(tool):
    assert tool.device.read(REGISTRY) == golden("registry.conf")
    assert tool.device.read(MAPPINGS) == golden("mapping.xml")
    assert not tool.device.path(TEMPORARY).exists()
    for path in (REGISTRY, MAPPINGS):
        subprocess.run(["xmllint", "--noout", tool.device.path(path)], check=True)


def test_files_without_ports(device):
    device.conf(hwdesc(port("virt0", 0, kind="output", backend="virtual", flags="virtual")))
    device.start()
    assert device.read(REGISTRY) == golden("registry-no-ports.conf")
    assert device.read(MAPPINGS) == golden("mapping-no-ports.xml")


def test_files_are_written_after_the_settings_and_as_root(device):
    device.conf(four_ports())
    written = [device.path(path) for path in ("/etc/portd/portd.conf", REGISTRY, MAPPINGS)]
    with Arrivals(*(path.parent for path in written)) as arrivals:
        device.start()
        assert arrivals.take(3) == [path.name for path in written]
    for path in written[1:]:
        assert path.stat().st_uid == os.geteuid()


def test_a_count_of_no_ports_leaves_the_object_of_the_counts(device):
    device.conf(four_ports(count_of_ports(0)))
    device.start()
    tool = Tool(device)
    assert tool.get(0, BASE, "NbrOfInputs") == 2
    with pytest.raises(DBusError):
        tool.get(0, INPUT, "Name")
    with pytest.raises(DBusError):
        tool.get(1, BASE, "NbrOfInputs")


def test_old_files_are_replaced(device):
    device.write(REGISTRY, "old")
    device.write(MAPPINGS, "old")
    device.conf(four_ports())
    device.start()
    assert device.read(REGISTRY) == golden("registry.conf")
    assert device.read(MAPPINGS) == golden("mapping.xml")


def test_a_mapping_that_cannot_be_written(device):
    device.path(MAPPINGS).parent.rmdir()
    device.conf(four_ports())
    device.start()
    device.wait_log("Couldn't write to legacy mappings")
    assert device.read(REGISTRY) == golden("registry.conf")
    assert not device.path(TEMPORARY).exists()


def test_a_device_without_the_folders_is_silent(device):
    for path in (REGISTRY, MAPPINGS):
        device.path(path).parent.rmdir()
    device.conf(four_ports())
    device.start()
    device.call("RefreshIOPorts")
    assert "Couldn't write" not in device.output()
    assert not device.path(TEMPORARY).exists()


@pytest.mark.parametrize("path", [REGISTRY, MAPPINGS])
def test_a_folder_on_a_mount_of_its_own(make_device, path):
    device = make_device(tmpfs={str(Path(path).parent): "64k"})
    device.conf(four_ports())
    device.start()
    assert device.read(REGISTRY) == golden("registry.conf")
    assert device.read(MAPPINGS) == golden("mapping.xml")
    assert not device.path(TEMPORARY).exists()


def test_a_mapping_without_room_leaves_the_new_registry(make_device):
    device = make_device(tmpfs={str(Path(MAPPINGS).parent): "4k"})
    device.write(REGISTRY, "old")
    device.write(f"{MAPPINGS}.more", "x" * 4096)
    device.conf(four_ports())
    device.start()
    device.wait_log("Couldn't write to legacy mappings")
    assert device.read(REGISTRY) == golden("registry.conf")
    assert not device.path(MAPPINGS).exists()


@pytest.mark.parametrize("left_over", [TEMPORARY, f"{TEMPORARY}.XB3F0A"])
def test_what_a_power_failure_left_over_is_no_hardware_description(device, left_over):
    device.conf(four_ports())
    device.write(left_over, "<mapping><group")
    for number in range(4, 8):
        device.fragment(f"{number}.xml", hwdesc(port(f"more{number}", number)))
    device.start()
    assert sorted(props.number for props in device.port_props()) == list(range(8))
    assert not device.path(left_over).exists()


def test_other_fragments_with_a_name_like_it_stay(device):
    device.conf(four_ports())
    device.fragment("legacy.tmp.xml", hwdesc(port("more", 4)))
    device.start()
    assert len(device.port_props()) == 5


def test_no_room_for_the_temporary_file(device):
    device.path("/etc/portd.d").rmdir()
    device.write(REGISTRY, "old")
    device.conf(four_ports())
    device.start()
    device.wait_log("Couldn't write to service registry")
    device.wait_log("Couldn't write to legacy mappings")
    assert device.read(REGISTRY) == "old"


# Dropped and refreshed ports


def optional_port(fragment: str = "") -> str:
    return port("opt", 2, kind="io_ctrl", optional=True, device={"setup": fragment or "ok"})


def give_folders_to_pcd(device) -> None:
    for path in (REGISTRY, MAPPINGS):
        os.chown(device.path(path).parent, 990, 990)


def test_drop_and_refresh_renew_objects_and_files(device):
    device.conf(hwdesc(port("in0", 0), port("out1", 1, kind="output"), optional_port()))
    if is_real_root():
        give_folders_to_pcd(device)
    device.start()
    tool = Tool(device)
    full = device.read(REGISTRY), device.read(MAPPINGS)
    assert full == (golden("registry.conf"), golden("mapping.xml"))
    with changes(device) as announced:
        assert device.call("DropIOPorts", "as", ["opt"]) == ["opt"]
        assert tool.numbers() == [0, 1]
        assert announced.wait_count(2) == announcement(1, 1)
        for path in (REGISTRY, MAPPINGS):
            wait_for(lambda: "IOPort/2" not in device.read(path), f"port 2 to leave {path}")
        announced.take()
        device.call("RefreshIOPorts")
        assert tool.numbers() == [0, 1, 2]
        assert announced.wait_count(2) == announcement(2, 1)
    wait_for(lambda: (device.read(REGISTRY), device.read(MAPPINGS)) == full, "the port's return")
    assert device.bus.has_owner(SERVICE)


def test_files_that_would_not_change_are_left_alone(device):
    virtual = port("virt", 1, kind="output", backend="virtual", flags="virtual", optional=True)
    device.conf(hwdesc(port("in0", 0), virtual))
    if is_real_root():
        give_folders_to_pcd(device)
    device.start()
    before = [device.path(path).stat().st_ino for path in (REGISTRY, MAPPINGS)]
    assert device.call("DropIOPorts", "as", ["virt"]) == ["virt"]
    # The same thread stores what is asked of it later.
    device.call("SetName", "ubs", 0, True, "Marker")
    wait_for(lambda: "input_name=Marker\n" in device.read_settings(), "the later save")
    assert [device.path(path).stat().st_ino for path in (REGISTRY, MAPPINGS)] == before


def test_nothing_is_renewed_without_a_change(device):
    device.conf(hwdesc(port("in0", 0), port("opt", 1, optional=True)))
    device.start()
    before = device.path(REGISTRY).stat().st_ino
    with changes(device) as announced:
        assert device.call("DropIOPorts", "as", ["in0", "unknown"]) == []
        device.call("RefreshIOPorts")
        assert announced.received == []
    assert device.path(REGISTRY).stat().st_ino == before


def test_folders_that_the_account_may_not_write(device):
    device.conf(hwdesc(port("in0", 0), port("opt", 1, optional=True)))
    device.start()
    if not is_real_root():
        # The daemon is still the one user who may write everything.
        for path in (REGISTRY, MAPPINGS):
            device.sandbox.make_read_only(str(Path(path).parent))
    before = device.read(REGISTRY), device.read(MAPPINGS)
    assert device.call("DropIOPorts", "as", ["opt"]) == ["opt"]
    device.wait_log("Couldn't write to service registry")
    device.wait_log("Couldn't write to legacy mappings")
    assert (device.read(REGISTRY), device.read(MAPPINGS)) == before
    assert Tool(device).numbers() == [0]
    assert not device.path(TEMPORARY).exists()


# The switch


def test_switched_off(device):
    device.conf(hwdesc(port("in0", 0), port("opt", 1, optional=True)))
    device.start(DISABLED)
    assert not device.bus.has_owner(SERVICE)
    assert device.call("DropIOPorts", "as", ["opt"]) == ["opt"]
    device.call("RefreshIOPorts")
    assert not device.bus.has_owner(SERVICE)
    assert not device.path(REGISTRY).exists() and not device.path(MAPPINGS).exists()
    device.stop()


@pytest.mark.parametrize("arguments", [("x", DISABLED), (DISABLED + "x",), ("--verbose",), ("",)])
def test_other_arguments_leave_it_on(device, arguments):
    device.conf(four_ports())
    device.start(*arguments)
    assert Tool(device).numbers() == [0, 1, 2, 3]
    assert device.path(REGISTRY).exists()


# Failures that end the daemon


def ends_with(device, message: str) -> None:
    device.start(wait=False)
    status = device.wait_exit()
    assert status in (-signal.SIGTRAP, -signal.SIGABRT), status
    assert device.log_count(f"ERROR: portd: {message}") == 1


def test_no_bus(device):
    device.conf(four_ports())
    device.bus.start()
    device.bus.kill()
    ends_with(device, "Failed to connect to system bus: ")


def test_name_refused(device):
    device.conf(four_ports())
    device.bus.start()
    policy = device.path("/etc/dbus-1/system.d/com.kelv.portd.conf")
    allowed = policy.read_text()
    policy.write_text(allowed.replace(f'<allow own="{SERVICE}"/>', ""))
    device.bus.bus_call("ReloadConfig")
    ends_with(device, "Could not request name: ")
    policy.write_text(allowed)
    device.bus.bus_call("ReloadConfig")
    device.start()
    assert Tool(device).numbers() == [0, 1, 2, 3]


def test_no_bus_does_not_matter_when_switched_off(device):
    device.allow_critical("No interface is served until there is a system bus")
    device.conf(four_ports())
    device.bus.start()
    device.bus.kill()
    device.start(DISABLED, wait=False)
    wait_for(device.path("/etc/portd/portd.conf").exists, "the stored settings")
    device.stop()
