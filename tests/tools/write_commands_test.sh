#!/usr/bin/env bash
# The zantiff tool's writing commands end to end: PNG pages in and out
# again must keep their pixels; copies keep pages and metadata.
# Usage: write_commands_test.sh ZANTIFF SAMPLE (libtiff's tools on the PATH)
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

# A JPEG stream taken from a page and stored again comes back byte for byte,
# and keeps its pixels; added to an existing file, the other pages stay.
"$tool" jpeg "$work/jpeg.tif" -o "$work/page.jpg"
"$tool" wrap "$work/page.jpg" -o "$work/wrapped.tif" --dpi 150 >/dev/null
tiffinfo "$work/wrapped.tif" 2>/dev/null | grep -q "Resolution: 150, 150 pixels/inch" || fail "wrap: dpi"
"$tool" jpeg "$work/wrapped.tif" -o "$work/again.jpg"
cmp -s "$work/page.jpg" "$work/again.jpg" || fail "wrap: stream changed"
"$tool" wrap "$work/page.jpg" -o "$work/lzw.tif" --append >/dev/null
[ "$(tiffinfo "$work/lzw.tif" 2>/dev/null | grep -c 'Image Width')" = 3 ] || fail "wrap --append: pages"
"$tool" decode "$work/lzw.tif" --page 1 -o "$work/back.png"
cmp -s "$work/back.png" "$work/rgb.png" || fail "wrap --append: first page changed"
# Not a JPEG: refused with the reader's reason.
if "$tool" wrap "$work/rgb.png" -o "$work/x.tif" 2>"$work/err"; then fail "PNG wrapped"; fi
grep -q "JPEG" "$work/err" || fail "wrap: no reason for a PNG"

# A Group 4 stream stored again decodes to the same pixels (the page made
# with libtiff's tools: dithered, and relabelled min-is-white).
tiffcp "$sample,0" "$work/first.tif"
tiff2bw "$work/first.tif" "$work/grey.tif"
tiffdither -c g4 "$work/grey.tif" "$work/g4.tif"
tiffset -s 262 0 "$work/g4.tif"
"$tool" g4 "$work/g4.tif" -o "$work/page.g4"
set -- $(tiffinfo "$work/g4.tif" 2>/dev/null | sed -n 's/.*Image Width: \([0-9]*\) Image Length: \([0-9]*\).*/\1 \2/p')
"$tool" wrap-g4 "$work/page.g4" --width "$1" --height "$2" --white-is-zero -o "$work/rewrapped.tif"
"$tool" decode "$work/g4.tif" -o "$work/a.png"
"$tool" decode "$work/rewrapped.tif" -o "$work/b.png"
cmp -s "$work/a.png" "$work/b.png" || fail "wrap-g4: pixels differ"

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
