"""A clean Debian machine: a root file system of its own, booted in a container by its own systemd."""

import os
import shutil
import signal
import subprocess
import time
from pathlib import Path
from typing import Callable, Optional, TypeVar

T = TypeVar("T")

# A moment on a quiet computer. One that is busy must not be taken for one that can't.
_BOOT_DEADLINE = 150
_HALT_DEADLINE = 30
_POLL_INTERVAL = 0.1


class CannotBoot(Exception):
    """This kernel, or what this process may do with it, does not carry a container."""


def wait_for(condition: Callable[[], T], what: str, timeout: float = 60) -> T:
    deadline = time.monotonic() + timeout
    while True:
        value = condition()
        if value:
            return value
        if time.monotonic() > deadline:
            raise TimeoutError(f"waited {timeout:g} s in vain for {what}")
        time.sleep(_POLL_INTERVAL)


class Root:
    """The file system: unpacked from the archive, removed at the end."""

    def __init__(self, folder: Path, archive: Path):
        self.folder = folder
        folder.mkdir(parents=True)
        subprocess.run(["tar", "-xf", archive, "-C", folder], check=True, timeout=120)

    def path(self, path: str) -> Path:
        return self.folder / path.lstrip("/")

    def write(self, path: str, text: str) -> Path:
        file = self.path(path)
        file.parent.mkdir(parents=True, exist_ok=True)
        file.write_text(text)
        return file

    def add(self, packages: list[Path]) -> list[str]:
        """Puts packages where the machine can install them, and says where that is."""
        inside = self.path("/root/packages")
        inside.mkdir(exist_ok=True)
        for package in packages:
            shutil.copy(package, inside)
        return [f"/root/packages/{package.name}" for package in packages]

    def close(self) -> None:
        shutil.rmtree(self.folder)


class Machine:
    """A booted root. Commands run in it as if they came from a shell of its own."""

    def __init__(self, root: Root):
        self.root = root
        self._console = (root.folder.parent / "console.log").open("w+")
        self._container: Optional[subprocess.Popen] = None
        self._init = 0

    def boot(self) -> None:
        environment = {**os.environ, "SYSTEMD_NSPAWN_API_VFS_WRITABLE": "yes"}
        self._container = subprocess.Popen(
            ["systemd-nspawn", "--quiet", "--directory", self.root.folder, "--boot"]
            + ["--machine", f"portd-test-{os.getpid()}", "--register=no", "--keep-unit"]
            + ["--private-network", "--console=pipe"],
            stdin=subprocess.DEVNULL,
            stdout=self._console,
            stderr=self._console,
            env=environment,
        )
        try:
            self._init = wait_for(self._find_init, "the container's first process")
            wait_for(self._is_up, "the machine to be up", _BOOT_DEADLINE)
        except (TimeoutError, CannotBoot) as reason:
            console = self.console()
            self.close()
            raise CannotBoot(f"{reason}; its console says:\n{console}") from reason

    def _demand_container(self) -> None:
        assert self._container
        if self._container.poll() is not None:
            raise CannotBoot(f"systemd-nspawn ended with status {self._container.returncode}")

    def _find_init(self) -> int:
        self._demand_container()
        assert self._container
        pid = self._container.pid
        children = Path(f"/proc/{pid}/task/{pid}/children").read_text().split()
        return int(children[0]) if children else 0

    def _is_up(self) -> bool:
        self._demand_container()
        state = self.run("systemctl", "is-system-running", check=False).stdout.strip()
        return state in ("running", "degraded")

    def console(self) -> str:
        self._console.flush()
        return Path(self._console.name).read_text(errors="replace")

    def run(
        self, *command: str, check: bool = True, timeout: float = 60
    ) -> subprocess.CompletedProcess:
        result = subprocess.run(
            ["nsenter", "-t", str(self._init), "-m", "-u", "-i", "-n", "-p", "--", "env", "-i"]
            + ["PATH=/usr/sbin:/usr/bin:/sbin:/bin", "DEBIAN_FRONTEND=noninteractive"]
            + ["LC_ALL=C.UTF-8", *command],
            stdin=subprocess.DEVNULL,
            capture_output=True,
            text=True,
            timeout=timeout,
        )
        if check and result.returncode != 0:
            raise AssertionError(
                f"{' '.join(command)}: status {result.returncode}\n{result.stdout}{result.stderr}"
            )
        return result

    def out(self, *command: str) -> str:
        return self.run(*command).stdout.strip()

    def close(self) -> None:
        if self._container:
            self._container.send_signal(signal.SIGTERM)
            try:
                self._container.wait(_HALT_DEADLINE)
            except subprocess.TimeoutExpired:
                self._container.kill()
                self._container.wait()
        self._console.close()
