# Shared by the cases: a machine with one volume below /mnt, fresh file systems on /mnt and /tmp, the
# service, and replacements for the programs that the service starts.
# shellcheck shell=bash

# There are two file systems, so that a case can fill one. A mount path has at most 35 bytes.
make_machine() {
  umount -l /mnt /tmp /usr/bin/tar /usr/bin/openssl /usr/bin/cp 2>/dev/null || true
  mount -t tmpfs -o size=64m tmpfs /tmp
  mount -t tmpfs -o strictatime,size=64m tmpfs /mnt
  mkdir -m 700 /tmp/key
  mkdir -p /mnt/vol/archives /mnt/src
  printf '%s\n' '[volume one]' 'path="/mnt/vol"' 'fsType=2' '[secret]' \
    'keyFile="/tmp/key/master"' >/tmp/platform.conf
  chmod 600 /tmp/platform.conf
}

service() { "$program" --tasks /tmp/tasks.conf "$@"; }

# add NAME [OPTION]...: adds a task for /mnt/src and prints its id.
add() {
  local name=$1
  shift
  service add --name "$name" --source /mnt/src --destination /mnt/vol/archives --volume max "$@"
}

# run_fails STATUS TEXT TASK: checks that a run ends with the status, that its error output, its
# report and the task contain the text, and that nothing is left behind.
run_fails() {
  local status=0
  service run "$3" >/tmp/out 2>/tmp/err || status=$?
  [ "$status" = "$1" ] || fail "exit status $status, not $1: $(cat /tmp/err)"
  grep -qF -- "$2" /tmp/err || fail "no message '$2', but: $(cat /tmp/err)"
  grep -qF -- "$2" /tmp/out || fail "not reported: '$2', but: $(cat /tmp/out)"
  recorded "$3" lastResult | grep -F >/dev/null -- "$2" || fail "not recorded: '$2'"
  nothing_left
}

recorded() { service status "$1" | sed -n "s/^$2: //p"; }

nothing_left() {
  local left
  left=$(find /mnt/vol /tmp/kovabackup/session /tmp/scoped* -mindepth 1 ! -name .kova_tmp \
    ! -name __sess__.lock ! -path '/mnt/vol/archives' \
    ! -regex '/mnt/vol/archives/[^./][^/]*-[0-9]*T[0-9]*Z\(-[0-9]*\)?\.tar\(\.enc\)?' 2>/dev/null || true)
  [ -z "$left" ] || fail "left behind: $left"
}

archives() { find /mnt/vol/archives -name "${1:-*}"; }
archive_of() {
  local found
  found=$(archives "$1-*")
  [ "$(wc -l <<<"$found")" = 1 ] && [ -n "$found" ] || fail "not one archive of $1: '$found'"
  echo "$found"
}

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
restore() { umount "$(realpath "$1")"; }

# hold PROGRAM: makes it do its work, write its PID into /tmp/held and then wait.
hold() {
  mkfifo /tmp/held
  replace "$1" <<END
/tmp/real/${1##*/} "\$@"
echo \$\$ >/tmp/held
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
