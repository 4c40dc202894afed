# shellcheck shell=bash disable=SC2034
# Shared by the scripts of the device tier: its folders, and builds that are made once
# for each state of what goes into them.

tier=$(cd "$(dirname "${BASH_SOURCE[0]}")" && pwd)
# shellcheck source=scripts/lib.sh
source "$tier/../../scripts/lib.sh"
device=$build/device
jobs=$(nproc)

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

# The folder that the clones of this machine share, or nothing: where there is none to be had, one of
# another owner (as sudo may leave it), or where PORTD_CACHE is "no".
shared_folder() {
  local folder=${XDG_CACHE_HOME:-${HOME:+$HOME/.cache}}
  [ "${PORTD_CACHE:-}" != no ] && [ -n "$folder" ] && mkdir -p "$folder/portd" 2>/dev/null &&
    [ -O "$folder/portd" ] && [ -w "$folder/portd" ] && printf '%s' "$folder/portd"
}

# share FOLDER ENTRY: moves the folder there, in one step. Who comes second has made the same.
share() { mv -T "$1" "$2" 2>/dev/null || rm -rf "$1"; }

# Keeps those three states that were used last, and no halves that an interrupted run has left. What
# another clone moves away meanwhile is no matter.
prune_shared() {
  local entry
  find "$1" -maxdepth 1 -name '.new-*' -mmin +300 -exec rm -rf {} + 2>/dev/null || true
  { find "$1" -maxdepth 1 -name "$2-*" -printf '%T@ %p\n' 2>/dev/null || true; } |
    sort -rn | tail -n +4 | cut -d' ' -f2- |
    while IFS= read -r entry; do rm -rf "$entry"; done
}

# shared_once NAME STAMP COMMAND...: as made_once, but made once for all clones where they share a folder.
# $device/NAME is a link into it then.
shared_once() {
  local name=$1 want=$2 shared entry new
  shared=$(shared_folder) || {
    made_once "$@"
    return
  }
  entry=$shared/$name-$want
  if [ "$(cat "$device/$name/.stamp" 2>/dev/null)" != "$want" ]; then
    if [ ! -e "$entry" ]; then
      step "Making ${entry}"
      new=$(mktemp -d "$shared/.new-XXXXXX")
      "${@:3}" "$new"
      printf '%s\n' "$want" >"$new/.stamp"
      share "$new" "$entry"
    fi
    mkdir -p "$device"
    rm -rf "${device:?}/$name"
    ln -s "$entry" "$device/$name"
  fi
  [ ! -e "$entry" ] || touch "$entry"
  prune_shared "$shared" "$name"
}

# The unit tests that only the guest can run, as one filter.
unit_in_guest() { grep -v '^#' "$tier/unit-in-guest" | paste -sd:; }
