"""The packages as files: what is in them, and what the packager's own checks say."""

import subprocess
from pathlib import Path

import pytest

REPOSITORY = Path(__file__).resolve().parents[2]


def output(*command: str | Path) -> str:
    result = subprocess.run(command, capture_output=True, text=True, timeout=120)
    assert result.returncode == 0, result.stdout + result.stderr
    return result.stdout


def contents(package: Path) -> set[str]:
    lines = output("dpkg-deb", "--contents", package).splitlines()
    return {line.split()[5].removeprefix(".").removesuffix(".gz") for line in lines}


@pytest.mark.parametrize(
    "name, files",
    [
        (
            "portd",
            {
                "/usr/bin/portd",
                "/etc/default/portd",
                "/lib/systemd/system/portd.service",
                "/usr/lib/sysusers.d/portd.conf",
                "/usr/lib/tmpfiles.d/portd.conf",
                "/usr/lib/udev/portd-device-rights",
                "/usr/lib/udev/rules.d/60-portd.rules",
                "/usr/share/dbus-1/system.d/com.kelv.portd.conf",
                "/usr/share/dbus-1/system-services/com.kelv.IOControl.State.service",
                "/usr/share/doc/portd/examples/board.xml",
            },
        ),
        (
            "portctl",
            {"/usr/bin/portctl", "/usr/share/bash-completion/completions/portctl"},
        ),
        ("portd-dev", {"/usr/share/dbus-1/interfaces/com.kelv.IOControl.State.xml"}),
        ("portd-doc", {"/usr/share/doc/portd-doc/HACKING.md"}),
    ],
)
def test_package_holds(packages, name, files):
    assert files - contents(packages[name]) == set()


def test_every_file_that_is_installed_is_in_a_package(packages):
    installed = set((packages["portd"].parent / "installed").read_text().splitlines())
    packed = set().union(*(contents(file) for file in packages.values()))
    assert installed - packed == set()


def test_lintian_has_neither_errors_nor_warnings(packages):
    report = output("lintian", "--allow-root", "--tag-display-limit=0", *packages.values())
    assert [line for line in report.splitlines() if line[:2] in ("E:", "W:")] == []


def test_unit_is_closed_but_for_what_the_daemon_needs(packages, tmp_path):
    output("dpkg-deb", "--extract", packages["portd"], tmp_path)
    unit = tmp_path / "lib/systemd/system/portd.service"
    # Fails when the exposure is above 2.5.
    output("systemd-analyze", "security", "--offline=yes", "--threshold=25", "--no-pager", unit)
