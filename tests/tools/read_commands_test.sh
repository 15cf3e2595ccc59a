#!/usr/bin/env bash
# The zantiff tool's reading commands end to end on the project's sample.
# Usage: read_commands_test.sh ZANTIFF SAMPLE
set -euo pipefail
tool=$1
sample=$2
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
fail() { echo "FAIL: $*" >&2; exit 1; }

"$tool" info "$sample" >"$work/info.txt"
grep -q "^pages: *3" "$work/info.txt" || fail "page count"
grep -q "imageType: *RGB" "$work/info.txt" || fail "first page type"

"$tool" info "$sample" --page 2 --json >"$work/info.json"
grep -q '"imageType": "palette"' "$work/info.json" || fail "JSON of page 2"
grep -q '"name": "ImageDescription"' "$work/info.json" || fail "metadata in JSON"

"$tool" decode "$sample" --page 1 -o "$work/p1.png"
"$tool" decode "$sample" --page 3 -o "$work/p3.png"
head -c 8 "$work/p1.png" | od -An -c | grep -q "P   N   G" || fail "page 1 is no PNG"
# 16-bit grey: PNG colour type 0 and bit depth 16 at bytes 24-25 of the header.
[ "$(od -An -tu1 -j24 -N2 "$work/p3.png" | tr -s ' ')" = " 16 0" ] || fail "page 3 is no 16-bit grey PNG"

if "$tool" info "$sample" --page 9 2>"$work/err"; then fail "page 9 described"; fi
grep -q "Unable to access target page." "$work/err" || fail "no message for page 9"
echo "read commands: ok"
