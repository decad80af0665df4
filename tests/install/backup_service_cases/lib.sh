# Shared by the cases: a machine with one volume below /mnt, fresh file systems on /mnt and /tmp, the
# service, and replacements for the programs that the service starts.
# shellcheck shell=bash

# There are two file systems, so that a case can fill one. A mount path has at most 35 bytes.
make_machine() {
  umount -l /mnt /tmp /usr/bin/{tar,zstd,age,gpg} 2>/dev/null || true
  mount -t tmpfs -o size=64m tmpfs /tmp
  mount -t tmpfs -o strictatime,size=64m tmpfs /mnt
  mkdir -m 700 /tmp/key
  mkdir -p /mnt/vol/archives /mnt/src
  printf '%s\n' '[volume one]' 'path="/mnt/vol"' 'fsType=2' '[secret]' \
    'keyFile="/tmp/key/master"' >/tmp/platform.conf
  chmod 600 /tmp/platform.conf
}

service() { "$program" --tasks /tmp/tasks.conf "$@"; }

# add NAME [OPTION]...: adds a task for /mnt/src and prints its number.
add() {
  local name=$1
  shift
  service add --name "$name" --source /mnt/src --destination /mnt/vol/archives "$@"
}

# exits STATUS TEXT ARGUMENT...: checks the exit status of the service, and that its output (for 0) or
# its error output contains the text.
exits() {
  local expected=$1 text=$2 status=0 output=/tmp/err
  shift 2
  service "$@" >/tmp/out 2>/tmp/err || status=$?
  [ "$status" = "$expected" ] || fail "$*: exit status $status, not $expected: $(cat /tmp/err)"
  [ "$status" != 0 ] || output=/tmp/out
  [ -z "$text" ] || grep -qF -- "$text" $output || fail "$*: no '$text' in $(cat /tmp/out /tmp/err)"
}

# run_fails TEXT TASK: checks that a run ends with status 1, that its report and the task contain the
# text, that there is no new archive, and that nothing is left behind.
run_fails() {
  local status=0 before
  before=$(archives)
  service run "$2" >/tmp/out 2>/tmp/err || status=$?
  [ "$status" = 1 ] || fail "exit status $status, not 1: $(cat /tmp/out /tmp/err)"
  grep -qF -- "$1" /tmp/out || fail "not reported: '$1', but: $(cat /tmp/out /tmp/err)"
  recorded "$2" lastReport | grep -F >/dev/null -- "$1" || fail "not recorded: '$1'"
  [ "$(archives)" = "$before" ] || fail "another archive: $(archives)"
  nothing_left
}

recorded() { service status "$1" | sed -n "s/^$2: //p"; }

# There are no files but archives, and no programs of a run.
nothing_left() {
  local left
  left=$(find /mnt/vol /tmp/kovabackup/session /tmp/scoped* /tmp/backup_service* -regextype posix-extended \
    -mindepth 1 ! -name .kova_tmp ! -path /mnt/vol/archives \
    ! -regex '/mnt/vol/archives/[^./][^/]*-[0-9]{8}T[0-9]{6}\.[0-9]{3}Z\.tar\.zst(\.age|\.gpg)?' \
    2>/dev/null || true)
  [ -z "$left" ] || fail "left behind: $left"
  no_programs || fail "programs are left: $(ps -eo pid,ppid,args)"
}
no_programs() { ! ps -eo stat=,comm= | grep -v '^Z' | grep -qE ' (tar|zstd|age|gpg|gpg-agent|backup_service)$'; }

archives() { find /mnt/vol/archives -name "${1:-*}" -type f | sort; }
archive_of() {
  local found
  found=$(archives "$1-*")
  [ "$(wc -l <<<"$found")" = 1 ] && [ -n "$found" ] || fail "not one archive of $1: '$found'"
  echo "$found"
}
entries() { zstd -dc "$1" | tar -t; }

# replace PROGRAM: replaces it with the script on standard input; the original is in /tmp/real/.
replace() {
  local path name=${1##*/}
  path=$(realpath "$1")
  mkdir -p /tmp/real /tmp/fake
  cp "$path" "/tmp/real/$name"
  { printf '#!/bin/bash\n'; cat; } >"/tmp/fake/$name"
  chmod 755 "/tmp/fake/$name"
  mount --bind "/tmp/fake/$name" "$path"
}
put_back() { umount "$(realpath "$1")"; }

# hold PROGRAM: makes it write its PID into /tmp/held before it does its work, and then wait for ever.
hold() {
  [ -p /tmp/held ] || mkfifo /tmp/held
  replace "$1" <<'END'
echo $$ >/tmp/held
exec sleep infinity
END
}

# start TASK: starts a run in the background with the default action for SIGINT; sets run to its PID.
start() {
  env --default-signal=INT "$program" --tasks /tmp/tasks.conf run "$1" >/tmp/out 2>/tmp/err &
  run=$!
}
# ended: waits for that run and sets ended to its exit status.
ended() {
  ended=0
  wait "$run" || ended=$?
}
gone() { [ ! -e "/proc/$1" ] || [ "$(cut -d' ' -f3 "/proc/$1/stat")" = Z ]; }
until_true() { # COMMAND...: waits until it succeeds, at most 60 seconds
  local deadline=$((SECONDS + 60))
  until "$@"; do
    [ $SECONDS -lt $deadline ] || fail "never came true: $*"
    sleep 0.02
  done
}
# held: waits for a held program and sets child to its PID.
held() { read -t 60 -r child <>/tmp/held || fail "nothing was held: $(cat /tmp/err)"; }
