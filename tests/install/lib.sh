# Shared by the checks of this folder.
# shellcheck shell=bash

source_dir=$(cd "$(dirname "${BASH_SOURCE[0]}")/../.." && pwd)
build_dir=${KOVA_BUILD_DIR:?the build folder to check}
scratch=$(mktemp -d "$build_dir/check.XXXXXX")
trap 'rm -rf "$scratch"' EXIT

fail() {
  printf 'failed: %s\n' "$*" >&2
  exit 1
}

# CTest counts exit status 77 as skipped.
skip() {
  printf 'skipped: %s\n' "$*"
  exit 77
}

# Include flags of the given packages, as those of system headers: their warnings are not ours.
package_flags() { pkg-config --cflags "$@" | sed 's/-I/-isystem /g'; }

# relink MAP LIBRARY [OBJECT...]: links the library anew from the objects of the build, under
# another list of exports. An object that is given takes the place of the one of its name.
relink() {
  local map=$1 library=$2 object replaced=() kept=()
  shift 2
  for object in "$@"; do replaced+=(! -name "$(basename "$object")"); done
  mapfile -t kept < <(find "$build_dir/CMakeFiles/kovabackup_objects.dir" -name '*.o' "${replaced[@]}")
  [ ${#kept[@]} -gt 0 ] || fail "no objects in $build_dir"
  g++ -shared -Wl,-soname,libkovabackup-util.so.1 "-Wl,--version-script=$map" \
    -o "$library" "${kept[@]}" "$@" -ljsoncpp
}

# Skips where the baseline of the interface does not apply.
can_watch_abi() {
  command -v abidiff >/dev/null || skip "needs abidiff (package abigail-tools)"
  [ "$(uname -m)" = x86_64 ] || skip "the baseline is that of x86-64"
  readelf -p .comment "$build_dir/libkovabackup-util.so" | grep GCC >/dev/null ||
    skip "the baseline is that of g++, and this is another compiler's library"
}
