"""The life of the packages on a machine that runs: installed, used, upgraded, removed, purged.

The tests follow one another on one machine, in the order in which they stand here.
"""

import json
import re
import subprocess
from pathlib import Path

from machine import Machine, wait_for

STATE = "com.kelv.IOControl.State"
SETTINGS = "/etc/portd/portd.conf"


def call(machine: Machine, method: str, *arguments: str) -> str:
    return machine.out(
        "gdbus", "call", "--system", "--timeout", "20", "-d", STATE,
        "-o", "/com/kelv/IOControl/State", "-m", f"{STATE}.{method}", *arguments,
    )  # fmt: skip


def prop(machine: Machine, name: str, unit: str = "portd.service") -> str:
    return machine.out("systemctl", "show", "--value", f"--property={name}", unit)


def owners(machine: Machine) -> str:
    return machine.out(
        "gdbus", "call", "--system", "-d", "org.freedesktop.DBus", "-o", "/org/freedesktop/DBus",
        "-m", "org.freedesktop.DBus.ListNames",
    )  # fmt: skip


def journal(machine: Machine, *options: str) -> str:
    return machine.out("journalctl", "-u", "portd", "-o", "cat", "--no-pager", *options)


def status_of(machine: Machine, field: str) -> str:
    text = machine.out("cat", f"/proc/{prop(machine, 'MainPID')}/status")
    return re.search(rf"^{field}:\s*(.*)$", text, re.MULTILINE).group(1)


def test_installing_starts_the_service(machine, root, packages):
    names = root.add([packages[name] for name in sorted(packages)])
    machine.run("dpkg", "--install", *names, timeout=120)
    assert prop(machine, "ActiveState") == "active"
    assert prop(machine, "NRestarts") == "0"
    assert prop(machine, "UnitFileState") == "enabled"
    assert call(machine, "GetNbrPorts") == "(uint32 1, uint32 2)"


def test_daemon_is_the_service_account_without_rights(machine):
    account = machine.out("id", "-u", "pcd")
    assert status_of(machine, "Uid").split() == [account] * 4
    assert status_of(machine, "Gid").split() == [machine.out("id", "-g", "pcd")] * 4
    assert int(status_of(machine, "CapEff"), 16) == 0
    assert status_of(machine, "NoNewPrivs") == "1"
    assert status_of(machine, "Seccomp") == "2"


def test_limits_hold(machine):
    limits = machine.out("cat", f"/proc/{prop(machine, 'MainPID')}/limits")
    assert re.search(r"Max open files\s+(\d+)\s+\1\s", limits), limits
    assert prop(machine, "TasksMax") == "1024"
    assert prop(machine, "MemoryMax") == str(512 * 1024 * 1024)


def test_devices_are_writable_and_the_kernels_tunables_are_not(machine):
    def writable(path: str) -> bool:
        """Whether root may write there, where the daemon is: all but what is mounted read-only."""
        inside = ["nsenter", "-t", prop(machine, "MainPID"), "-m", "--"]
        return machine.run(*inside, "test", "-w", path, check=False).returncode == 0

    assert writable("/sys/devices")
    assert writable("/etc/portd")
    assert not writable("/sys/module")
    assert not writable("/proc/sys/kernel")
    assert not writable("/etc/default")


def test_the_device_manager_understands_the_rules(machine):
    result = machine.run("udevadm", "test", "/sys/class/mem/null")
    of_ours = [line for line in (result.stdout + result.stderr).splitlines() if "60-portd" in line]
    assert [line for line in of_ours if "Reading rules file" not in line] == []
    assert len(of_ours) == 1


def test_the_rules_give_the_account_what_it_writes_and_nothing_else(machine, root):
    line, converter = "/root/class/gpio17", "/root/bus/iio:device0"
    given = [f"{line}/value", f"{line}/direction", f"{converter}/buffer/enable"]
    given += [f"{converter}/events/in_voltage0_thresh_rising_en"]
    kept = [f"{line}/uevent", f"{converter}/name", f"{converter}/buffer/length"]
    for path in given + kept:
        root.write(path, "0\n").chmod(0o644)
    machine.run("/usr/lib/udev/portd-device-rights", line, "/root/bus/gone", converter)
    for path in given:
        assert machine.out("stat", "-c", "%U:%G %a", path) == "root:pcd 664", path
    for path in kept:
        assert machine.out("stat", "-c", "%U:%G %a", path) == "root:root 644", path


def test_input_is_polled_from_its_attribute(machine, root):
    root.write("/var/lib/door", "1\n")
    wait_for(lambda: call(machine, "GetState", "0") == "(true,)", "the door to open")


def test_settings_are_saved_and_survive_a_restart(machine):
    call(machine, "SetName", "1", "false", "Siren")
    wait_for(lambda: "output_name=Siren" in machine.out("cat", SETTINGS), "the saved name")
    machine.run("systemctl", "restart", "portd")
    assert call(machine, "GetNames", "1").endswith("'Siren')")
    assert machine.out("stat", "-c", "%U:%G %a", SETTINGS) == "pcd:pcd 644"


def test_a_crash_is_followed_by_a_new_start(machine):
    machine.run("systemctl", "kill", "--signal=SIGKILL", "portd")
    wait_for(lambda: prop(machine, "NRestarts") == "1", "the restart")
    wait_for(lambda: prop(machine, "ActiveState") == "active", "the service")
    assert call(machine, "GetNames", "1").endswith("'Siren')")


def test_stopping_takes_less_than_five_seconds_and_ends_well(machine):
    machine.run("systemctl", "stop", "portd", timeout=5)
    assert prop(machine, "Result") == "success"
    assert prop(machine, "ExecMainStatus") == "0"


def test_a_call_starts_the_service(machine):
    assert STATE not in owners(machine)
    assert call(machine, "GetNbrPorts") == "(uint32 1, uint32 2)"
    assert prop(machine, "ActiveState") == "active"


def test_a_device_without_the_older_configuration_service_says_nothing_of_its_folders(machine):
    text = journal(machine)
    assert "port daemon" in text
    assert not re.search("legacy|registry", text, re.IGNORECASE)


def test_options_come_from_the_environment_file(machine, root):
    bridge = "com.kelv.Configuration.Legacy.IOControl1.IOPort"
    wait_for(lambda: bridge in owners(machine), "the legacy bridge")
    root.write("/etc/default/portd", "PORTD_OPTIONS=--disable_legacy_interface\n")
    machine.run("systemctl", "restart", "portd")
    assert STATE in owners(machine)
    assert bridge not in owners(machine)


def test_the_journal_knows_the_level_of_each_message(machine, root):
    root.write("/etc/portd.d/broken.xml", "not a description\n")
    machine.run("systemctl", "restart", "portd")
    machine.run("systemctl", "kill", "--signal=SIGHUP", "portd")
    root.path("/etc/portd.d/broken.xml").unlink()
    broken = "portd: Couldn't parse markup file (/etc/portd.d//broken.xml)"
    wait_for(lambda: "Got SIGHUP" in journal(machine, "-p", "info"), "the line in the journal")
    assert f"CRITICAL: {broken}" in journal(machine, "-p", "err")
    assert "Got SIGHUP" not in journal(machine, "-p", "notice")


def test_a_daemon_that_hangs_is_started_anew(machine, root):
    drop_in = root.write("/etc/systemd/system/portd.service.d/soon.conf", "[Service]\nWatchdogSec=2\n")
    machine.run("systemctl", "daemon-reload")
    machine.run("systemctl", "restart", "portd")
    answered = prop(machine, "WatchdogTimestampMonotonic")
    gone = (answered, "0")
    wait_for(lambda: prop(machine, "WatchdogTimestampMonotonic") not in gone, "an answer")
    assert prop(machine, "NRestarts") == "0"
    machine.run("systemctl", "kill", "--signal=SIGSTOP", "portd")
    wait_for(lambda: prop(machine, "NRestarts") == "1", "the watchdog")
    wait_for(lambda: prop(machine, "ActiveState") == "active", "the service")
    drop_in.unlink()
    machine.run("systemctl", "daemon-reload")


def portctl_as(user: str, machine: Machine, *words: str):
    return machine.run("runuser", "-u", user, "--", "portctl", *words, check=False)


def test_everybody_may_look(machine):
    listed = portctl_as("nobody", machine, "list", "--json")
    assert listed.returncode == 0, listed.stderr
    assert [port["identifier"] for port in json.loads(listed.stdout)] == ["door", "relay", "alarm"]


def test_root_and_members_of_the_group_may_change_ports_and_others_may_not(machine):
    machine.run("useradd", "--groups", "portd", "guard")
    for user, status in (("nobody", 4), ("guard", 0), ("root", 0)):
        for state in ("on", "off"):
            result = portctl_as(user, machine, "set", "relay", state)
            assert result.returncode == status, f"{user}: {result.stdout}{result.stderr}"


def make_upgrade(package: Path, folder: Path) -> Path:
    """The same package with a later version."""
    folder = folder / "later"
    subprocess.run(["dpkg-deb", "--raw-extract", package, folder], check=True, timeout=60)
    control = folder / "DEBIAN/control"
    later = re.sub(r"^(Version: .*)$", r"\1+later", control.read_text(), flags=re.MULTILINE)
    control.write_text(later)
    pack = ["dpkg-deb", "--root-owner-group", "--build", folder, folder.with_suffix(".deb")]
    subprocess.run(pack, check=True, timeout=60)
    return folder.with_suffix(".deb")


def test_upgrading_restarts_the_service_and_keeps_the_settings(machine, root, packages, tmp_path):
    before = prop(machine, "MainPID")
    later = root.add([make_upgrade(packages["portd"], tmp_path)])
    machine.run("dpkg", "--force-confold", "--install", *later)
    assert machine.out("dpkg-query", "-W", "-f", "${Version}", "portd").endswith("+later")
    assert prop(machine, "ActiveState") == "active"
    assert prop(machine, "MainPID") != before
    assert call(machine, "GetNames", "1").endswith("'Siren')")
    assert "--disable_legacy_interface" in root.path("/etc/default/portd").read_text()


def test_removing_stops_the_service_and_leaves_the_settings(machine, packages):
    machine.run("dpkg", "--remove", *sorted(packages, reverse=True))
    assert STATE not in owners(machine)
    assert machine.run("test", "-e", "/usr/bin/portd", check=False).returncode == 1
    assert "Siren" in machine.out("cat", SETTINGS)


def test_purging_leaves_nothing_that_the_daemon_wrote(machine, packages):
    machine.run("dpkg", "--purge", *sorted(packages, reverse=True))
    for path in ("/etc/portd", "/etc/portd.d", "/etc/default/portd", "/usr/share/doc/portd"):
        assert machine.run("test", "-e", path, check=False).returncode == 1, path
