#!/usr/bin/env bash
# The zantiff tool's writing commands end to end: PNG pages in and out
# again must keep their pixels; copies keep pages and metadata.
# Usage: write_commands_test.sh ZANTIFF SAMPLE (tiffinfo on the PATH)
set -euo pipefail
tool=$1
sample=$2
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
fail() { echo "FAIL: $*" >&2; exit 1; }

"$tool" decode "$sample" --page 1 -o "$work/rgb.png"
"$tool" decode "$sample" --page 2 -o "$work/palette.png"

# Lossless encodings give back the same PNG, page by page.
for compression in none packbits lzw deflate; do
  "$tool" encode "$work/rgb.png" "$work/palette.png" -o "$work/$compression.tif" --compression "$compression" --dpi 300
  [ "$(tiffinfo "$work/$compression.tif" 2>/dev/null | grep -c 'Image Width')" = 2 ] || fail "$compression: pages"
  tiffinfo "$work/$compression.tif" 2>/dev/null | grep -q "Resolution: 300, 300 pixels/inch" || fail "$compression: dpi"
  for page in 1 2; do
    "$tool" decode "$work/$compression.tif" --page $page -o "$work/back.png"
    src=$([ $page = 1 ] && echo rgb || echo palette)
    cmp -s "$work/back.png" "$work/$src.png" || fail "$compression: page $page pixels differ"
  done
done

"$tool" encode "$work/rgb.png" -o "$work/predictor.tif" --compression lzw --predictor
tiffinfo "$work/predictor.tif" 2>/dev/null | grep -q "Predictor: horizontal" || fail "predictor tag"
"$tool" decode "$work/predictor.tif" -o "$work/back.png"
cmp -s "$work/back.png" "$work/rgb.png" || fail "predictor: pixels differ"

"$tool" encode "$work/rgb.png" -o "$work/frame.tif" --frame
tiffinfo "$work/frame.tif" 2>/dev/null | grep -q "Compression Scheme: PackBits" || fail "frame compression"
"$tool" decode "$work/frame.tif" -o "$work/back.png"
cmp -s "$work/back.png" "$work/rgb.png" || fail "frame: pixels differ"

"$tool" encode "$work/rgb.png" -o "$work/jpeg.tif" --compression jpeg
tiffinfo "$work/jpeg.tif" 2>/dev/null | grep -q "Compression Scheme: JPEG" || fail "jpeg compression"

# A copy keeps every page and the description of the first.
"$tool" copy "$sample" -o "$work/copy.tif" --compression lzw
[ "$(tiffinfo "$sample" 2>/dev/null | grep -c 'Image Width')" = \
  "$(tiffinfo "$work/copy.tif" 2>/dev/null | grep -c 'Image Width')" ] || fail "copy: pages"
"$tool" info "$sample" --json | grep -A1 '"ImageDescription"' >"$work/a"
"$tool" info "$work/copy.tif" --json | grep -A1 '"ImageDescription"' >"$work/b" || true
cmp -s "$work/a" "$work/b" || fail "copy: description"

if "$tool" encode "$work/missing.png" -o "$work/x.tif" 2>"$work/err"; then fail "missing input accepted"; fi
[ -s "$work/err" ] || fail "no message for a missing input"
echo "write commands: ok"
