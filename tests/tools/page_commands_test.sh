#!/usr/bin/env bash
# The zantiff tool's page commands end to end, checked with libtiff's tiffinfo.
# Usage: page_commands_test.sh ZANTIFF MAKE_INPUTS
set -euo pipefail
tool=$1
make_inputs=$2
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
fail() { echo "FAIL: $*" >&2; exit 1; }
pages() { tiffinfo "$1" 2>/dev/null | grep -c "^TIFF Directory" || true; }

"$make_inputs" multipage "$work/multi.tif"
[ "$(pages "$work/multi.tif")" -eq 200 ] || fail "input has not 200 pages"

"$tool" split "$work/multi.tif" -o "$work/page" >/dev/null
[ -f "$work/page0200.tif" ] && [ ! -f "$work/page0201.tif" ] || fail "split did not write 200 files"
[ "$(pages "$work/page0007.tif")" -eq 1 ] || fail "a split page is not a one-page TIFF"

"$tool" extract "$work/multi.tif" 3 -o "$work/three.tif"
cmp -s "$work/three.tif" "$work/page0003.tif" || fail "extract and split differ for page 3"
if "$tool" extract "$work/multi.tif" 201 -o "$work/none.tif" 2>"$work/err"; then fail "page 201 extracted"; fi
grep -q "Specified page beyond" "$work/err" || fail "no message for page 201"
[ ! -e "$work/none.tif" ] || fail "a failed extraction left its file"

cp "$work/page0001.tif" "$work/joined.tif"
"$tool" append "$work/joined.tif" "$work/page0002.tif" "$work/three.tif"
[ "$(pages "$work/joined.tif")" -eq 3 ] || fail "append did not give 3 pages"

"$tool" set-tags "$work/three.tif" ImageDescription="set by the tool" 282=150 PageNumber=1,3
info=$(tiffinfo "$work/three.tif" 2>/dev/null)
grep -q "ImageDescription: set by the tool" <<<"$info" || fail "description not set"
grep -q "Resolution: 150" <<<"$info" || fail "resolution not set"
grep -q "Page Number: 1-3" <<<"$info" || fail "page number not set"
if "$tool" set-tags "$work/three.tif" NoSuchTag=1 2>/dev/null; then fail "unknown tag accepted"; fi
# Several files at once (for batch jobs): each described or split, and the
# status names the files that failed.
"$tool" split "$work/three.tif" "$work/joined.tif" -o "$work/many_" >/dev/null
[ -f "$work/many_three_0001.tif" ] && [ -f "$work/many_joined_0003.tif" ] || fail "split of several files"
if "$tool" info "$work/three.tif" "$work/missing.tif" "$work/joined.tif" --json >"$work/out" 2>"$work/err"; then
  fail "info with a missing file succeeded"
fi
grep -q "info failed for 1 of 3 file(s): $work/missing.tif" "$work/err" || fail "the failed file is not named"
[ "$(grep -c '^{"file":' "$work/out")" = 2 ] || fail "info: not one line a file"
echo "page commands: ok"
