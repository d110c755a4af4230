#!/usr/bin/env bash
# Packs what the build folder holds, quickly rather than tightly; the other tests of packages take these. Nothing is compiled.
# shellcheck source-path=SCRIPTDIR source=lib.sh
source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"

packages=$build/tests/packaging/packages
rm -rf "$packages"
mkdir -p "$packages"
umask 022
cpack --config "$build/CPackConfig.cmake" -D CPACK_DEBIAN_COMPRESSION_TYPE=gzip -B "$scratch/packed" >"$scratch/cpack.log" 2>&1 || {
  show "$scratch/cpack.log"
  fail "nothing can be packed"
}
mv "$scratch"/packed/*.deb "$packages"
ls "$packages"
