#!/usr/bin/env bash
# The packages' whole life in a small system of their own: installed, used, installed again, removed, purged. Afterwards
# nothing is left but the daemon's user and what the operator wrote.
# shellcheck source-path=SCRIPTDIR source=lib.sh
source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"

packages=$build/tests/packaging/packages
root=$scratch/system

# A merged /usr, the package manager's files, and somebody to own things: all that these packages ask of a system. What they
# depend on is the host's.
make_system() {
  local folder
  mkdir -p "$root"/usr/{bin,sbin,lib,include,share/doc,share/man} "$root"/{etc/systemd/system,run,tmp} "$root"/var/{lib/systemd,log} \
    "$root"/var/lib/dpkg/{info,updates,triggers}
  # Folders that nobody else uses would go with the packages.
  for folder in "$root"/usr/{bin,sbin,lib,include,share/doc,share/man}; do touch "$folder/of-another-package"; done
  for folder in bin sbin lib; do ln -s "usr/$folder" "$root/$folder"; done
  touch "$root/var/lib/dpkg/status"
  echo 'root:x:0:0:root:/root:/bin/sh' >"$root/etc/passwd"
  echo 'root:x:0:' >"$root/etc/group"
}

# Maintainer scripts run outside of the system and get to know where it lies, as it has no shell.
dpkg_there() {
  dpkg --root="$root" --force-script-chrootless --force-depends --log="$scratch/dpkg-actions.log" "$@" \
    >"$scratch/dpkg.log" 2>&1 || {
    show "$scratch/dpkg.log"
    fail "dpkg $*"
  }
}

state_of() { dpkg-query --admindir="$root/var/lib/dpkg" --showformat='${db:Status-Status}' --show "$1" 2>/dev/null || true; }

inventory() { (cd "$root" && find . -path ./var/lib/dpkg -prune -o -print | LC_ALL=C sort); }

# What is on file about users, with the copies and the lock that the program which adds one leaves.
readonly user_files='./etc/\.pwd\.lock|./etc/g?shadow-?|./etc/(passwd|group)-'
# The administrator's choices about services are kept here; the folder stays when it is empty.
readonly service_records='./var/lib/systemd/deb-systemd-helper-(enabled|masked).*|./etc/systemd/system/sockets.target.wants'
readonly operators_files='./etc/tally.*|./usr/share/tally(/Tally.framework(/Resources(/publicKey.der)?)?)?'

make_system
inventory >"$scratch/before"
wanted=$root/etc/systemd/system/sockets.target.wants/tallyd.socket

echo "Installing"
dpkg_there --install "$packages"/*.deb
expect_equal installed "$(state_of tallyd)" "state of tallyd"
user=$(user_id "$root")
[[ $user =~ ^[1-9][0-9]*$ ]] || fail "the daemon has no user of its own"
expect_owner "$user" 755 "$root/run/tallyd"
expect_owner "$user" 750 "$root/var/lib/tallyd"
expect_owner "$user" 750 "$root/var/log/tallyd"
expect_owner "$user" 755 "$root/var/mobile/Library/Logs/CrashReporter/Retired"
expect_owner 0 755 "$root/var/mobile/Library/Logs/CrashReporter"
expect_owner 0 755 "$root/etc/tally/preferences"
[[ -L $wanted ]] || fail "the socket is not enabled"

echo "Using it"
start_station "$root"
configure "$root"
if [[ $TRULY_ROOT == yes ]]; then
  activate "$root" "$(command -v setpriv)" --reuid="$user" --regid="$user" --clear-groups --bounding-set=-all
else
  activate "$root"
fi
report "$root" packaged
logs=$root/var/mobile/Library/Logs/CrashReporter/Retired
wait_until "the message log is written" compgen -G "$logs/tallyd_*_messageLog.diag" >/dev/null
expect_file "$root/var/lib/tallyd/com.quillon.tallyd.plist"
[[ $TRULY_ROOT == no ]] || expect_equal "$user" "$(stat -c %u "$root/var/lib/tallyd/com.quillon.tallyd.plist")" "who ran the daemon"
stop "$daemon"

echo "Installing it again, after the administrator has turned it off"
rm "$wanted"
dpkg_there --install "$packages"/tallyd_*.deb
expect_gone "$wanted"
expect_file "$root/var/lib/tallyd/com.quillon.tallyd.plist"
expect_equal "$user" "$(user_id "$root")" "the daemon's user"

echo "Removing"
echo "another program's" >"$logs/other.diag"
dpkg_there --remove tallyd tallyd-tools libtally1 libtally-dev
expect_gone "$root/usr/sbin/tallyd"
expect_gone "$root/usr/bin/tallyctl"
expect_gone "$root/run/tallyd"
expect_file "$root/var/lib/tallyd/com.quillon.tallyd.plist"
compgen -G "$logs/tallyd_*_messageLog.diag" >/dev/null || fail "the message log went with the program"

echo "Purging"
dpkg_there --purge tallyd tallyd-tools libtally1 libtally-dev
expect_file "$logs/other.diag"
rm -r "$root/var/mobile"
expect_file "$root/etc/tally/preferences/com.quillon.tally.plist"
inventory | LC_ALL=C comm -13 "$scratch/before" - >"$scratch/new"
grep -vxE "$user_files|$service_records|$operators_files" "$scratch/new" >"$scratch/left" || true
[[ ! -s $scratch/left ]] || fail "left behind: $(cat "$scratch/left")"
inventory | LC_ALL=C comm -23 "$scratch/before" - >"$scratch/lost"
[[ ! -s $scratch/lost ]] || fail "taken away: $(cat "$scratch/lost")"

echo "Installing and purging it, unused"
rm -r "$root/etc/tally" "$root/usr/share/tally"
dpkg_there --install "$packages"/tallyd_*.deb
[[ -L $wanted ]] || fail "the socket is not enabled again"
dpkg_there --purge tallyd
expect_gone "$root/etc/tally"
expect_gone "$root/var/mobile"
expect_gone "$root/usr/share/tally"
expect_gone "$wanted"
