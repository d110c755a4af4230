#!/usr/bin/env bash
# The units are ones that systemd takes without a word, and confine the daemon as far as they did when this was written.
# shellcheck source-path=SCRIPTDIR source=lib.sh
source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"

readonly most_exposure=15 # In tenths: 0 is confined, 100 is not.
units=$scratch/units
mkdir "$units"
cp "$source_folder"/packaging/systemd/tallyd.{service,socket} "$units"

# The unit's program must be there to be verified.
program=$(sed -n 's/^ExecStart=\([^ ]*\).*/\1/p' "$units/tallyd.service")
expect_equal /usr/sbin/tallyd "$program" "the unit's program"
sed -i "s|^ExecStart=[^ ]*|ExecStart=$build/bin/tallyd|" "$units/tallyd.service"
systemd-analyze verify --man=no "$units/tallyd.service" "$units/tallyd.socket" >"$scratch/verify.log" 2>&1 || {
  show "$scratch/verify.log"
  fail "systemd does not take the units"
}
if grep tallyd "$scratch/verify.log"; then fail "systemd has something to say about the units"; fi

systemd-analyze security --offline=true --threshold=$most_exposure --no-pager "$units/tallyd.service" \
  >"$scratch/security.log" 2>&1 || {
  grep -v '✓' "$scratch/security.log" >&2
  fail "the service is more exposed than it was"
}
grep 'Overall exposure' "$scratch/security.log"

# A unit that systemd can't weigh would have no exposure either.
sed -i '/^CapabilityBoundingSet=/d; /^User=/d' "$units/tallyd.service"
if systemd-analyze security --offline=true --threshold=$most_exposure --no-pager "$units/tallyd.service" >/dev/null 2>&1; then
  fail "the exposure of a service of root's is not noticed"
fi

# What the daemon's own profile lets it write, the service lets it write too.
service=$source_folder/packaging/systemd/tallyd.service
sed -n '/<key>Write</,/<\/array>/s|.*<string>\(.*\)</string>.*|\1|p' \
  "$source_folder/packaging/sandbox/com.quillon.tallyd.plist" >"$scratch/writable"
[[ -s $scratch/writable ]] || fail "the profile names nothing that may be written"
while read -r place; do
  case $place in
    run/*) grep -qx "RuntimeDirectory=${place#run/}" "$service" ;;
    var/lib/*) grep -qx "StateDirectory=${place#var/lib/}" "$service" ;;
    var/log/*) grep -qx "LogsDirectory=${place#var/log/}" "$service" ;;
    system:/dev/null) grep -qx "PrivateDevices=yes" "$service" ;; # It brings its own.
    *) grep -qx "ReadWritePaths=.*/$place" "$service" ;;
  esac || fail "the service may not write to $place"
  case $place in
    system:*) ;;
    *) grep -q "^d /$place 0" "$source_folder/packaging/systemd/tallyd.tmpfiles" || fail "nobody makes $place" ;;
  esac
done <"$scratch/writable"

# The daemon knows the options that the service gives it, and is not killed while it drains.
read -ra options < <(sed -n 's/^ExecStart=[^ ]* *//p' "$service")
"$build/bin/tallyd" "${options[@]}" --no-such-option >"$scratch/options.log" 2>&1 && fail "an unknown option is taken"
grep -q 'not expected: --no-such-option$' "$scratch/options.log" || {
  show "$scratch/options.log"
  fail "the daemon does not take the service's options"
}
drain=$(grep -o -- '--drain [0-9]*' "$service" | cut -d' ' -f2)
patience=$(sed -n 's/^TimeoutStopSec=//p' "$service")
# A dashboard's datagram that nobody acknowledges is given up a tick and a last resort after its session's end.
milliseconds_of() {
  sed -n "s/^  static constexpr Milliseconds $1{\([0-9]*\)};$/\1/p" "$source_folder/src/backends/dashboard/DatagramSender.h"
}
settled=$(($(milliseconds_of kDefaultPeriod) + $(milliseconds_of kLastResortDelay)))
((settled > 0 && drain * 1000 > settled)) || fail "the service drains for $drain s, and a datagram may wait for $settled ms"
((patience > drain)) || fail "the service is killed after $patience s, and may drain for $drain s"
