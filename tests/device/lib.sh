# shellcheck shell=bash disable=SC2034
# Shared by the scripts of the device tier: its folders, its packages, and builds that are made once
# for each state of what goes into them.

tier=$(cd "$(dirname "${BASH_SOURCE[0]}")" && pwd)
# shellcheck source=scripts/lib.sh
source "$tier/../../scripts/lib.sh"
device=$build/device
jobs=$(nproc)

device_packages=(
  bc bison cpio flex g++-mipsel-linux-gnu gcc-mipsel-linux-gnu libelf-dev libssl-dev
  linux-source-6.1 make qemu-system-mips qemu-user xz-utils
)

# stamp TEXT FILE...: a short name for this text and the contents of these files.
stamp() {
  local text=$1
  shift
  { printf '%s\n' "$text" && cat -- "$@"; } | sha256sum | cut -c1-16
}

# made_once NAME STAMP COMMAND...: $device/NAME, made by the command unless the one that is there
# carries this stamp. The command gets the path of a new folder. A half-made folder never counts.
made_once() {
  local folder=$device/$1 want=$2
  shift 2
  [ "$(cat "$folder/.stamp" 2>/dev/null)" != "$want" ] || return 0
  step "Making ${folder#"$repo/"}"
  rm -rf "$folder"
  mkdir -p "$folder"
  "$@" "$folder"
  printf '%s\n' "$want" >"$folder/.stamp"
}

# The unit tests that only the guest can run, as one filter.
unit_in_guest() { grep -v '^#' "$tier/unit-in-guest" | paste -sd:; }
