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

# The whole page in one call gives the same pixels as its lines.
"$tool" decode "$sample" --page 1 --frame -o "$work/f1.png"
"$tool" decode "$sample" --page 3 --frame -o "$work/f3.png"
cmp -s "$work/p1.png" "$work/f1.png" || fail "frame of page 1 differs from its lines"
cmp -s "$work/p3.png" "$work/f3.png" || fail "16-bit frame of page 3 differs from its lines"

# Pages of other compressions cannot be passed through: a reason, a failing
# status and no file.
if "$tool" jpeg "$sample" --page 1 -o "$work/p1.jpg" 2>"$work/err"; then fail "LZW page passed as JPEG"; fi
grep -q "cannot be passed through as JPEG" "$work/err" || fail "no reason for the refused JPEG"
[ ! -e "$work/p1.jpg" ] || fail "a refused JPEG left a file"
if "$tool" g4 "$sample" --page 1 -o "$work/p1.g4" 2>/dev/null; then fail "LZW page passed as Group 4"; fi

# The first page fed in pieces (from a file, and through a pipe) gives the
# same lines; a cut stream says how far it got and fails.
"$tool" decode --stream "$sample" -o "$work/s1.png"
cmp -s "$work/p1.png" "$work/s1.png" || fail "streamed page differs from its lines"
cat "$sample" | "$tool" decode --stream - --chunk 7 -o "$work/s1.png"
cmp -s "$work/p1.png" "$work/s1.png" || fail "page streamed through a pipe differs"
if head -c 5000 "$sample" | "$tool" decode --stream - -o "$work/cut.png" 2>"$work/err"; then fail "cut stream accepted"; fi
grep -q "the input ended after" "$work/err" || fail "no message for a cut stream"

if "$tool" info "$sample" --page 9 2>"$work/err"; then fail "page 9 described"; fi
grep -q "Unable to access target page." "$work/err" || fail "no message for page 9"
echo "read commands: ok"
