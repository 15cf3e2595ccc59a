#!/usr/bin/env bash
# Runs every benchmark program and writes bench/RESULTS.md: each Module_X
# case next to its reference case(s) Y_X measured in the same run, with the
# ratio reference time / module time (above 1: the module is faster).
# Usage: run-bench.sh BUILD
set -euo pipefail
build=${1:-build}
here=$(cd "$(dirname "$0")/.." && pwd)
out="$here/bench/RESULTS.md"
csv=$(mktemp)
trap 'rm -f "$csv"' EXIT

for program in "$build"/bin/bench_*; do
  [ -x "$program" ] || continue
  # Only Google Benchmark programs: they list their cases when asked.
  "$program" --benchmark_list_tests >/dev/null 2>&1 || continue
  echo "run-bench: $(basename "$program")" >&2
  "$program" --benchmark_format=csv --benchmark_repetitions=5 \
      --benchmark_report_aggregates_only=true 2>/dev/null | grep '_median' >>"$csv" || true
done

{
  echo "# Benchmark results"
  echo
  echo "Recorded by \`make bench\` on $(date -u +%Y-%m-%d) — $(nproc) cores,"
  echo "$(grep -m1 'model name' /proc/cpuinfo | cut -d: -f2 | sed 's/^ *//'), $(uname -sr)."
  echo "Median of 5 repetitions; ratio = reference time / module time (above 1: the module is faster)."
  echo
  echo "| case | module (ms) | reference | reference (ms) | ratio |"
  echo "|---|---|---|---|---|"
  awk -F, '
    { name=$1; gsub(/"/, "", name); sub(/_median$/, "", name); sub(/\/iterations:[0-9]+$/, "", name);
      t=$3; unit=$5; gsub(/"/, "", unit);
      if (unit == "ns") t /= 1e6; else if (unit == "us") t /= 1e3; else if (unit == "s") t *= 1e3;
      # Module_Case or Module/Case (BENCHMARK_CAPTURE) against Reference_Case or Reference/Case.
      split_at = index(name, "/"); if (split_at == 0) split_at = index(name, "_");
      who = substr(name, 1, split_at - 1); what = substr(name, split_at + 1);
      time[who "|" what] = t; if (who == "Module") cases[what] = 1; else refs[what] = refs[what] " " who }
    END {
      for (c in cases) { n = split(refs[c], r, " ");
        for (i = 1; i <= n; i++) printf "| %s | %.3f | %s | %.3f | %.2f |\n",
          c, time["Module|" c], r[i], time[r[i] "|" c], time[r[i] "|" c] / time["Module|" c] } }' "$csv" | sort
  echo
  echo "## File-level page operations (commands, wall time)"
  echo
  echo "The zantiff tool against libtiff's tools and a plain copy of the same bytes;"
  echo "ratio = reference time / zantiff time. Peak memory is the peak RSS of the process."
  echo
  "$here/bench/pageops.sh" "$build" 5
} >"$out"
cat "$out"
