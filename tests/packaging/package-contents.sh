#!/usr/bin/env bash
# Each package holds what it should, and says what it is and what it needs.
# shellcheck source-path=SCRIPTDIR source=lib.sh
source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"

packages=$build/tests/packaging/packages
version=$(sed -n 's/^CMAKE_PROJECT_VERSION:STATIC=//p' "$build/CMakeCache.txt")

deb_named() {
  local found=("$packages/$1"_*.deb)
  expect_file "${found[0]}"
  expect_equal 1 "${#found[@]}" "number of packages $1"
  echo "${found[0]}"
}

field() { dpkg-deb --field "$1" "$2"; }
listing() { dpkg-deb --contents "$1" | awk '{ print $6 }'; }

# expect_in DEB PATH...
expect_in() {
  local deb=$1 path
  shift
  listing "$deb" >"$scratch/listing"
  for path in "$@"; do
    grep -qx "\./$path" "$scratch/listing" || fail "$(basename "$deb") has no $path"
  done
}

# expect_needs DEB NAME...
expect_needs() {
  local deb=$1 name
  shift
  for name in "$@"; do
    field "$deb" Depends | grep -qE "(^|, )$name( |,|$)" || fail "$(basename "$deb") does not depend on $name"
  done
}

for deb in "$packages"/*.deb; do
  name=$(field "$deb" Package)
  expect_equal "$version" "$(field "$deb" Version)" "version of $name"
  expect_equal "$(dpkg --print-architecture)" "$(field "$deb" Architecture)" "architecture of $name"
  [[ -n $(field "$deb" Description) && -n $(field "$deb" Maintainer) ]] || fail "$name says nothing about itself"
  expect_in "$deb" "usr/share/doc/$name/copyright" "usr/share/doc/$name/changelog.gz"
  dpkg-deb --fsys-tarfile "$deb" | tar -xO "./usr/share/doc/$name/changelog.gz" | gzip -d | head -n 1 \
    | grep -qF "tallyd ($version)" || fail "the changelog does not begin with version $version"
  # Files are root's; nobody else may change them, and none changes who runs it.
  dpkg-deb --contents "$deb" | awk '$2 != "root/root" || $1 !~ /^l/ && (substr($1, 6, 1) == "w" || substr($1, 9, 1) == "w" || $1 ~ /s/)' \
    >"$scratch/odd"
  [[ ! -s $scratch/odd ]] || fail "odd owners or rights in $name: $(cat "$scratch/odd")"
done

daemon_deb=$(deb_named tallyd)
expect_in "$daemon_deb" usr/sbin/tallyd usr/share/man/man8/tallyd.8.gz usr/share/doc/tallyd/operations.md \
  usr/share/tally/sandbox/com.quillon.tallyd.plist usr/share/tally/Tally.framework/Info.plist \
  usr/lib/systemd/system/tallyd.service usr/lib/systemd/system/tallyd.socket usr/lib/sysusers.d/tallyd.conf \
  usr/lib/tmpfiles.d/tallyd.conf
expect_needs "$daemon_deb" systemd libc6 libcurl4 libseccomp2 libsystemd0 libplist3
dpkg-deb --control "$daemon_deb" "$scratch/control"
for script in postinst prerm postrm; do
  [[ -x $scratch/control/$script ]] || fail "tallyd has no $script"
  sh -n "$scratch/control/$script"
done

tools_deb=$(deb_named tallyd-tools)
for tool in "$build"/bin/tallyctl "$build"/bin/tally-*; do
  tool=$(basename "$tool")
  expect_in "$tools_deb" "usr/bin/$tool" "usr/share/man/man1/$tool.1.gz"
done
expect_needs "$tools_deb" libc6 libcpp-httplib0.11

library_deb=$(deb_named libtally1)
soname=$(listing "$library_deb" | sed -n 's|^\./\(usr/lib/\(.*/\)\?libtally\.so\.1\)$|\1|p')
[[ -n $soname ]] || fail "libtally1 does not hold libtally.so.1"
expect_needs "$library_deb" libc6 libsystemd0
expect_equal "libtally 1 libtally1 (>= $version)" "$(dpkg-deb --info "$library_deb" shlibs)" "who is told to depend on libtally1"
expect_equal "activate-noawait ldconfig" "$(dpkg-deb --info "$library_deb" triggers)" "triggers of libtally1"
development_deb=$(deb_named libtally-dev)
expect_in "$development_deb" usr/include/tally/tally.h "${soname%.1}"
expect_equal "libtally1 (= $version)" "$(field "$development_deb" Depends)" "what libtally-dev depends on"

# Debugging symbols stay at home.
mkdir "$scratch/files"
dpkg-deb --extract "$daemon_deb" "$scratch/files"
if readelf --section-headers --wide "$scratch/files/usr/sbin/tallyd" | grep -q '\.symtab\|\.debug_info'; then
  fail "the daemon is not stripped"
fi
