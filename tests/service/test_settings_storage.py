"""What a save costs storage, and what storage that is slow, hangs or fails may cost others."""

import os
import stat
import time
from typing import Iterator

import pytest

from harness import Device, hwdesc, is_real_root, port, wait_for
from harness.device import PCD_ID, SETTINGS
from harness.waiting import scale
from storage import Storage

IN, OUT, OTHER = range(3)
DOCUMENT = hwdesc(port("in", IN), port("out", OUT, "output"), port("other", OTHER, "output"))
FOLDER = "/etc/portd"
UNTOUCHED = "[in]\ninput_name=Kept\ninput_activelow=true\n[stranger]\nkey=value\n"


@pytest.fixture
def device(make_device) -> Device:
    device = make_device()
    device.conf(DOCUMENT)
    return device


@pytest.fixture
def storage(device, tmp_path) -> Iterator[Storage]:
    storage = Storage(device, tmp_path)
    yield storage
    storage.release()


def holds(device: Device, line: str) -> bool:
    return device.path(SETTINGS).exists() and f"\n{line}\n" in device.read_settings()


def wait_holds(device: Device, line: str) -> None:
    wait_for(lambda: holds(device, line), f"{line} in the settings file")


def save_marker(device: Device) -> None:
    """Everything that was asked for earlier is stored when this is."""
    device.call("SetName", "ubs", OTHER, False, "Marker")
    wait_holds(device, "output_name=Marker")


# What a save costs


def test_states_replace_no_file(device, storage):
    device.start()
    storage.forget()
    pending = [device.begin_call("SetState", "ub", OUT, n % 2 == 0) for n in range(1000)]
    for call in pending:
        call.result()
    save_marker(device)
    assert storage.replaced() == [SETTINGS]
    assert len(storage.syncs()) == 2  # of the file and of its folder


def test_an_unchanged_start_replaces_and_syncs_nothing(device, storage):
    device.start()
    device.stop()
    assert SETTINGS in storage.replaced()
    storage.forget()
    device.start()
    device.stop()
    assert storage.replaced() == []
    assert storage.syncs() == []


def test_what_somebody_else_wrote_is_not_taken_to_be_on_storage(device, storage):
    device.start()
    text = device.read_settings()
    storage.forget()
    device.settings(text)
    device.call("SetState", "ub", OUT, True)
    wait_for(lambda: storage.replaced() == [SETTINGS], "the file to be stored")
    assert device.read_settings() == text


def test_a_file_that_went_away_comes_back(device):
    device.start()
    device.path(SETTINGS).unlink()
    device.call("SetState", "ub", OUT, True)
    wait_for(device.path(SETTINGS).exists, "the settings file")
    wait_holds(device, "output_name=Output 1")


# Slow storage


def test_storage_that_hangs_holds_up_nobody(device, storage):
    device.start()
    storage.forget()
    storage.hang()
    before = device.read_settings()
    device.call("SetName", "ubs", IN, True, "First")
    wait_for(storage.syncs, "the save to begin")
    for number in range(100):
        device.call("SetName", "ubs", OUT, False, f"Name {number}")
        device.call("SetName", "ubs", IN, True, f"Door {number}")
    assert device.call("GetNames", "u", IN) == ("Door 99", "")
    assert device.read_settings() == before
    storage.release()
    wait_holds(device, "output_name=Name 99")
    assert holds(device, "input_name=Door 99")
    # What waited for the first save, of both ports, was one more.
    assert storage.replaced() == [SETTINGS, SETTINGS]
    assert len(storage.syncs()) == 4


def test_a_stop_waits_for_slow_storage(device, storage):
    device.start()
    storage.sync_takes(300)
    device.call("SetName", "ubs", IN, True, "Begun")
    for number in range(20):
        device.call("SetName", "ubs", OUT, False, f"Name {number}")
        device.call("SetName", "ubs", OTHER, False, f"Other {number}")
    device.stop()
    assert holds(device, "input_name=Begun")
    assert holds(device, "output_name=Name 19")
    assert holds(device, "output_name=Other 19")


def test_a_stop_does_not_wait_for_storage_that_hangs(device, storage):
    device.start()
    before = device.read_settings()
    storage.hang()
    device.call("SetName", "ubs", IN, True, "Lost")
    begun = time.monotonic()
    device.stop()
    assert time.monotonic() - begun < 5 * scale()
    assert device.log_count("Storage does not respond: the latest settings are lost") == 1
    assert device.read_settings() == before


def test_files_for_older_tools_hold_up_nobody(device, storage):
    device.conf(hwdesc(port("in", IN), port("out", OUT, "output", optional=True)))
    device.start()
    storage.hang()
    device.call("SetName", "ubs", IN, True, "Slow")
    assert device.call("DropIOPorts", "as", ["out"]) == ["out"]
    storage.release()
    wait_holds(device, "input_name=Slow")


# Storage that fails


def test_settings_that_can_not_be_read_now_are_not_replaced_by_defaults(device, storage):
    device.settings(UNTOUCHED)
    storage.fail()
    device.start(wait=False)
    assert device.wait_exit() == 1
    assert f"Could not read key file: {SETTINGS}: Input/output error\n" in device.stderr()
    device.wait_log("Could not read configuration file")
    assert device.read_settings() == UNTOUCHED


def test_settings_that_can_not_be_read_now_keep_the_groups_of_others(device, storage):
    device.allow_critical("param_read_configuration (file)")
    device.settings(UNTOUCHED)
    device.start()
    before = device.read_settings()
    storage.fail()
    device.call("SetName", "ubs", IN, True, "Not saved")
    wait_for(lambda: "Could not read key file: " in device.stderr(), "the refusal")
    assert device.read_settings() == before
    storage.mend()
    save_marker(device)
    assert holds(device, "[stranger]\nkey=value")


def make_pipe(device: Device) -> None:
    os.mkfifo(device.path(SETTINGS))


def make_terminal(device: Device) -> None:
    device.path(SETTINGS).symlink_to("/dev/ptmx")


@pytest.mark.parametrize("make", [make_pipe, make_terminal])
def test_settings_that_are_no_regular_file_end_the_start(device, make):
    make(device)
    device.start(wait=False)
    assert device.wait_exit() == 1
    assert f"Could not read key file: {SETTINGS}: Not a regular file\n" in device.stderr()


def test_settings_that_become_a_pipe_cost_the_saves_only(device):
    device.allow_critical("param_read_configuration (file)")
    device.start()
    device.path(SETTINGS).unlink()
    make_pipe(device)
    device.call("SetName", "ubs", IN, True, "Not saved")
    wait_for(lambda: ": Not a regular file\n" in device.stderr(), "the refusal")
    device.path(SETTINGS).unlink()
    save_marker(device)


# What a save that was cut off leaves


def test_the_temporary_file_of_a_save_that_was_cut_off_goes_at_the_next_start(device, storage):
    device.start()
    storage.forget()
    storage.hang()
    device.call("SetName", "ubs", IN, True, "Lost")
    wait_for(storage.syncs, "the save to begin")
    device.kill()
    storage.release()
    assert len(os.listdir(device.path(FOLDER))) == 2
    device.start()
    assert os.listdir(device.path(FOLDER)) == ["portd.conf"]
    assert device.call("GetNames", "u", IN) == ("Input 1", "")


def test_other_files_beside_the_settings_stay(device):
    names = [
        "portd.conf.backup", "portd.conf.XB3F0A", "portd.conf.tmp-12345", "portd.conf.tmp-1234567",
        "portd.conf.tmp-a_bcde", ".portd.conf.tmp-abcdef", "other.conf.tmp-abcdef", "portd.conf~",
    ]  # fmt: skip
    for name in names:
        device.write(f"{FOLDER}/{name}", "precious")
    device.mkdir(f"{FOLDER}/portd.conf.tmp-Folder")
    device.path(f"{FOLDER}/portd.conf.tmp-Linked").symlink_to("other.conf.tmp-abcdef")
    names += ["portd.conf.tmp-Folder", "portd.conf.tmp-Linked"]
    device.write(f"{FOLDER}/portd.conf.tmp-aB3dE9", "cut o")
    if is_real_root():
        os.chown(device.write(f"{FOLDER}/portd.conf.tmp-nobody", ""), 65534, 65534)
        names.append("portd.conf.tmp-nobody")
    device.start()
    assert sorted(os.listdir(device.path(FOLDER))) == sorted([*names, "portd.conf"])


# Links, and whose the file is


def test_a_link_of_roots_is_followed_and_kept(device):
    target = device.write("/etc/elsewhere/settings", UNTOUCHED)
    os.chown(target.parent, *((PCD_ID, PCD_ID) if is_real_root() else (-1, -1)))
    device.path(SETTINGS).symlink_to("../elsewhere/settings")
    device.start()
    assert device.call("GetNames", "u", IN) == ("Kept", "")
    device.call("SetName", "ubs", IN, True, "Renamed")
    wait_for(lambda: "input_name=Renamed\n" in target.read_text(), "the save")
    assert device.path(SETTINGS).is_symlink()
    assert os.listdir(target.parent) == ["settings"]


def test_a_link_of_the_accounts_gives_it_no_file_of_roots(device):
    secret = device.write("/etc/secret", UNTOUCHED)
    secret.chmod(0o600)
    device.path(SETTINGS).symlink_to("/etc/secret")
    if not is_real_root():
        return  # there is nobody but root to own it
    os.lchown(device.path(SETTINGS), PCD_ID, PCD_ID)
    device.start(wait=False)
    assert device.wait_exit() == 1
    assert f"'{SETTINGS}' is a link of uid {PCD_ID}" in device.stderr()
    assert secret.read_text() == UNTOUCHED
    assert (secret.stat().st_uid, stat.S_IMODE(secret.stat().st_mode)) == (0, 0o600)


def test_a_second_name_of_a_file_of_roots_does_not_give_it_away(device):
    secret = device.write("/etc/secret", UNTOUCHED)
    os.link(secret, device.path(SETTINGS))
    device.start()
    device.wait_log("chown failed on file")
    assert secret.stat().st_uid == os.geteuid()
