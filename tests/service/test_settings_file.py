"""The settings file: what is read from it, what is written to it, and what a save may cost."""

import os
import random
import re

import pytest
from gi.repository import GLib

from harness import Device, hwdesc, port, wait_for
from harness.device import SETTINGS

IN, OUT, BOTH = range(3)
DOCUMENT = hwdesc(port("in", IN), port("out", OUT, "output"), port("both", BOTH, "io_ctrl"))
FRESH = {
    "in": {"input_name": "Input 1", "input_activelow": "false"},
    "out": {
        "output_name": "Output 1",
        "output_activelow": "false",
        "button_type": "none",
        "pulse_time": "0",
        "port_mode": "bistable",
        "delay_time": "0",
    },
    "both": {
        "input": "true",
        "input_name": "Input 2",
        "input_activelow": "false",
        "output_name": "Output 2",
        "output_activelow": "false",
        "button_type": "none",
        "pulse_time": "0",
        "port_mode": "bistable",
        "delay_time": "0",
    },
}


@pytest.fixture
def device(make_device) -> Device:
    """A device with a port of each type, not started yet."""
    device = make_device()
    device.conf(DOCUMENT)
    return device


def parsed(text: str) -> dict[str, dict[str, str]]:
    """The groups of a settings file, with the raw text of each value in the order of the file."""
    key_file = GLib.KeyFile()
    key_file.load_from_data(text, len(text.encode()), GLib.KeyFileFlags.KEEP_TRANSLATIONS)
    return {
        group: {key: key_file.get_value(group, key) for key in key_file.get_keys(group)[0]}
        for group in key_file.get_groups()[0]
    }


def settings(device: Device) -> dict[str, dict[str, str]]:
    return parsed(device.read_settings())


def wait_saved(device: Device, group: str, key: str, value: str) -> None:
    wait_for(
        lambda: device.path(SETTINGS).exists()
        and settings(device).get(group, {}).get(key) == value,
        f"{group}.{key}={value} in the settings file",
    )


def save_marker(device: Device, name: str = "Marker") -> None:
    """Has the daemon save once more and waits for it: everything asked for earlier is saved too."""
    device.call("SetName", "ubs", OUT, False, name)
    wait_saved(device, "out", "output_name", name)


# Reading and writing


def test_a_first_start_writes_every_port(device):
    device.start()
    assert settings(device) == FRESH
    for group, values in FRESH.items():
        assert list(settings(device)[group]) == list(values)


def test_every_setting_comes_back_after_a_restart(device):
    device.start()
    device.call("SetDirection", "us", BOTH, "output")
    device.call("SetName", "ubs", BOTH, True, "Door")
    device.call("SetName", "ubs", BOTH, False, "Lock")
    device.call("SetActive", "ubs", BOTH, True, "open")
    device.call("SetActive", "ubs", BOTH, False, "open")
    device.call("SetName", "ubs", IN, True, "Window")
    device.restart()
    assert device.call("GetDirection", "u", BOTH) == "output"
    assert device.call("GetNames", "u", BOTH) == ("Door", "Lock")
    assert device.call("GetActive", "u", BOTH) == ("open", "open")
    assert device.call("GetNames", "u", IN) == ("Window", "")
    assert device.call("GetNbrPorts") == (1, 2)


def test_every_key_is_read_and_written_back(device):
    values = {
        "input": "false", "input_name": "A", "input_activelow": "true", "output_name": "B",
        "output_activelow": "true", "button_type": "actinact", "pulse_time": "4294967295",
        "port_mode": "monostable", "delay_time": "1500",
    }  # fmt: skip
    text = "[both]\n" + "".join(f"{key}={value}\n" for key, value in values.items())
    device.settings(text)
    device.start()
    assert settings(device)["both"] == values
    assert device.call("GetNames", "u", BOTH) == ("A", "B")
    assert device.call("GetActive", "u", BOTH) == ("open", "open")
    assert device.call("GetDirection", "u", BOTH) == "output"
    assert "Error parsing param file" not in device.stderr()


@pytest.mark.parametrize(
    "name",
    ["  spaces  ", "\fform", "\f \f\\f", "\ttab", " \f", "Tür \N{DOOR}", "a\nb\tc\\d", "[both]",
     "#none", "", "x" * 4096],  # fmt: skip
)
def test_odd_names_survive_a_restart(device, name):
    device.start()
    device.call("SetName", "ubs", BOTH, True, name)
    device.restart()
    assert device.call("GetNames", "u", BOTH) == (name, "Output 2")


def test_what_else_the_file_holds_is_kept(device):
    device.settings(
        "# of the file\n\n[stranger]\nkey=value\nlist=a;b\n\n"
        "# of the group\n[out]\n# of the key\noutput_name=Pump\nown_key=own value\n"
        "output_activelow=false\nbutton_type=none\npulse_time=0\nport_mode=bistable\ndelay_time=0\n"
        "[last stranger]\nName[de]=Wert\n"
    )
    device.start()
    save_marker(device)
    text = device.read_settings()
    assert settings(device)["stranger"] == {"key": "value", "list": "a;b"}
    assert settings(device)["last stranger"] == {"Name[de]": "Wert"}
    assert settings(device)["out"]["own_key"] == "own value"
    for comment in ("# of the file", "# of the group", "# of the key"):
        assert text.count(comment) == 1
    assert text.index("# of the key") < text.index("output_name=Marker")


def test_a_save_changes_one_group_only(device):
    device.start()
    before = settings(device)
    save_marker(device)
    after = settings(device)
    assert after.pop("out") == {**before.pop("out"), "output_name": "Marker"}
    assert after == before


def test_a_save_without_a_file_makes_one_with_that_group(device):
    device.start()
    device.path(SETTINGS).unlink()
    save_marker(device)
    assert settings(device) == {"out": {**FRESH["out"], "output_name": "Marker"}}


def test_ports_beyond_the_count_are_not_saved_at_start(device):
    device.conf(hwdesc(port("near", 0), port("far", 2)))
    device.start()
    assert list(settings(device)) == ["near"]
    device.call("SetName", "ubs", 2, True, "Far away")
    wait_saved(device, "far", "input_name", "Far away")


# Files that are not as they should be


BUTTON_KEYS = "pulse_time=7\nport_mode=monostable\ndelay_time=9\n"


def test_an_unknown_button_type_ends_the_reading_quietly(device):
    head = "[out]\noutput_name=Pump\noutput_activelow=true\n"
    device.settings(f"{head}button_type=toggle\n{BUTTON_KEYS}")
    device.start()
    written = settings(device)["out"]
    assert (written["output_name"], written["output_activelow"]) == ("Pump", "true")
    assert [written[key] for key in ("button_type", "pulse_time", "port_mode", "delay_time")] == [
        "none", "0", "bistable", "0",
    ]  # fmt: skip
    assert "Error parsing param file" not in device.stderr()


@pytest.mark.parametrize("mode", ["Bistable", "nonsense", ""])
def test_any_other_mode_is_monostable(device, mode):
    head = "[out]\noutput_name=Pump\noutput_activelow=true\nbutton_type=pulse\npulse_time=7\n"
    device.settings(f"{head}port_mode={mode}\ndelay_time=9\n")
    device.start()
    assert settings(device)["out"] == {
        "output_name": "Pump", "output_activelow": "true", "button_type": "pulse",
        "pulse_time": "7", "port_mode": "monostable", "delay_time": "9",
    }  # fmt: skip


def test_a_missing_name_loses_the_ports_own_and_ends_the_reading(device):
    device.conf(hwdesc(port("in", IN, names={"input": "Described"})))
    device.settings("[in]\ninput_activelow=true\n")
    device.start()
    # The name was dropped and the default took its place; the key behind it was not reached.
    assert device.call("GetNames", "u", IN) == ("Input 1", "")
    assert device.call("GetActive", "u", IN) == ("closed", "closed")
    assert device.stderr().startswith("Error parsing param file: ")
    device.wait_log("No input name for port in:0")


def test_a_missing_output_name_is_told_too(device):
    device.settings("[out]\noutput_activelow=true\n")
    device.start()
    assert device.stderr().startswith("Error parsing param file: ")
    device.wait_log("No output name for port out:1")


def test_a_negative_delay_time_is_a_very_large_number(device):
    large = "18446744073709551615"
    head = "[out]\noutput_name=x\noutput_activelow=false\nbutton_type=none\npulse_time=0\n"
    device.settings(f"{head}port_mode=bistable\ndelay_time={large}\n")
    device.start()
    assert settings(device)["out"]["delay_time"] == large


@pytest.mark.parametrize("line", ["pulse_time=soon", "pulse_time=1.5", "pulse_time=", "other=1"])
def test_a_value_of_the_wrong_type_ends_the_reading_there(device, line):
    device.settings(
        "[out]\noutput_name=Pump\noutput_activelow=true\nbutton_type=pulse\n"
        f"{line}\nport_mode=monostable\ndelay_time=9\n"
    )
    device.start()
    assert device.stderr().startswith("Error parsing param file: ")
    assert settings(device)["out"] == {
        "output_name": "Pump", "output_activelow": "true", "button_type": "pulse",
        "pulse_time": "0", "port_mode": "bistable", "delay_time": "0",
        **({"other": "1"} if line == "other=1" else {}),
    }  # fmt: skip


@pytest.mark.parametrize("number", ["-1", "4294967296", "99999999999999999999999"])
def test_times_beyond_all_bounds_do_no_harm(device, number):
    device.settings(
        "[out]\noutput_name=Pump\noutput_activelow=true\nbutton_type=pulse\n"
        f"pulse_time={number}\nport_mode=monostable\ndelay_time={number}\n"
    )
    device.start()
    written = settings(device)["out"]
    assert int(written["pulse_time"]) < 2**32
    assert int(written["delay_time"]) < 2**31 or int(written["delay_time"]) >= 2**64 - 2**31
    assert written["port_mode"] == "monostable"


@pytest.mark.parametrize(
    "lines, key",
    [
        ("input_name=C:\\quarry\ninput_activelow=true", "input_name"),
        ("input_name=\\f\\q\ninput_activelow=true", "input_name"),
        ("input_name=Door\ninput_activelow=yes", "input_activelow"),
        ("input_name=Door", "input_activelow"),
    ],
)
def test_a_value_that_can_not_be_read_is_named(device, lines, key):
    device.settings(f"[in]\n{lines}\n")
    device.start()
    assert device.stderr().startswith("Error parsing param file: ")
    assert f"\nIn file {SETTINGS}, group in (port {IN}), key {key}\n" in device.stderr()
    assert device.call("GetActive", "u", IN) == ("closed", "closed")
    assert device.call("GetNames", "u", IN) == ("Input 1" if key == "input_name" else "Door", "")


def test_one_ports_error_is_not_anothers(device):
    device.settings("[both]\ninput=perhaps\n[in]\ninput_name=Window\ninput_activelow=true\n")
    device.start()
    assert device.call("GetNames", "u", IN) == ("Window", "")
    assert device.call("GetNames", "u", BOTH) == ("Input 2", "Output 2")
    assert device.call("GetDirection", "u", BOTH) == "input"


def test_a_name_that_is_not_text_does_no_harm(device):
    device.write(SETTINGS, "")
    device.path(SETTINGS).write_bytes(b"[in]\ninput_name=\xff\xfe\ninput_activelow=true\n")
    device.start()
    assert device.call("GetNames", "u", IN) == ("Input 1", "")


def test_a_group_without_a_port_is_kept(device):
    device.settings("[removed port]\ninput_name=Kept for its return\n")
    device.start()
    save_marker(device)
    assert settings(device)["removed port"] == {"input_name": "Kept for its return"}


# Saving under trouble


def break_file(device: Device) -> None:
    device.write(SETTINGS, "neither group nor key\n")


def make_directory(device: Device) -> None:
    device.path(SETTINGS).unlink()
    device.mkdir(SETTINGS)


@pytest.mark.parametrize("harm", [break_file, make_directory])
def test_a_file_that_went_bad_costs_the_save_only(device, harm):
    device.allow_critical("param_read_configuration (file)")
    device.start()
    harm(device)
    device.call("SetName", "ubs", IN, True, "Not saved")
    wait_for(lambda: "Could not read key file: " in device.stderr(), "the refusal")
    assert device.call("GetNames", "u", IN) == ("Not saved", "")
    target = device.path(SETTINGS)
    if target.is_dir():
        assert not any(target.iterdir())
        target.rmdir()
    else:
        assert target.read_text() == "neither group nor key\n"
        target.unlink()
    save_marker(device)


def test_a_missing_folder_costs_the_save_only(device):
    device.start()
    folder = device.path("/etc/portd")
    owner = folder.stat()
    device.path(SETTINGS).unlink()
    folder.rmdir()
    device.call("SetName", "ubs", IN, True, "Not saved")
    wait_for(lambda: "Failed to store key file" in device.stderr(), "the refusal")
    folder.mkdir()
    os.chown(folder, owner.st_uid, owner.st_gid)
    save_marker(device)


def fill(folder) -> None:
    """Takes what space is left on the folder's file system."""
    with (folder / "ballast").open("wb", buffering=0) as ballast:
        for size in (4096, 1):
            try:
                while True:
                    ballast.write(b"x" * size)
            except OSError:
                pass


def test_a_full_file_system_costs_the_save_only(make_device):
    device = make_device(tmpfs={"/etc/portd": "64k"})
    device.conf(DOCUMENT)
    device.start()
    before = device.read_settings()
    folder = device.path("/etc/portd")
    fill(folder)
    for attempt in range(3):
        device.call("SetName", "ubs", IN, True, f"Not saved {attempt}")
        wait_for(
            lambda: device.stderr().count("Failed to store key file") == attempt + 1, "the refusal"
        )
    assert device.call("GetNames", "u", IN) == ("Not saved 2", "")
    assert device.read_settings() == before
    assert sorted(os.listdir(folder)) == ["ballast", "portd.conf"]
    (folder / "ballast").unlink()
    device.call("SetName", "ubs", IN, True, "Saved")
    wait_saved(device, "in", "input_name", "Saved")


def test_a_file_system_that_is_full_at_start(make_device):
    device = make_device(tmpfs={"/etc/portd": "64k"})
    device.conf(DOCUMENT)
    fill(device.path("/etc/portd"))
    device.start()
    assert device.call("GetNames", "u", IN) == ("Input 1", "")
    device.path("/etc/portd/ballast").unlink()
    save_marker(device)


def test_the_file_is_replaced_and_never_written_to(device):
    """Whoever has the old file open goes on reading the old file."""
    device.start()
    with device.path(SETTINGS).open() as old:
        before = device.read_settings()
        inode = device.path(SETTINGS).stat().st_ino
        save_marker(device)
        assert device.path(SETTINGS).stat().st_ino != inode
        assert old.read() == before


def test_power_cuts_leave_the_old_or_the_new_file(device):
    generator = random.Random(1)
    kept = "Input 1"
    for attempt in range(15):
        device.start()
        names = [f"Name {attempt}.{number} " + "x" * 3000 for number in range(200)]
        pending = [device.begin_call("SetName", "ubs", IN, True, name) for name in names]
        answered = generator.randrange(1, 60)
        wait_for(lambda: sum(call.done for call in pending) >= answered, "some of the replies")
        device.kill()
        groups = settings(device)
        assert set(groups) == set(FRESH)
        # The save goes on behind the reply, so it may be any of them, or still the last round's.
        assert groups["in"]["input_name"] in [kept, *names]
        kept = groups["in"]["input_name"]
        assert {key: groups["out"][key] for key in FRESH["out"]} == FRESH["out"]
    device.start()
    assert device.call("GetNames", "u", IN) == (kept, "")


def test_no_litter_is_left_by_regular_saves(device):
    device.start()
    for number in range(50):
        device.call("SetName", "ubs", IN, True, f"Name {number}")
    wait_saved(device, "in", "input_name", "Name 49")
    device.stop()
    assert os.listdir(device.path("/etc/portd")) == ["portd.conf"]


def test_the_mode_of_the_file_is_kept(device):
    device.settings("[in]\ninput_name=Door\ninput_activelow=false\n")
    device.path(SETTINGS).chmod(0o640)
    device.start()
    save_marker(device)
    assert device.path(SETTINGS).stat().st_mode & 0o7777 == 0o640


def test_a_readers_view_is_whole_at_every_instant(device):
    device.start()
    for number in range(300):
        # The save goes on behind the reply.
        device.call("SetName", "ubs", IN, True, f"Name {number}")
        view = settings(device)
        assert set(view) == set(FRESH)
        assert re.fullmatch(r"Input 1|Name \d+", view["in"]["input_name"])
