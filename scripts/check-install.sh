#!/usr/bin/env bash
# Installs BUILD into a temporary prefix and builds the example host against
# the installed package twice, with CMake (find_package) and with pkg-config,
# then runs both builds on every page of the sample. A broken install fails.
# Usage: check-install.sh BUILD SAMPLE
set -euo pipefail
build=${1:-build}
sample=${2:-samples/demo-multipage.tif}
here=$(cd "$(dirname "$0")/.." && pwd)
prefix=$(mktemp -d)
trap 'rm -rf "$prefix"' EXIT
fail() { echo "check-install: $*" >&2; exit 1; }

cmake --install "$build" --prefix "$prefix/usr" >/dev/null
nm -D --defined-only "$prefix/usr/lib/libzantiff.so.1" | grep -c ' T zan' | grep -qx 22 || fail "not 22 exports"
[ "$(readlink "$prefix/usr/lib/libzantiff.so.1")" = libzantiff.so.1.1.8 ] || fail "SONAME link"
"$prefix/usr/bin/zantiff" --version >/dev/null || fail "the installed tool does not run"

# With CMake.
cmake -S "$here/examples" -B "$prefix/cmake-build" -G Ninja -DCMAKE_PREFIX_PATH="$prefix/usr" >/dev/null
cmake --build "$prefix/cmake-build" >/dev/null
# With pkg-config (the run-time path set as a host would).
export PKG_CONFIG_PATH="$prefix/usr/lib/pkgconfig"
libdir=$(pkg-config --variable=libdir zantiff)
cc -std=c99 -Wall -Wextra -pedantic -Werror "$here/examples/minimal-host.c" -o "$prefix/pc-host" \
   $(pkg-config --cflags --libs zantiff) -Wl,-rpath,"$libdir"

for page in 1 2 3; do
  "$prefix/cmake-build/minimal-host" "$sample" $page "$prefix/a$page.pnm"
  "$prefix/pc-host" "$sample" $page "$prefix/b$page.pnm"
  cmp -s "$prefix/a$page.pnm" "$prefix/b$page.pnm" || fail "page $page: the two builds differ"
  head -c 2 "$prefix/a$page.pnm" | grep -q '^P[56]' || fail "page $page: not a PNM"
done
echo "check-install: ok (installed, example built with CMake and pkg-config, 3 pages written)"
