#!/usr/bin/env bash
# A real fuzzing run: every target of BUILD until SECONDS have passed or RUNS
# inputs have been tried, whichever comes first, over the project's seeds and
# the third-party corpus. Each target keeps its growing corpus in
# BUILD/corpus-<target>, and what crashes in BUILD/findings-<target>/; the
# summary gives executions and findings per target.
# Usage: fuzz-campaign.sh BUILD [SECONDS] [RUNS] [TARGET...]
set -uo pipefail
build=${1:-build-fuzz}
seconds=${2:-1200}
runs=${3:-2000000}
shift $(( $# < 3 ? $# : 3 ))
here=$(cd "$(dirname "$0")/.." && pwd)
corpus=${ZANTIFF_CORPUS:-$here/../shared/corpus}
targets=("$@")
[ ${#targets[@]} -eq 0 ] && for t in "$build"/bin/fuzz_*; do [ -x "$t" ] && targets+=("$(basename "$t")"); done
for name in "${targets[@]}"; do
  work="$build/corpus-$name" findings="$build/findings-$name"
  mkdir -p "$work" "$findings"
  seeds=("$here/fuzz/regressions")
  [ -d "$here/samples" ] && seeds+=("$here/samples")
  [ -d "$corpus" ] && seeds+=("$corpus")
  log="$build/campaign-$name.log"
  "$build/bin/$name" "$work" "${seeds[@]}" -max_total_time="$seconds" -runs="$runs" -timeout=20 \
    -rss_limit_mb=2048 -print_final_stats=1 -artifact_prefix="$findings/" >"$log" 2>&1
  status=$?
  executed=$(grep -o 'stat::number_of_executed_units: *[0-9]*' "$log" | grep -o '[0-9]*$' | tail -n 1)
  found=$(find "$findings" -type f | wc -l)
  echo "$name: exit $status, ${executed:-?} executions, $found findings"
done
