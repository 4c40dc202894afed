"""From the command line to the bus names, and back down."""

import os
import signal

import pytest

from harness import hwdesc, is_real_root, port, wait_for
from harness.device import PCD_ID

EXPORT = "/tmp/portd_ioport.conf"
EARLIER = "/etc/dynamic/portd/params.conf"
MAPPINGS = (
    "/etc/service_registry/services.d/portd_service_registry.conf",
    "/etc/legacyconfig/legacymappings.d/portd.xml",
)
CONTROL = "com.kelv.IOControl.State"
CONNECTOR = "com.kelv.PCD.Connector"
SUPERVISED = "com.kelv.IOSupervised.Supervised"
LEGACY = "com.kelv.Configuration.Legacy.IOControl1.IOPort"
NAMES = (CONTROL, CONNECTOR, SUPERVISED, LEGACY)
DISABLED = "--disable_legacy_interface"
# Where only one user id exists, that is the one which the service account would have.
ACCOUNT = PCD_ID if is_real_root() else os.geteuid()
DOOR = hwdesc(port("door", 0, names={"input": "Door"}))


@pytest.fixture
def door(device):
    """A device with one input."""
    device.conf(DOOR)
    return device


def start_whole(door) -> None:
    """Returns when the daemon has its names and knows it: the answer comes after those of the bus."""
    door.start()
    for name in NAMES:
        door.wait_name(name)
    door.call("GetNbrPorts")


def test_owns_its_names_while_it_runs(door):
    start_whole(door)
    door.stop()
    wait_for(lambda: not any(door.bus.has_owner(name) for name in NAMES), "release of the names")


def name_changes(device):
    return device.signals("NameOwnerChanged", "org.freedesktop.DBus", "/org/freedesktop/DBus")


def test_gives_its_names_up_from_the_newest_interface_to_the_oldest(door):
    start_whole(door)
    with name_changes(door) as changes:
        door.stop()
        changes.wait_count(5)
    lost = [name for name, _old, new in changes.received if not new and not name.startswith(":")]
    assert lost == [LEGACY, SUPERVISED, CONTROL, CONNECTOR]


def test_takes_its_names_as_the_service_account(door):
    start_whole(door)
    for name in NAMES:
        assert door.bus.bus_call("GetConnectionUnixUser", "s", name) == ACCOUNT, name


def test_sighup_is_one_line_and_nothing_else(door):
    door.start()
    before = (door.read_settings(), door.port_props())
    door.send_signal(signal.SIGHUP)
    door.wait_log("Got SIGHUP")
    assert (door.read_settings(), door.port_props()) == before
    assert door.log_count("Got SIGHUP") == 1
    assert "INFO" in next(line for line in door.log().splitlines() if "Got SIGHUP" in line)


def test_sigterm_ends_with_status_0(door):
    door.start()
    before = door.read_settings()
    door.send_signal(signal.SIGTERM)
    assert door.wait_exit() == 0
    assert door.log_count("Got SIGTERM") == 1
    assert door.read_settings() == before


def test_sigterm_while_calls_are_pending(door):
    door.start()
    for number in range(200):
        door.begin_call("SetName", "ubs", 0, True, f"Name {number}")
    door.send_signal(signal.SIGTERM)
    assert door.wait_exit() == 0


def test_becomes_the_service_account(door):
    door.start()
    if is_real_root():
        assert door.status("Uid").split() == [str(PCD_ID)] * 4
        assert door.status("Gid").split() == [str(PCD_ID)] * 4
        assert door.status("Groups").split() == [str(PCD_ID)]
        assert door.stderr() == ""
    else:
        # The only user id that exists here is our own.
        assert door.stderr().count("\n") == 1 and "Failed setting gid to" in door.stderr()


def test_without_the_user_it_runs_on_as_root(make_device):
    device = make_device(pcd_user=False)
    device.conf(DOOR)
    device.settings("")
    device.start()
    assert device.stderr() == 'Couldn\'t get uid for user "pcd".\n'
    assert device.log_count("Failed to get uid") == 1
    assert device.status("Uid").split() == ["0"] * 4
    device.call("SetName", "ubs", 0, True, "Front door")
    wait_for(lambda: "Front door" in device.read_settings(), "the save")


def test_without_the_group_it_runs_on_as_root(make_device):
    device = make_device(pcd_group=False)
    device.conf(DOOR)
    device.settings("")
    before = device.path("/etc/portd/portd.conf").stat()
    device.start()
    assert device.stderr() == 'Couldn\'t get gid for group "pcd".\n'
    assert device.log_count("Failed to get gid") == 1
    assert device.status("Uid").split() == ["0"] * 4
    after = device.path("/etc/portd/portd.conf").stat()
    assert (after.st_uid, after.st_gid) == (before.st_uid, before.st_gid)


def test_the_settings_file_goes_to_the_service_account(door):
    target = door.write("/etc/portd/portd.conf", "[door]\ninput_name=Gate\n")
    door.start()
    assert (target.stat().st_uid, target.stat().st_gid) == (ACCOUNT, ACCOUNT)
    door.call("SetName", "ubs", 0, True, "Front door")
    wait_for(lambda: "Front door" in door.read_settings(), "the save")
    assert (target.stat().st_uid, target.stat().st_gid) == (ACCOUNT, ACCOUNT)


def test_a_settings_file_that_it_made_can_be_saved_to(door):
    door.start()
    made = door.path("/etc/portd/portd.conf").stat()
    assert (made.st_uid, made.st_gid) == (ACCOUNT, ACCOUNT)
    door.call("SetName", "ubs", 0, True, "Front door")
    wait_for(lambda: "Front door" in door.read_settings(), "the save")
    door.restart()
    assert door.call("GetNames", "u", 0) == ("Front door", "")


@pytest.mark.parametrize("text", ["no group\n", "[door\ninput_name=x\n", "[door]\nno value\n"])
def test_a_malformed_settings_file_ends_it_with_status_1(door, text):
    door.settings(text)
    with name_changes(door) as names:
        door.start(wait=False)
        assert door.wait_exit() == 1
        # A name that was owned for an instant would show before this one.
        marker = door.mock("com.kelv.Marker")
        names.wait(lambda change: change[0] == marker.name)
        owned = {name for name, _old, _new in names.received if name.startswith("com.kelv.")}
    assert owned == {marker.name}
    assert door.log_count("Could not read configuration file") == 1
    assert "Could not read key file: " in door.stderr()
    assert door.read_settings() == text


def test_settings_that_cannot_be_read_end_it_before_it_changes_anything(make_device):
    device = make_device(pcd_user=False)
    device.conf(DOOR)
    device.settings("no group\n")
    device.start(wait=False)
    assert device.wait_exit() == 1
    assert not any(device.path(mapping).exists() for mapping in MAPPINGS)
    # Without the account, a privilege drop would not have stayed unsaid.
    assert device.stderr().startswith("Could not read key file: ")
    assert device.stderr().count("\n") == 1


def test_a_directory_as_settings_file_ends_it_with_status_1(door):
    door.mkdir("/etc/portd/portd.conf")
    door.start(wait=False)
    assert door.wait_exit() == 1
    assert door.log_count("Could not read configuration file") == 1
    assert not door.bus.has_owner("com.kelv.IOControl.State")


@pytest.mark.parametrize(
    "arguments, legacy",
    [
        ((), True),
        ((DISABLED,), False),
        ((DISABLED, "-v"), False),
        (("-v", DISABLED), True),
        (("--help",), True),
    ],
)
def test_only_the_first_argument_can_switch_the_legacy_interface_off(door, arguments, legacy):
    door.start(*arguments)
    assert door.call("GetNbrPorts") == (1, 0)
    # Its name comes before the one that the start was awaited by.
    assert door.bus.has_owner(LEGACY) == legacy
    door.stop()
    assert [door.path(mapping).exists() for mapping in MAPPINGS] == [legacy, legacy]


def test_earlier_settings_are_merged_once(door):
    door.write(EXPORT, "")
    door.write(EARLIER, "[door]\ninput_name=Old name\ninput_activelow=true\n")
    door.start()
    assert door.call("GetNames", "u", 0) == ("Old name", "")
    assert door.call("GetActive", "u", 0)[0] == "open"
    assert not door.path(EARLIER).exists()
    assert "Old name" in door.read_settings()


def test_the_settings_file_wins_over_earlier_settings(door):
    door.write(EXPORT, "")
    door.write(EARLIER, "[door]\ninput_name=Old name\ninput_activelow=true\n")
    door.settings("[door]\ninput_name=New name\ninput_activelow=false\n")
    door.start()
    assert door.call("GetNames", "u", 0) == ("New name", "")
    assert not door.path(EARLIER).exists()


def test_earlier_settings_stay_without_the_export(door):
    door.write(EARLIER, "[door]\ninput_name=Old name\ninput_activelow=true\n")
    door.start()
    assert door.call("GetNames", "u", 0) == ("Door", "")
    assert door.path(EARLIER).exists()


@pytest.mark.parametrize("make", [os.mkdir, os.mkfifo])
def test_an_export_that_is_no_file_does_not_count(door, make):
    make(door.path(EXPORT))
    door.write(EARLIER, "[door]\ninput_name=Old name\ninput_activelow=true\n")
    door.start()
    assert door.call("GetNames", "u", 0) == ("Door", "")
    assert door.path(EARLIER).exists() and not door.path(EXPORT).is_file()


def test_unreadable_earlier_settings_are_left_alone(door):
    door.write(EXPORT, "")
    door.write(EARLIER, "not a key file")
    door.start()
    assert door.call("GetNames", "u", 0) == ("Door", "")
    assert door.read(EARLIER) == "not a key file"


def test_the_bus_going_away_is_a_regular_end(door):
    start_whole(door)
    door.bus.kill()
    assert door.wait_exit() == 0
    assert door.log_count("WARNING: portd: Could not release DBus name: ") == 1
