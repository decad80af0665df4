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
