"""What can be shown of the packages without a service manager: in the folder of the machine, with a
bus and the daemon started by hand.

The tests follow one another in one folder, in the order in which they stand here.
"""

import subprocess

SETTINGS = "/etc/portd/portd.conf"

# As the unit starts it, but for the sandbox.
_START = """
mkdir -p /run/dbus
dbus-daemon --system --fork
portd >/run/portd.log 2>&1 &
until gdbus introspect --system -d com.kelv.IOControl.State -o / >/dev/null 2>&1; do
  [ -e "/proc/$!" ] || { cat /run/portd.log; exit 1; }
done
call() {
  method=$1
  shift
  gdbus call --system -d com.kelv.IOControl.State -o /com/kelv/IOControl/State \
    -m "com.kelv.IOControl.State.$method" "$@"
}
"""

_ENTER = """
mount -t proc proc "$0/proc"
mount -t tmpfs tmpfs "$0/run"
exec chroot "$0" sh -euc "$1"
"""


def inside(root, script: str) -> str:
    """Runs the script in the folder, with processes and mounts of its own that end with it."""
    own = ["unshare", "--mount", "--pid", "--fork", "--kill-child", "--"]
    result = subprocess.run(
        [*own, "sh", "-euc", _ENTER, root.folder, script],
        env={"PATH": "/usr/sbin:/usr/bin:/sbin:/bin", "DEBIAN_FRONTEND": "noninteractive"},
        stdin=subprocess.DEVNULL,
        capture_output=True,
        text=True,
        timeout=120,
    )
    assert result.returncode == 0, result.stdout + result.stderr
    return result.stdout.strip()


def test_installing_makes_account_group_and_folders(root, packages):
    names = root.add([packages[name] for name in sorted(packages)])
    inside(root, f"dpkg --install {' '.join(names)}")
    assert inside(root, "id -un pcd; stat -c '%U %G' /etc/portd") == "pcd\npcd pcd"
    assert "portd" in inside(root, "systemctl --root=/ is-enabled portd.service && echo portd")


def test_unit_is_sound(root):
    inside(root, "systemd-analyze verify --man=no /lib/systemd/system/portd.service")


def test_daemon_serves_as_the_service_account(root):
    script = "call SetName 1 false Siren; call GetNbrPorts; stat -c %U /proc/$!"
    assert inside(root, _START + script).splitlines() == ["()", "(uint32 1, uint32 2)", "pcd"]


def test_settings_survive_a_restart(root):
    assert "'Siren'" in inside(root, _START + "call GetNames 1")


def test_daemon_ends_well(root):
    assert inside(root, _START + "kill $!; wait $!; echo $?") == "0"


def test_removing_leaves_the_settings_and_purging_does_not(root, packages):
    names = " ".join(sorted(packages, reverse=True))
    inside(root, f"dpkg --remove {names}; ! test -e /usr/bin/portd; test -e {SETTINGS}")
    inside(root, f"dpkg --purge {names}; ! test -e /etc/portd; ! test -e /etc/default/portd")
