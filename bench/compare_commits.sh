#!/usr/bin/env bash
# The benchmarks of two commits on this machine, side by side: flags every benchmark that became more than
# 10 % slower from BASE to NEW and exits 1 when there is one.
#
#   bench/compare_commits.sh BASE [NEW]        (NEW defaults to HEAD; any names git understands)
#
# Each commit is checked out into its own worktree under build/compare/ and its benchmark programs built with
# the release preset (ccache makes the second time cheap). The programs both commits have then run in turns,
# BASE, NEW, BASE, NEW…, so that a change in the machine's load falls on both, and each benchmark keeps its
# best rate over the rounds.
#
# FILTER (a --benchmark_filter, default "processor": the in-memory renders on the processor), ROUNDS (default
# 3), MIN_TIME (seconds per benchmark and round, default 0.5) and LIMIT (the flagging threshold in percent,
# default 10) may be set.
set -euo pipefail

[ $# -ge 1 ] && [ $# -le 2 ] || { sed -n '2,6p' "$0" >&2; exit 2; }
root=$(cd "$(dirname "$0")/.." && pwd)
filter=${FILTER:-processor}
rounds=${ROUNDS:-3}
min_time=${MIN_TIME:-0.5}
limit=${LIMIT:-10}
work=$root/build/compare

resolve() { git -C "$root" rev-parse --verify --quiet "$1^{commit}" || { echo "compare_commits: no commit $1" >&2; exit 2; }; }
base=$(resolve "$1")
new=$(resolve "${2:-HEAD}")

# Builds commit $1's benchmark programs in its worktree; prints the folder that holds them.
build() {
  local sha=$1 tree=$work/$1
  if [ ! -d "$tree" ]; then
    git -C "$root" worktree add --detach --quiet "$tree" "$sha"
  fi
  (cd "$tree" && cmake --preset release >/dev/null && cmake --build --preset release -j "$(nproc)" --target bench/all >&2)
  echo "$tree/build/release/bench"
}

echo "compare_commits: building $(git -C "$root" log -1 --format='%h %s' "$base")" >&2
base_bin=$(build "$base")
echo "compare_commits: building $(git -C "$root" log -1 --format='%h %s' "$new")" >&2
new_bin=$(build "$new")

programs=()
for program in "$new_bin"/*_bench; do
  name=$(basename "$program")
  [ -x "$base_bin/$name" ] && programs+=("$name")
done
[ ${#programs[@]} -gt 0 ] || { echo "compare_commits: the two commits share no benchmark program" >&2; exit 2; }

# One round of one commit: "side name rate" lines, rate in Mpx/s, from each program's CSV report.
run() {
  local side=$1 bin=$2 name
  for name in "${programs[@]}"; do
    "$bin/$name" --benchmark_filter="$filter" --benchmark_min_time="$min_time" --benchmark_format=csv \
      2>/dev/null | awk -f "$root/bench/csv_rates.awk" | sed "s/^/$side /"
  done
}

results=$(mktemp)
trap 'rm -f "$results"' EXIT
for round in $(seq "$rounds"); do
  echo "compare_commits: round $round of $rounds" >&2
  run base "$base_bin" >>"$results"
  run new "$new_bin" >>"$results"
done

echo "Benchmarks of $(git -C "$root" log -1 --format=%h "$base") against $(git -C "$root" log -1 --format=%h "$new") on $(uname -n), best of $rounds rounds, Mpx/s:"
awk -v limit="$limit" '
  { key = $2; if (!(key in seen)) { order[++n] = key; seen[key] = 1 }
    if ($1 == "base" && $3 > base[key]) base[key] = $3
    if ($1 == "new" && $3 > fresh[key]) fresh[key] = $3 }
  END {
    printf "%-64s %10s %10s %8s\n", "benchmark", "base", "new", "change"
    slower = 0
    for (i = 1; i <= n; i++) {
      key = order[i]
      if (!(key in base) || !(key in fresh) || base[key] <= 0) continue
      change = 100 * (fresh[key] / base[key] - 1)
      flag = change < -limit ? "  SLOWER" : ""
      if (flag != "") slower++
      printf "%-64s %10.1f %10.1f %7.1f%%%s\n", key, base[key], fresh[key], change, flag
    }
    if (slower) { printf "%d benchmark(s) more than %s%% slower\n", slower, limit; exit 1 }
    printf "none more than %s%% slower\n", limit
  }' "$results"
