#!/usr/bin/env bash
# Runs every fuzz target for a few seconds, seeded with the project's samples
# and the third-party corpus (read in place). Usage: fuzz-smoke.sh BUILD SECONDS
set -euo pipefail
build=${1:-build-fuzz}
seconds=${2:-30}
here=$(cd "$(dirname "$0")/.." && pwd)
seeds=("$here/fuzz/regressions")
[ -d "$here/samples" ] && seeds+=("$here/samples")
corpus=${ZANTIFF_CORPUS:-$here/../shared/corpus}
[ -d "$corpus" ] && seeds+=("$corpus")
status=0
for target in "$build"/bin/fuzz_*; do
  [ -x "$target" ] || continue
  name=$(basename "$target")
  work=$(mktemp -d)
  # Inputs that once failed come first, then a timed run over all the seeds.
  if [ -d "$here/fuzz/regressions/$name" ] && ! "$target" "$here/fuzz/regressions/$name"/* >"$work.log" 2>&1; then
    tail -n 60 "$work.log"
    status=1
  fi
  echo "fuzz-smoke: $name for ${seconds}s"
  # An input that fails is kept in fuzz-findings/ (ignored by git), to be
  # fixed and then added to fuzz/regressions/.
  mkdir -p "$here/fuzz-findings"
  if ! "$target" "$work" "${seeds[@]}" -max_total_time="$seconds" -timeout=20 \
       -rss_limit_mb=2048 -print_final_stats=1 -artifact_prefix="$here/fuzz-findings/$name-" >"$work.log" 2>&1; then
    tail -n 60 "$work.log"
    status=1
  else
    grep -E "stat::number_of_executed_units|Done" "$work.log" | tail -n 2 || true
  fi
  rm -rf "$work" "$work.log"
done
exit $status
