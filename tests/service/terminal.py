"""A terminal that programs run on, and what stands on its screen."""

import fcntl
import os
import pty
import re
import select
import signal
import struct
import subprocess
import termios
import time
from pathlib import Path
from typing import Callable, Optional

from harness import scale

TAKEN, GIVEN_BACK = "\x1b[?1049h", "\x1b[?1049l"
_MOVE = re.compile(r"\x1b\[(\d+);1H")
_SGR = re.compile(r"\x1b\[[\d;]*m")


class Terminal:
    """Understands what a program that draws line by line writes, which is not much."""

    def __init__(
        self, arguments: list[str | Path], env: dict[str, str], columns: int, rows: int,
        cwd: Optional[Path] = None,
    ):  # fmt: skip
        self._master, self._slave = pty.openpty()
        self._resize(columns, rows)
        self.settings = termios.tcgetattr(self._slave)
        self._written = ""
        self.process = subprocess.Popen(
            arguments, stdin=self._slave, stdout=self._slave, stderr=subprocess.PIPE, env=env,
            cwd=cwd, start_new_session=True,
        )  # fmt: skip

    def _resize(self, columns: int, rows: int) -> None:
        self.columns, self.rows = columns, rows
        size = struct.pack("HHHH", rows, columns, 0, 0)
        fcntl.ioctl(self._slave, termios.TIOCSWINSZ, size)

    def resize(self, columns: int, rows: int) -> None:
        self._resize(columns, rows)
        self.process.send_signal(signal.SIGWINCH)

    def type(self, keys: str) -> None:
        os.write(self._master, keys.encode())

    def read(self, seconds: float = 0.1) -> str:
        """Everything written so far, after a look for more."""
        while select.select([self._master], [], [], seconds)[0]:
            self._written += os.read(self._master, 65536).decode(errors="replace")
            seconds = 0
        return self._written

    def screen(self) -> list[str]:
        """The lines as they stand there now, without styles."""
        written = self.read()
        lines = [""] * 200
        parts = _MOVE.split(written[written.rfind("\x1b[2J"):])
        for row, text in zip(parts[1::2], parts[2::2]):
            # One write may end within a line.
            lines[int(row) - 1] = _SGR.sub("", text.split("\x1b[K")[0]).rstrip("\r\n")
        return lines[: self.rows]

    def wait_for(self, matches: Callable[[str], object]) -> list[str]:
        deadline = time.monotonic() + 20 * scale()
        while not matches("\n".join(self.screen())):
            assert time.monotonic() < deadline, "\n".join(self.screen())
            assert self.process.poll() is None, self.process.communicate()[1]
        return self.screen()

    def wait_text(self, text: str) -> list[str]:
        return self.wait_for(lambda screen: text in screen)

    def wait_exit(self) -> int:
        """The exit status; the terminal has everything that was written by then."""
        status = self.process.wait(20 * scale())
        self.read()
        return status

    @property
    def is_as_before(self) -> bool:
        return termios.tcgetattr(self._slave) == self.settings and self._written.rstrip().endswith(
            GIVEN_BACK
        )

    def close(self) -> None:
        if self.process.poll() is None:
            self.process.kill()
        self.process.communicate()
        os.close(self._master)
        os.close(self._slave)
