#!/usr/bin/env bash
# What `cmake --install` puts into an empty folder is whole: the daemon runs there, started through its socket and in its
# sandbox, and the installed client reaches it.
# shellcheck source-path=SCRIPTDIR source=lib.sh
source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"

tree=$scratch/tree
DESTDIR=$tree cmake --install "$build" --prefix /usr >"$scratch/install.log" || {
  show "$scratch/install.log"
  fail "nothing can be installed"
}

for file in sbin/tallyd share/tally/sandbox/com.quillon.tallyd.plist share/tally/Tally.framework/Info.plist \
  lib/systemd/system/tallyd.service lib/systemd/system/tallyd.socket lib/sysusers.d/tallyd.conf lib/tmpfiles.d/tallyd.conf; do
  expect_file "$tree/usr/$file"
done
expect_equal usr "$(ls "$tree")" "folders at the top"

# Each program says how it is used, and has a page.
for program in "$tree"/usr/sbin/* "$tree"/usr/bin/*; do
  name=$(basename "$program")
  [[ $("$program" --version) == *[0-9].[0-9]* ]] || fail "$name has no version"
  gzip -t "$tree/usr/share/man/man"[18]"/$name."[18].gz || fail "$name has no page"
done

for completion in "$source_folder"/packaging/completions/*; do
  name=$(basename "$completion")
  compgen -G "$tree/usr/share/*/*completions*/$name" >/dev/null || fail "the completion $name is missing"
done

# Programs are linked with the project's libraries statically: what lies in lib/ is for other programs.
for program in "$tree"/usr/sbin/* "$tree"/usr/bin/*; do
  if ldd "$program" | grep -q 'libtally\|not found'; then fail "$(basename "$program") needs a library of the project's own"; fi
done

start_station "$tree"
configure "$tree"
activate "$tree"
report "$tree" installed
grep -q 'Listener resumes with sandbox' "$scratch/daemon.log" || fail "the daemon does not say that it is in its sandbox"
grep -q 'Running without a sandbox' "$scratch/daemon.log" && fail "the daemon runs without a sandbox"

# The socket is the service manager's, and outlives the daemon.
stop "$daemon"
[[ -S $tree/run/tallyd/com.quillon.tallyd ]] || fail "the daemon took the service manager's socket with it"
