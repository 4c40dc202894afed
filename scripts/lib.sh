# shellcheck shell=bash disable=SC2034
# Shared by the scripts: packages, build folders and messages.

repo=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
build=$repo/build
python=/usr/bin/python3

# Which Debian this is: 12, 13 ...; empty elsewhere.
debian=$(. /etc/os-release && [ "$ID" = debian ] && printf '%s' "${VERSION_ID:-}") || debian=

# The clang that Debian has as its default.
case $debian in
  12) llvm=14 ;;
  *) llvm=19 ;;
esac
llvm=${LLVM_VERSION:-$llvm}
# What clang-format makes of a file differs from one version to the next. The files are in the format of
# this one, which not every Debian has.
format_version=14

run_packages=(dbus python3 python3-dbusmock python3-gi util-linux)
build_packages=(gcc g++ meson ninja-build pkg-config libglib2.0-dev libglib2.0-dev-bin libgpiod-dev)
unit_packages=(libgtest-dev libgmock-dev libxml2-utils lowdown)
service_packages=(
  gir1.2-umockdev-1.0 libglib2.0-bin libxml2-utils lowdown mandoc python3-pytest
  python3-pytest-xdist strace umockdev
)
clang_packages=("clang-$llvm" "libclang-rt-$llvm-dev" "llvm-$llvm")
lint_packages=(libxml2-utils python3-flake8 shellcheck)
[ "$llvm" != "$format_version" ] || lint_packages+=("clang-format-$format_version")
tidy_packages=("clang-$llvm" "clang-tidy-$llvm" "clang-tools-$llvm")
device_packages=(
  bc bison cpio flex g++-mipsel-linux-gnu gcc-mipsel-linux-gnu libelf-dev libssl-dev
  linux-source-6.1 make qemu-system-mips qemu-user xz-utils
)
package_packages=(
  build-essential debhelper dpkg-dev lintian lowdown mmdebstrap python3-pytest systemd systemd-container
)

step() { printf '\n=== %s\n' "$*"; }

as_root() {
  if [ "$(id -u)" -eq 0 ]; then
    "$@"
  else
    sudo "$@"
  fi
}

# Prints those of the given packages that are not installed, each once.
missing_packages() {
  local package
  printf '%s\n' "$@" | sort -u | while read -r package; do
    [ "$(dpkg-query -W -f='${db:Status-Status}' "$package" 2>/dev/null)" = installed ] ||
      printf '%s\n' "$package"
  done
}

# Installs those of the given packages that are missing, and says so when it may not.
require_packages() {
  local missing
  mapfile -t missing < <(missing_packages "$@")
  [ "${#missing[@]}" -gt 0 ] || return 0
  step "Installing ${missing[*]}"
  if ! command -v apt-get >/dev/null; then
    printf 'These packages are needed, by the names that Debian has for them: %s\n' "${missing[*]}" >&2
    return 1
  fi
  if [ "$(id -u)" -ne 0 ] && ! command -v sudo >/dev/null; then
    printf 'These packages are needed and only root can install them: %s\n' "${missing[*]}" >&2
    return 1
  fi
  as_root env DEBIAN_FRONTEND=noninteractive apt-get update -q &&
    as_root env DEBIAN_FRONTEND=noninteractive \
      apt-get install -q -y --no-install-recommends "${missing[@]}"
}

# configure FOLDER OPTION...: a build folder with these options, be it new or there already.
configure() {
  local folder=$1
  shift
  if [ -f "$folder/build.ninja" ]; then
    meson configure "$folder" "$@"
  else
    meson setup "$folder" "$repo" "$@"
  fi
}

# Prints the comment that a script begins with: its help.
print_help() { sed -n '2,/^set /{/^#/s/^# \{0,1\}//p}' "$1"; }
