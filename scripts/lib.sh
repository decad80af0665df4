# Shared by the scripts in this folder: the project's folder and the packages that it requires.
# shellcheck shell=bash

project_dir=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)

say() { printf '\n== %s\n' "$*"; }

die() {
  printf '%s: %s\n' "${0##*/}" "$*" >&2
  exit 1
}

# as_root COMMAND...: runs the command as root, through sudo if necessary.
as_root() {
  if [ "$(id -u)" -eq 0 ]; then
    "$@"
  elif command -v sudo >/dev/null; then
    sudo "$@"
  else
    die "root or sudo is required for: $*"
  fi
}

# need_packages PACKAGE...: installs the Debian packages that are missing.
need_packages() {
  local missing=() package
  for package in "$@"; do
    dpkg-query -W -f '${Status}' "$package" 2>/dev/null | grep -q 'ok installed' ||
      missing+=("$package")
  done
  [ ${#missing[@]} -eq 0 ] && return
  say "installing ${missing[*]}"
  as_root apt-get update -qq
  as_root env DEBIAN_FRONTEND=noninteractive apt-get install -y -qq --no-install-recommends \
    "${missing[@]}" >/dev/null
}

build_packages=(g++ cmake ninja-build pkg-config libboost-dev libjsoncpp-dev libmount-dev
                libsodium-dev libfmt-dev scdoc)
counts_packages=(valgrind)
# What scripts/fuzz needs besides build_packages.
fuzz_packages=(clang libclang-rt-dev)
# What scripts/m32 needs besides build_packages, for 32-bit x86.
m32_packages=(libgtest-dev libgmock-dev git python3 bash zsh fish e2fsprogs btrfs-progs dosfstools
              xfsprogs util-linux procps strace)
coverage_packages=(gcovr)
# What scripts/docs needs besides build_packages.
docs_packages=(doxygen python3-sphinx python3-myst-parser python3-breathe furo mandoc)
test_packages=(libgtest-dev libgmock-dev git bash zsh fish clang clang-format clang-tidy python3 e2fsprogs
               btrfs-progs dosfstools xfsprogs util-linux procps zstd age gpg libcli11-dev binutils
               dpkg-dev abigail-tools systemd devscripts strace "${docs_packages[@]}")
# For install.m32; there is no 32-bit target everywhere.
[ "$(dpkg --print-architecture)" != amd64 ] || test_packages+=(g++-multilib)
# What scripts/bench needs besides build_packages: the peers, and the example service with its tools.
bench_packages=(libbenchmark-dev libre2-dev libctemplate-dev rapidjson-dev libglib2.0-dev libcli11-dev
                zstd git python3)
