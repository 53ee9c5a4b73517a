#!/usr/bin/env bash
# How much faster two threads render than one, in memory: every benchmark program's RGBA8 renders on the
# processor (the motion blur's in tiles of 1024), best of REPS repetitions (default 4) of each, with the rate
# at 2 threads over the rate at 1. Build the release preset first.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
bin=${BENCH_DIR:-$root/build/release/bench}
printf '%-64s %9s %9s %7s\n' benchmark "1 thread" "2 threads" ratio
for program in "$bin"/*_bench; do
  "$program" --benchmark_filter='(rgba8|RGBA8).*processor|MotionBlur.*tile:1024/threads' --benchmark_min_time=0.3 \
    --benchmark_repetitions="${REPS:-4}" --benchmark_format=csv 2>/dev/null |
    awk -f "$root/bench/csv_rates.awk" |
    awk '$2 > best[$1] { best[$1] = $2 }
      END { for (name in best) if (name ~ /threads:1/) {
              other = name; sub(/threads:1/, "threads:2", other)
              if (other in best) {
                shown = name; sub(/\/threads:1/, "", shown)
                printf "%-64s %9.1f %9.1f %6.2fx\n", shown, best[name], best[other], best[other] / best[name] } } }'
done
