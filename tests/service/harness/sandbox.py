"""The private mount namespace that a device lives in.

A holder process keeps the namespace alive and waits on a pipe from the harness. When the pipe
closes, be it by stop() or because the harness died, the holder kills whatever still runs in the
namespace and ends, and the namespace with all its mounts goes with it.
"""

import ctypes
import os
import subprocess
from pathlib import Path
from typing import IO, Mapping, Optional, Sequence

# The device's folders are named relative to the working directory and /tmp is covered last, because
# all of this may itself lie below a folder that gets covered.
_HOLDER = r"""
set -eu
cd "$1"
shift
while [ $# -gt 0 ]; do
  case $1 in
    bind | rbind) mount -n -c "--$1" "$2" "$3" ;;
    tmpfs) mount -n -c -t tmpfs -o "$2" tmpfs "$3" ;;
  esac
  shift 3
done
cd /
echo ready
cat >/dev/null || :
own=$(readlink "/proc/$$/ns/mnt" | tr '[]' '??')
for link in $(find /proc/[0-9]*/ns/mnt -maxdepth 0 -lname "$own" 2>/dev/null); do
  pid=${link#/proc/}
  pid=${pid%%/*}
  [ "$pid" = "$$" ] || kill -9 "$pid" 2>/dev/null || :
done
"""

_COVERED = ("etc", "usr/share", "run", "tmp")
_CLONE_NEWUSER = 0x10000000


def is_real_root() -> bool:
    """Whether every user id exists here, so that the daemon can become another user."""
    first = Path("/proc/self/uid_map").read_text().split()
    return os.geteuid() == 0 and int(first[2]) > 1


class NoMounts(PermissionError):
    """Mounting is not allowed here, in no way that is known; the text says what would help."""

    def __init__(self, reason: str):
        super().__init__(
            f"mounting in a namespace of its own is not allowed here ({reason}): it takes root with"
            " CAP_SYS_ADMIN (a container: --privileged), or user namespaces for everybody"
            " (sysctl kernel.unprivileged_userns_clone=1)"
        )


def _why_no_mount() -> str:
    """Why no mount namespace can be made and mounted in, or nothing."""
    probe = ["unshare", "-m", "mount", "-n", "-t", "tmpfs", "tmpfs", "/tmp"]
    return subprocess.run(probe, stderr=subprocess.PIPE, text=True).stderr.strip()


def become_root() -> None:
    """Makes who may not mount root of a user namespace of its own, in which mounting is allowed.

    To be called before the first thread is started: a process with several threads can't do it.
    Raises NoMounts.
    """
    reason = _why_no_mount() if os.geteuid() == 0 else ""
    if os.geteuid() == 0 and not reason:
        return
    uid, gid = os.geteuid(), os.getegid()
    libc = ctypes.CDLL(None, use_errno=True)
    if libc.unshare(_CLONE_NEWUSER) != 0:
        raise NoMounts(reason or f"unshare: {os.strerror(ctypes.get_errno())}")
    Path("/proc/self/setgroups").write_text("deny")
    Path("/proc/self/uid_map").write_text(f"0 {uid} 1")
    Path("/proc/self/gid_map").write_text(f"0 {gid} 1")
    if reason := _why_no_mount():
        raise NoMounts(reason)


class Sandbox:
    """A folder that programs started through it see as their /etc, /usr/share, /run and /tmp."""

    def __init__(self, root: Path):
        self.root = root
        self._binds: dict[str, Path] = {}
        self._tmpfs: dict[str, str] = {}
        self._holder: Optional[subprocess.Popen] = None
        for folder in _COVERED:
            (root / folder).mkdir(parents=True, exist_ok=True)
        (root / "tmp").chmod(0o1777)

    def bind(self, target: str, source: Path) -> None:
        """Has `target`, which must exist, show the host's `source`; to be called before start()."""
        assert self._holder is None, "the namespace is up already"
        self._binds[target] = source

    def tmpfs(self, target: str, options: str) -> None:
        """Mounts a tmpfs over `target`, which must exist by then; to be called before start()."""
        assert self._holder is None, "the namespace is up already"
        self._tmpfs[target] = options

    def under_root(self, path: str) -> Path:
        """Where the device's folder holds `path`."""
        return self.root / path.lstrip("/")

    def path(self, path: str) -> Path:
        """Where the harness finds `path` of the device. What a tmpfs holds ends with the device."""
        if any(path == mount or path.startswith(mount + "/") for mount in self._tmpfs):
            self.start()
            return Path(f"/proc/{self.pid}/root{path}")
        return self.under_root(path)

    @property
    def pid(self) -> int:
        """A process inside the namespace, alive as long as the namespace."""
        assert self._holder is not None
        return self._holder.pid

    def _mounts(self) -> list[str]:
        words: list[str] = []
        for target, source in self._binds.items():
            words += ["bind", str(source.resolve()), self._mount_point(target)]
        for target, options in self._tmpfs.items():
            words += ["tmpfs", options, self._mount_point(target)]
        for folder in _COVERED:
            words += ["rbind", folder, f"/{folder}"]
        return words

    @staticmethod
    def _mount_point(target: str) -> str:
        """Below a covered folder, what is mounted there must come along when it gets covered."""
        covered = any(target.startswith(f"/{folder}/") for folder in _COVERED)
        return target.lstrip("/") if covered else target

    def start(self) -> None:
        if self._holder is not None:
            return
        self._holder = subprocess.Popen(
            ["unshare", "-m", "sh", "-c", _HOLDER, "holder", str(self.root), *self._mounts()],
            stdin=subprocess.PIPE,
            stdout=subprocess.PIPE,
            stderr=subprocess.PIPE,
            text=True,
            start_new_session=True,
        )
        assert self._holder.stdout is not None and self._holder.stderr is not None
        if self._holder.stdout.readline() != "ready\n":
            reason = self._holder.stderr.read().strip()
            self.stop()
            raise RuntimeError(f"could not make the private mount namespace: {reason}")

    def spawn(
        self, argv: Sequence[str], env: Mapping[str, str], stdout: IO | int, stderr: IO | int,
        stdin: IO | int = subprocess.DEVNULL,
    ) -> subprocess.Popen:  # fmt: skip
        """Starts a program inside; the Popen's pid is the program's own, as nothing forks between.

        Each has a session of its own, so that an interrupt from the terminal reaches only the
        harness, which then ends them in order.
        """
        self.start()
        # In a chroot, the root of the namespace is not the one that the device's folders are in.
        root = f"/proc/{self.pid}/root"
        return subprocess.Popen(
            ["nsenter", f"--mount=/proc/{self.pid}/ns/mnt", f"--root={root}", f"--wd={root}", "--", *argv],
            stdin=stdin,
            stdout=stdout,
            stderr=stderr,
            env=dict(env),
            start_new_session=True,
        )

    def make_read_only(self, folder: str) -> None:
        """Has the programs inside see `folder` empty and not writable from now on, whoever they are."""
        command = ["mount", "-n", "-t", "tmpfs", "-o", "ro", "tmpfs", folder]
        mount = self.spawn(command, {"PATH": os.environ["PATH"]}, subprocess.DEVNULL, subprocess.PIPE)
        _, reason = mount.communicate()
        assert mount.returncode == 0, reason

    def stop(self) -> None:
        """Ends everything that runs in the namespace."""
        if self._holder is None:
            return
        holder, self._holder = self._holder, None
        for pipe in (holder.stdin, holder.stdout, holder.stderr):
            if pipe is not None:
                pipe.close()
        holder.wait()
