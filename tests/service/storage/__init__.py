"""Storage below the daemon that a test can slow down, hold up and fail, and whose use it can count."""

import errno
import subprocess
from pathlib import Path

from harness import Device

_SHIM = Path(__file__).with_name("shim.c")
_FOLDER = "/run/storage"
_LIBRARY = "/run/storage.so"
_HANG_MS = 3_600_000


class Storage:
    def __init__(self, device: Device, folder: Path):
        self.device = device
        library = folder / "storage.so"
        subprocess.run(
            ["cc", "-shared", "-fPIC", "-O1", "-o", str(library), str(_SHIM), "-ldl"], check=True
        )
        device.write(_LIBRARY, "")
        device.sandbox.bind(_LIBRARY, library)
        device.mkdir(_FOLDER)
        device.write(f"{_FOLDER}/log", "").chmod(0o666)
        plain = device._environment

        def environment() -> dict[str, str]:
            env = plain()
            env["LD_PRELOAD"] = _LIBRARY
            if device.sanitized:
                env["ASAN_OPTIONS"] = env.get("ASAN_OPTIONS", "") + ":verify_asan_link_order=0"
            return env

        device._environment = environment  # type: ignore[method-assign]

    def sync_takes(self, milliseconds: int) -> None:
        self._control("delay", milliseconds)

    def hang(self) -> None:
        """Every sync takes until sync_takes() or release()."""
        self.sync_takes(_HANG_MS)

    def release(self) -> None:
        self.sync_takes(0)

    def fail(self, code: int = errno.EIO) -> None:
        """The settings file can be neither looked for nor opened until mend()."""
        self._control("errno", code)

    def mend(self) -> None:
        self._control("errno", 0)

    def _control(self, name: str, value: int) -> None:
        # Replaced as a whole: the daemon may be reading it.
        path = self.device.write(f"{_FOLDER}/{name}.new", str(value))
        path.chmod(0o644)
        path.rename(path.with_suffix(""))

    def forget(self) -> None:
        self.device.write(f"{_FOLDER}/log", "")

    def _asked(self, what: str) -> list[str]:
        lines = self.device.read(f"{_FOLDER}/log").splitlines()
        return [line.partition(" ")[2] for line in lines if line.startswith(what + " ")]

    def syncs(self) -> list[str]:
        """The files that the daemon began to sync."""
        return self._asked("fsync")

    def replaced(self) -> list[str]:
        """The files that the daemon put in place."""
        return self._asked("rename")
