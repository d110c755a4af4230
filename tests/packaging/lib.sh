# shellcheck shell=bash disable=SC2034
# What the packaging tests share: checks, a scratch folder, and the daemon at work in an installed tree. Sourced with the build
# folder as the script's first argument. What it sets is for the scripts, which is more than the linter sees.
#
# Packages are installed by root. Where a test is not, it goes on under fakeroot; its programs run as who it really is.

set -euo pipefail

[[ $# -ge 1 ]] || {
  echo "Usage: $0 BUILD-FOLDER" >&2
  exit 2
}
build=$(realpath "$1")
source_folder=$(realpath "$(dirname "${BASH_SOURCE[0]}")/../..")
export PATH=$PATH:/usr/sbin:/sbin

if [[ -z ${TRULY_ROOT:-} ]]; then
  if [[ $(id -u) -eq 0 ]]; then
    export TRULY_ROOT=yes
  else
    TRULY_ROOT=no exec fakeroot -- "$0" "$@"
  fi
fi

scratch=$(mktemp -d)
chmod 755 "$scratch" # The daemon's user passes through it.
started=()

clean_up() {
  local pid
  for pid in "${started[@]}"; do kill "$pid" 2>/dev/null || true; done
  for pid in "${started[@]}"; do wait "$pid" 2>/dev/null || true; done
  rm -rf "$scratch"
}
trap clean_up EXIT

fail() {
  printf 'FAILED: %s\n' "$*" >&2
  exit 1
}

# The log of what failed is worth more than the failure.
show() {
  local file
  for file in "$@"; do
    [[ -s $file ]] && sed "s|^|$(basename "$file"): |" "$file" >&2
  done
  return 0
}

expect_file() { [[ -f $1 && ! -L $1 ]] || fail "there is no file $1"; }
expect_folder() { [[ -d $1 && ! -L $1 ]] || fail "there is no folder $1"; }
expect_gone() { [[ ! -e $1 && ! -L $1 ]] || fail "$1 is still there"; }

# expect_equal EXPECTED ACTUAL WHAT
expect_equal() { [[ $1 == "$2" ]] || fail "$3: '$2' instead of '$1'"; }

# expect_owner USER-ID MODE PATH
expect_owner() { expect_equal "$1 $2" "$(stat -c '%u %a' "$3")" "owner and mode of $3"; }

# wait_until WHAT COMMAND...: until the command succeeds; a test that waits for more than a minute has failed.
wait_until() {
  local deadline=$((SECONDS + 60)) what=$1
  shift
  until "$@"; do
    [[ $SECONDS -lt $deadline ]] || {
      show "$scratch"/*.log
      fail "waited in vain: $what"
    }
    sleep 0.05
  done
}

# in_background LOG COMMAND...: what it starts ends with the test. The sandbox leaves no room for fakeroot's library.
in_background() {
  local log=$1
  shift
  env -u LD_PRELOAD "$@" >"$log" 2>&1 &
  started+=($!)
}

stop() {
  kill "$1"
  wait "$1" 2>/dev/null || true
}

# user_id ROOT: of the daemon's user there.
user_id() { awk -F: '$1 == "tallyd" { print $3 }' "$1/etc/passwd"; }

# start_station TREE: the installed station, serving a storebag; sets port and station.
start_station() {
  station=$scratch/station
  mkdir -p "$station/bags"
  in_background "$scratch/station.log" "$1/usr/bin/tally-station" --directory "$station" --port 0
  wait_until "the station starts" test -s "$station/station.json"
  port=$(sed -E 's/.*"https_port": *([0-9]+).*/\1/' "$station/station.json")
  echo '{ version = "1.0"; release = { splunk = {
    clients = ( { client = studio; locale_whitelist = (US); sampling_threshold = 1; filters = (); } );
  }; }; }' >"$station/bags/playhall.plist"
}

# configure ROOT: what an operator writes before the daemon is of use.
configure() {
  local root=$1
  mkdir -p "$root/etc/tally/preferences" "$root/usr/share/tally/Tally.framework/Resources"
  cp "$station/ca.pem" "$root/etc/tally/"
  cp "$station/publicKey.der" "$root/usr/share/tally/Tally.framework/Resources/"
  echo '{ DeviceName = Workbench; }' >"$root/etc/tally/device.plist"
  echo '{ DiagnosticLogSubmissionEnabled = YES; }' >"$root/etc/tally/preferences/com.quillon.diagnostics.plist"
  printf '{ tally_storebag_url = "https://127.0.0.1:%s/bags/sorrel"; httpsPostURL = "https://127.0.0.1:%s/events"; }\n' \
    "$port" "$port" >"$root/etc/tally/preferences/com.quillon.tally.plist"
}

# activate ROOT [COMMAND...]: holds the socket and starts the daemon, through COMMAND, at the first connection; sets daemon.
activate() {
  local root=$1 socket=$1/run/tallyd/com.quillon.tallyd
  shift
  mkdir -p "$(dirname "$socket")"
  in_background "$scratch/daemon.log" systemd-socket-activate --listen="$socket" --setenv=LC_ALL=en_US.UTF-8 \
    "$@" "$root/usr/sbin/tallyd" --root "$root" --log stderr
  daemon=$!
  wait_until "the socket is held" test -S "$socket"
  chmod 666 "$socket"
}

# report ROOT VALUE: one message through the installed client, which must arrive at the station.
report() {
  local root=$1 value=$2
  env -u LD_PRELOAD "$root/usr/bin/tallyctl" --root "$root" report --client-type 5 --client-name Studio \
    --service-name Calls --category 4 --type 0 "mark=$value" >"$scratch/client.log" 2>&1 || {
    show "$scratch"/*.log
    fail "the client can't report"
  }
  wait_until "the event arrives" grep -qs "\"mark\":\"$value\"" "$station/events.jsonl"
}
