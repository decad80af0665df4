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

# built_library NAME: the file of libkovabackup-NAME in the build folder.
built_library() {
  local folder=$build_dir
  [ "$1" = util ] || folder+=/$1
  realpath "$folder/libkovabackup-$1.so"
}

# export_map NAME: the version script of libkovabackup-NAME.
export_map() {
  case $1 in
    util) echo "$source_dir/cmake/exports.map" ;;
    *) echo "$source_dir/cmake/$1_exports.map" ;;
  esac
}

# relink NAME MAP FILE [OBJECT...]: links libkovabackup-NAME again from the objects of the build into
# FILE, with the version script MAP. Each given object replaces the one of the same name. The build
# folder may still contain objects of sources that were renamed or removed.
relink() {
  local name=$1 map=$2 file=$3 object source replaced=() kept=()
  local objects=CMakeFiles/kovabackup_$1_objects.dir sources=$source_dir
  [ "$name" = util ] || { objects=$name/$objects sources+=/$name; }
  objects=$build_dir/$objects
  shift 3
  for object in "$@"; do replaced+=(! -name "$(basename "$object")"); done
  while read -r object; do
    source=$sources/${object#"$objects/"}
    [ ! -e "${source%.o}" ] || kept+=("$object")
  done < <(find "$objects" -name '*.o' "${replaced[@]}")
  [ ${#kept[@]} -gt 0 ] || fail "no objects in $objects"
  g++ -shared "-Wl,-soname,libkovabackup-$name.so.1" "-Wl,--version-script=$map" \
    -o "$file" "${kept[@]}" "$@" -ljsoncpp
}

# Skips the check where the baseline in abi/ does not apply.
can_watch_abi() {
  command -v abidiff >/dev/null || skip "needs abidiff (package abigail-tools)"
  [ "$(uname -m)" = x86_64 ] || skip "the baseline is for x86-64"
  readelf -p .comment "$build_dir/libkovabackup-util.so" | grep GCC >/dev/null ||
    skip "the baseline is for g++; another compiler built this library"
}
