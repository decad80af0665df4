# A Debian 12 in a folder, for scripts/bare and scripts/m32. Expects lib.sh, and in $work a folder of
# the script in build/.
# shellcheck shell=bash
# shellcheck disable=SC2154  # work

skip() {
  printf 'skipped: %s\n' "$*"
  exit 77
}

# need_debian_root PACKAGE...: what making and entering such a folder requires, besides the packages.
need_debian_root() {
  [ "$(id -u)" -eq 0 ] || skip "root is required to make a Debian in a folder"
  unshare --mount --pid --fork true 2>/dev/null || skip "no namespaces of mounts and processes here"
  need_packages mmdebstrap "$@" || skip "mmdebstrap cannot be installed"
}

# lock_work: only one run at a time in $work, which is cleaned up by clean_up however it ends.
lock_work() {
  mkdir -p "$work"
  exec 9>"$work/lock"
  flock --nonblock 9 || die "another ${0##*/} runs in this build folder"
  trap clean_up EXIT
  trap 'exit 129' HUP
  trap 'exit 130' INT
  trap 'exit 143' TERM
  mkdir -p "$work/archives/partial" "$work/tmp"
  chmod 755 "$work" "$work/tmp"
}

# What runs now. In the background, because a shell handles no signal while it waits for a command
# in the foreground.
running=
as_child() {
  "$@" </dev/null 9>&- &
  running=$!
  local status=0
  wait "$running" || status=$?
  running=
  return $status
}
end_child() {
  if [ -n "$running" ]; then
    kill -KILL "$running" 2>/dev/null || true
    wait
    sleep 1 # the kernel kills the other processes in the root after this one
  fi
}

# The Debian 12 sources of this machine, without the sources of others. None is not a failure.
debian_sources() {
  # shellcheck disable=SC2016
  apt-get indextargets --format 'deb $(REPO_URI) $(RELEASE) $(COMPONENT)' 'Created-By: Packages' \
    'Origin: Debian' | sed -n '/ bookworm/p' | sort -u
}

# How apt of this machine reaches its sources.
apt_settings() {
  apt-config dump | grep -E '^Acquire::(http|https|Check-Date|Check-Valid-Until)\b.* "..*"' || true
  echo 'APT::Get::Assume-Yes "true";' # no terminal, so no answer
}

# make_debian ARCHITECTURE SOURCES FILE: makes a bare Debian from a list of sources, as an archive.
make_debian() {
  local architecture=$1 sources=$2 file=$3 mirror
  apt_settings >"$work/apt.conf"
  mirror=$(sed -n '/ bookworm /{s/^deb \([^ ]*\) .*/\1/p;q}' "$sources")
  [ -n "$mirror" ] || skip "apt of this machine has no list of Debian 12; try apt-get update"
  /usr/lib/apt/apt-helper download-file "${mirror}dists/bookworm/InRelease" "$work/reached" \
    >/dev/null 2>&1 || skip "the mirror of apt cannot be reached"
  say "making a bare Debian 12 ($architecture)"
  # Mounts of its own, so that none is left if this is interrupted. And dpkg need not wait for the
  # disk, because nothing in the root has to survive a power failure.
  as_child env "TMPDIR=$work/tmp" unshare --mount --pid --fork --kill-child \
    mmdebstrap --quiet --mode=root --variant=required "--architectures=$architecture" \
    --include=ca-certificates,git --aptopt="$work/apt.conf" --dpkgopt=force-unsafe-io \
    bookworm "$work/making.tar" "$sources"
  mv "$work/making.tar" "$file"
}

# in_folder ROOT FOLDER [--bind FROM TO]... COMMAND...: runs a command in the folder, as the shell of a
# new user of that Debian would, but with this machine's compiler cache if CCACHE_DIR is set.
in_folder() {
  local root=$1 folder=$2
  local bind=(--bind "$work/archives" /var/cache/apt/archives)
  local set=(HOME=/root LANG=C.UTF-8 TERM=dumb
             PATH=/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin:/sbin:/bin)
  shift 2
  while [ "${1-}" = --bind ]; do
    bind+=("${@:1:3}")
    shift 3
  done
  if [ -n "${CCACHE_DIR-}" ]; then
    bind+=(--bind "$CCACHE_DIR" /var/cache/ccache)
    set+=(CCACHE_DIR=/var/cache/ccache "CCACHE_BASEDIR=$folder" CCACHE_NOHASHDIR=1
          CMAKE_C_COMPILER_LAUNCHER=ccache CMAKE_CXX_COMPILER_LAUNCHER=ccache)
  fi
  as_child scripts/in_root "$root" "${bind[@]}" \
    env --ignore-environment --chdir="$folder" "${set[@]}" "$@"
}

# add_compiler_cache ROOT: installs ccache there if this machine's cache is used.
add_compiler_cache() {
  [ -z "${CCACHE_DIR-}" ] ||
    in_folder "$1" /root sh -c 'apt-get update -qq && apt-get install -qq ccache' >/dev/null
}
