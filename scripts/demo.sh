#!/usr/bin/env bash
# Shows the command-line tool at work on the project's own sample.
# Usage: demo.sh PATH-TO-zantiff
set -euo pipefail
tool=${1:-build/bin/zantiff}
here=$(cd "$(dirname "$0")/.." && pwd)
sample="$here/samples/demo-multipage.tif"
out=$(mktemp -d)
trap 'rm -rf "$out"' EXIT
run() { echo "\$ zantiff $*"; "$tool" "$@"; echo; }

run --version
run --help
run info "$sample"
run info "$sample" --page 3 --json
run decode "$sample" --page 1 -o "$out/page1.png"
run decode "$sample" --page 2 -o "$out/page2.png"
run split "$sample" -o "$out/page"
run extract "$sample" 3 -o "$out/third.tif"
run info "$out/third.tif"
run encode "$out/page1.png" "$out/page2.png" -o "$out/encoded.tif" --compression lzw --dpi 300
run copy "$sample" -o "$out/copy.tif" --compression deflate
run info "$out/copy.tif" --page 2
run decode "$sample" --stream --chunk 4096 -o "$out/streamed.png"
run encode "$out/page1.png" -o "$out/jpeg.tif" --compression jpeg
run jpeg "$out/jpeg.tif" -o "$out/page1.jpg"
run wrap "$out/page1.jpg" -o "$out/wrapped.tif" --dpi 150
ls -l "$out"
