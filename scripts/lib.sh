# shellcheck shell=bash disable=SC2034
# Shared by the scripts of this folder: packages, build folders and messages.

repo=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
build=$repo/build
python=/usr/bin/python3

run_packages=(dbus python3 python3-dbusmock python3-gi util-linux)
build_packages=(gcc g++ meson ninja-build pkg-config libglib2.0-dev libglib2.0-dev-bin libgpiod-dev)
test_packages=(
  clang-14 clang-format-14 clang-tidy-14 clang-tools-14 libclang-rt-14-dev llvm-14
  libgtest-dev libgmock-dev libumockdev-dev libxml2-utils shellcheck strace umockdev
  python3-pytest python3-pytest-xdist gir1.2-umockdev-1.0
)

step() { printf '\n=== %s\n' "$*"; }

as_root() {
  if [ "$(id -u)" -eq 0 ]; then
    "$@"
  else
    sudo "$@"
  fi
}

# Prints those of the given packages that are not installed.
missing_packages() {
  local package
  for package in "$@"; do
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
  if [ "$(id -u)" -ne 0 ] && ! command -v sudo >/dev/null; then
    printf 'These packages are needed and only root can install them: %s\n' "${missing[*]}" >&2
    return 1
  fi
  as_root env DEBIAN_FRONTEND=noninteractive apt-get update -q
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
