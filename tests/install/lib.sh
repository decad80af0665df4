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

# The include flags of packages, marked as system headers so that their warnings are suppressed.
package_flags() { pkg-config --cflags "$@" | sed 's/-I/-isystem /g'; }

# relink MAP LIBRARY [OBJECT...]: links the library again from the objects of the build, with the
# version script MAP. Each given object replaces the one of the same name. The build folder may still
# contain objects of sources that were renamed or removed.
relink() {
  local map=$1 library=$2 object source replaced=() kept=()
  local objects=$build_dir/CMakeFiles/kovabackup_objects.dir
  shift 2
  for object in "$@"; do replaced+=(! -name "$(basename "$object")"); done
  while read -r object; do
    source=$source_dir/${object#"$objects/"}
    [ ! -e "${source%.o}" ] || kept+=("$object")
  done < <(find "$objects" -name '*.o' "${replaced[@]}")
  [ ${#kept[@]} -gt 0 ] || fail "no objects in $build_dir"
  g++ -shared -Wl,-soname,libkovabackup-util.so.1 "-Wl,--version-script=$map" \
    -o "$library" "${kept[@]}" "$@" -ljsoncpp
}

# Skips the check where the baseline in abi/ does not apply.
can_watch_abi() {
  command -v abidiff >/dev/null || skip "needs abidiff (package abigail-tools)"
  [ "$(uname -m)" = x86_64 ] || skip "the baseline is for x86-64"
  readelf -p .comment "$build_dir/libkovabackup-util.so" | grep GCC >/dev/null ||
    skip "the baseline is for g++; another compiler built this library"
}
