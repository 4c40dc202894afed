"""The built portctl, run against a device's bus from outside of its sandbox."""

import json
import os
import signal
import subprocess
from pathlib import Path
from typing import Any, Iterator, Optional

from harness import Device, default_binary, scale

OK, REFUSED, USAGE, NO_PORT, NOT_ALLOWED, NO_DAEMON, TIMEOUT = range(7)


def binary() -> Path:
    """PORTCTL_BINARY, or the one that was built beside the daemon."""
    beside = default_binary().parent / "portctl/portctl"
    return Path(os.environ.get("PORTCTL_BINARY", beside)).absolute()


def _environment(**extra: str) -> dict[str, str]:
    env = {key: value for key, value in os.environ.items() if key not in ("NO_COLOR", "TERM")}
    return env | {"LC_ALL": "C.UTF-8", "TZ": "UTC"} | extra


def run(*words: str, timeout: float = 10, **extra: str) -> subprocess.CompletedProcess:
    """portctl without a device."""
    return subprocess.run(
        [binary(), *words], capture_output=True, text=True, errors="surrogateescape",
        env=_environment(**extra), timeout=timeout * scale(), stdin=subprocess.DEVNULL,
    )  # fmt: skip


class Portctl:
    """portctl on the bus of a device."""

    def __init__(self, device: Device):
        self._device = device

    def _arguments(self, words: tuple[str, ...]) -> list[str]:
        return ["--address", self._device.bus.address, *words]

    def run(self, *words: str, **extra: str) -> subprocess.CompletedProcess:
        return run(*self._arguments(words), **extra)

    def __call__(self, *words: str) -> str:
        """What a run that must succeed prints."""
        done = self.run(*words)
        assert (done.returncode, done.stderr) == (OK, ""), done
        return done.stdout

    def json(self, *words: str) -> Any:
        return json.loads(self(*words, "--json"))

    def fails(self, status: int, *words: str) -> str:
        """What a run that must fail says."""
        done = self.run(*words)
        assert (done.returncode, done.stdout) == (status, ""), done
        assert done.stderr.startswith("portctl: ")
        return done.stderr

    def start(self, *words: str, stdout: Optional[int] = subprocess.PIPE) -> subprocess.Popen:
        """One that goes on; its output is read line by line."""
        return subprocess.Popen(
            [binary(), *self._arguments(words)], stdout=stdout, stderr=subprocess.PIPE, text=True,
            env=_environment(), stdin=subprocess.DEVNULL,
        )  # fmt: skip


class Follower:
    """A running portctl whose lines are read as they come."""

    def __init__(self, process: subprocess.Popen):
        self._process = process

    def line(self) -> str:
        assert self._process.stdout is not None
        line = self._process.stdout.readline()
        assert line, "portctl has ended"
        return line.rstrip("\n")

    def until_line(self, end: str) -> None:
        while not self.line().endswith(end):
            pass

    def until(self, kind: str, **members: Any) -> dict[str, Any]:
        while True:
            entry = json.loads(self.line())
            if entry["kind"] == kind and members.items() <= entry.items():
                return entry

    def end(self, number: int = signal.SIGINT) -> tuple[int, str]:
        self._process.send_signal(number)
        _, said = self._process.communicate(timeout=20 * scale())
        return self._process.returncode, said

    def wait(self) -> int:
        self._process.communicate(timeout=20 * scale())
        return self._process.returncode

    def close(self) -> None:
        if self._process.poll() is None:
            self._process.kill()
        self._process.communicate()


def follow_commands(device: Device) -> Iterator:
    """A fixture: starts portctl with commands that go on, and ends those that a test leaves."""
    followers = []

    def begin(*words: str) -> Follower:
        followers.append(Follower(Portctl(device).start(*words)))
        return followers[-1]

    yield begin
    for follower in followers:
        follower.close()
