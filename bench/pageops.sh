#!/usr/bin/env bash
# Page extraction and concatenation through the zantiff tool, side by side
# with libtiff's tiffcp and tiffsplit and with a plain copy of the same bytes
# (cat), on a 200-page 8-bit LZW file and on a ~200 MB single-page file; and
# a ~30 MB JPEG wrapped as a page against cp.
# Wall time is the median of RUNS runs; memory is the peak RSS reported by
# /usr/bin/time -v. Prints a Markdown table.
# Usage: pageops.sh BUILD [RUNS]
set -euo pipefail
build=${1:-build}
runs=${2:-5}
tool="$build/bin/zantiff"
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

"$build/bin/make_bench_inputs" multipage "$work/multi.tif"
"$build/bin/make_bench_inputs" large "$work/large.tif"
"$build/bin/make_bench_inputs" jpeg "$work/photo.jpg"
"$build/bin/make_bench_inputs" sample "$work/small.tif"
printf 'II*\0\0\0\0\0' >"$work/empty.tif"   # a TIFF without pages to append to

# measure PREPARE COMMAND...: runs PREPARE, then COMMAND, RUNS times; prints
# "median-seconds peak-kilobytes" (time from the clock, memory from
# /usr/bin/time).
measure() {
  local prepare=$1; shift
  local times=() peak=0
  for ((i = 0; i < runs; i++)); do
    eval "$prepare"
    local start end
    start=$(date +%s%N)
    # A reference that fails would measure nothing: stop instead.
    if ! /usr/bin/time -f '%M' -o "$work/time" "$@" >/dev/null 2>"$work/stderr"; then
      echo "pageops.sh: failed: $*" >&2
      cat "$work/stderr" >&2
      exit 1
    fi
    end=$(date +%s%N)
    times+=("$(( (end - start) / 1000 ))")
    local kb
    kb=$(tail -n 1 "$work/time")
    [ "$kb" -gt "$peak" ] && peak=$kb
  done
  local median
  median=$(printf '%s\n' "${times[@]}" | sort -n | awk '{a[NR]=$1} END {printf "%.4f", a[int((NR+1)/2)] / 1e6}')
  echo "$median $peak"
}

row() {  # case, zantiff result, reference name, reference result
  local z=($2) r=($4)
  awk -v c="$1" -v zt="${z[0]}" -v zm="${z[1]}" -v rn="$3" -v rt="${r[0]}" -v rm="${r[1]}" 'BEGIN {
    ratio = (zt > 0) ? rt / zt : 0;
    printf "| %s | %.4f | %.1f | %s | %.4f | %.1f | %.2f |\n", c, zt, zm / 1024, rn, rt, rm / 1024, ratio }'
}

echo "| case | zantiff (s) | zantiff peak (MB) | reference | reference (s) | reference peak (MB) | ratio |"
echo "|---|---|---|---|---|---|---|"

# Start-up: one small page (160 x 120) extracted, so that the rows below can
# be read with each tool's cost of starting a process in mind.
row "start-up: extract a small page" "$(measure "rm -f $work/one.tif" "$tool" extract "$work/small.tif" 1 -o "$work/one.tif")" \
    tiffcp "$(measure "rm -f $work/one.tif" tiffcp "$work/small.tif,0" "$work/one.tif")"

# Every page of the 200-page file into its own file; the plain copy of the
# same bytes into 200 files is coreutils' split. The pieces go to their own
# folder, so that clearing them between runs touches no other input.
mkdir "$work/pieces"
z=$(measure "rm -f $work/pieces/*" "$tool" split "$work/multi.tif" -o "$work/pieces/p")
row "split 200 pages" "$z" tiffsplit "$(measure "rm -f $work/pieces/*" tiffsplit "$work/multi.tif" "$work/pieces/p")"
row "split 200 pages" "$z" "split -n 200 (same bytes)" \
    "$(measure "rm -f $work/pieces/*" split -n 200 "$work/multi.tif" "$work/pieces/p")"

# Every page of the 200-page file, one command a page (process start-up,
# the first row, is part of each).
cat >"$work/each-zantiff.sh" <<SCRIPT
for p in \$(seq 1 200); do "$tool" extract "$work/multi.tif" \$p -o "$work/one.tif"; done
SCRIPT
cat >"$work/each-tiffcp.sh" <<SCRIPT
for p in \$(seq 0 199); do tiffcp "$work/multi.tif,\$p" "$work/one.tif"; done
SCRIPT
row "extract each of 200 pages" "$(measure "" sh "$work/each-zantiff.sh")" tiffcp \
    "$(measure "" sh "$work/each-tiffcp.sh")"

# All 200 pages appended to a file without pages.
z=$(measure "cp $work/empty.tif $work/dest.tif" "$tool" append "$work/dest.tif" "$work/multi.tif")
row "append 200 pages" "$z" tiffcp "$(measure "rm -f $work/out.tif" tiffcp "$work/multi.tif" "$work/out.tif")"
row "append 200 pages" "$z" "cat (same bytes)" \
    "$(measure "rm -f $work/copy.tif" sh -c "cat $work/empty.tif $work/multi.tif > $work/copy.tif")"

# The ~200 MB page.
z=$(measure "rm -f $work/one.tif" "$tool" extract "$work/large.tif" 1 -o "$work/one.tif")
row "extract 200 MB page" "$z" tiffcp "$(measure "rm -f $work/one.tif" tiffcp "$work/large.tif" "$work/one.tif")"
row "extract 200 MB page" "$z" "cat (same bytes)" \
    "$(measure "rm -f $work/copy.tif" sh -c "cat $work/large.tif > $work/copy.tif")"
z=$(measure "cp $work/empty.tif $work/dest.tif" "$tool" append "$work/dest.tif" "$work/large.tif")
row "append 200 MB page" "$z" tiffcp "$(measure "rm -f $work/out.tif" tiffcp "$work/large.tif" "$work/out.tif")"
row "append 200 MB page" "$z" "cat (same bytes)" \
    "$(measure "rm -f $work/copy.tif" sh -c "cat $work/empty.tif $work/large.tif > $work/copy.tif")"

# A ~30 MB JPEG stored as a TIFF page without re-encoding, against cp of the
# same bytes (which copies inside the kernel where it can).
z=$(measure "rm -f $work/wrapped.tif" "$tool" wrap "$work/photo.jpg" -o "$work/wrapped.tif")
row "wrap 30 MB JPEG" "$z" "cp (same bytes)" "$(measure "rm -f $work/copy.jpg" cp "$work/photo.jpg" "$work/copy.jpg")"
