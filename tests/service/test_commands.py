"""The scripts that a person runs: what they must not do, and what they share between clones."""

import os
import shutil
import subprocess
from pathlib import Path

import pytest

from harness.device import REPOSITORY


def clone(folder: Path) -> Path:
    """The scripts alone, with a demo that only says that it runs and a daemon that was built before."""
    for part in ("scripts", "tests/device"):
        shutil.copytree(REPOSITORY / part, folder / part)
    (folder / "demo").mkdir()
    (folder / "demo/demo.py").write_text("print('the demo runs')\n")
    (folder / "build/demo/src").mkdir(parents=True)
    (folder / "build/demo/src/portd").write_text("")
    return folder


def run(*command, **env: str) -> subprocess.CompletedProcess:
    path = os.environ["PATH"]
    environment = {"PATH": path, "HOME": "", **env}
    return subprocess.run(command, env=environment, capture_output=True, text=True)


def test_the_demo_runs_no_daemon_that_it_could_not_build(tmp_path: Path):
    folder = clone(tmp_path / "clone")
    (folder / "build/demo.log").mkdir()
    demo = run(folder / "scripts/demo")
    assert demo.returncode != 0 and "the demo runs" not in demo.stdout


def test_the_demo_runs_no_daemon_whose_build_failed(tmp_path: Path):
    folder = clone(tmp_path / "clone")
    demo = run(folder / "scripts/demo")
    # There are no sources in this one.
    assert demo.returncode != 0 and "the demo runs" not in demo.stdout
    assert "meson.build" in demo.stdout


@pytest.mark.parametrize("script", ["demo", "test"])
def test_help_installs_and_builds_nothing(tmp_path: Path, script):
    folder = clone(tmp_path / "clone")
    tools = tmp_path / "tools"
    tools.mkdir()
    for tool in ("apt-get", "dpkg-query", "sudo", "meson", "ninja"):
        (tools / tool).write_text(f'#!/bin/sh\necho called >>"{tmp_path}/calls"\n')
        (tools / tool).chmod(0o755)
    told = run(folder / "scripts" / script, "--help", PATH=f"{tools}:{os.environ['PATH']}")
    assert told.returncode == 0 and told.stdout.startswith("Builds")
    assert not (tmp_path / "calls").exists()


def test_an_unknown_stage_is_told_before_anything_is_installed(tmp_path: Path):
    folder = clone(tmp_path / "clone")
    told = run(folder / "scripts/test", "unti")
    assert told.returncode == 2 and 'No stage "unti"' in told.stderr
    assert "Installing" not in told.stdout


# Makes the part "thing" in the state that $1 names, and adds a line to $2 each time it is really made.
MAKE = """
set -euo pipefail
source "$0/tests/device/lib.sh"
make_thing() { echo made >>"$log"; sleep 0.2; echo content >"$1/file"; }
log=$2
shared_once thing "$1" make_thing
"""


class Clones:
    """Clones of one person, and how often a part was made for them."""

    def __init__(self, folder: Path):
        self.home = folder / "home"
        self.home.mkdir()
        self.clones = [clone(folder / name) for name in ("one", "two")]
        self._log = folder / "log"
        self._log.write_text("")

    def command(self, number: int, state: str) -> list[str]:
        return ["bash", "-c", MAKE, str(self.clones[number]), state, str(self._log)]

    def make(self, number: int, state: str, **env: str) -> Path:
        made = run(*self.command(number, state), **{"HOME": str(self.home), **env})
        assert made.returncode == 0, made.stderr
        return self.thing(number)

    def thing(self, number: int) -> Path:
        return self.clones[number] / "build/device/thing"

    @property
    def times_made(self) -> int:
        return len(self._log.read_text().splitlines())

    def shared(self) -> list[str]:
        return sorted(entry.name for entry in (self.home / ".cache/portd").iterdir())


@pytest.fixture
def clones(tmp_path: Path) -> Clones:
    return Clones(tmp_path)


def test_a_second_clone_makes_no_second_kernel(clones):
    for number in (0, 1, 0):
        assert (clones.make(number, "a") / "file").read_text() == "content\n"
    assert clones.times_made == 1


def test_two_clones_at_once_both_get_it_whole(clones):
    env = {"PATH": os.environ["PATH"], "HOME": str(clones.home)}
    makers = [subprocess.Popen(clones.command(number, "a"), env=env) for number in (0, 1)]
    assert [maker.wait() for maker in makers] == [0, 0]
    for number in (0, 1):
        assert (clones.thing(number) / "file").read_text() == "content\n"
    assert clones.shared() == ["thing-a"]


def test_only_the_states_used_last_are_kept(clones):
    for state in "abc":
        clones.make(0, state)
    clones.make(1, "a")
    clones.make(1, "d")
    assert clones.shared() == ["thing-a", "thing-c", "thing-d"]


def test_a_state_that_was_pruned_is_made_anew(clones):
    for state in "abcd":
        clones.make(0, state)
    clones.thing(1).parent.mkdir(parents=True)
    clones.thing(1).symlink_to(clones.home / ".cache/portd/thing-a")
    assert (clones.make(1, "a") / "file").exists()
    assert clones.times_made == 5


@pytest.mark.parametrize(
    "env", [{"PORTD_CACHE": "no"}, {"HOME": ""}, {"HOME": "/proc/nowhere"}, {"XDG_CACHE_HOME": "/proc"}]
)
def test_without_a_cache_it_stays_in_the_build_folder(clones, env):
    thing = clones.make(0, "a", **env)
    assert (thing / "file").exists() and not thing.is_symlink()
    assert not (clones.home / ".cache").exists()
