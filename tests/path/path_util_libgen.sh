#!/bin/sh
# Builds and runs the callers of path_util_libgen_test with a single compiler, in every language
# standard that the public headers support.
# Usage: path_util_libgen.sh COMPILER SOURCE_DIR LIBRARY
set -eu
compiler=$1 source_dir=$2 library=$3
command -v "$compiler" >/dev/null || { echo "skipped: no $compiler"; exit 77; }
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
for standard in 11 14 17 20; do
  "$compiler" -std=c++$standard -Wall -Wextra -Wpedantic -Werror \
    -I"$source_dir/include" -I"$source_dir" "$source_dir"/tests/path/path_util_libgen_*.cpp \
    "$library" -Wl,-rpath,"$(dirname "$library")" -o "$work/program"
  "$work/program"
  echo "$compiler -std=c++$standard: as expected"
done
