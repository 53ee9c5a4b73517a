#!/usr/bin/env bash
# Per-pixel equations side by side, in one run and with 1 and 2 threads: the expression language's bytecode
# and its OpenCL text (expression_bench, 4096 × 4096), ImageMagick's -fx, and a libvips chain of operations
# computing the same values.
#
#   (a) sin(x / 20) * 0.5 + 0.5                                   one channel
#   (b) n = noise(x / 64, y / 64); r = hypot(x - w/2, y - h/2) / w;
#       vec3(n * 0.5 + 0.5, fract(r * 8), (x + y) / (w + h) * (1 - abs(n)))   three channels
#
# -fx has no coherent noise, so its (b) uses sin(i/64)*cos(j/64) in its place; libvips uses its perlin
# operation. -fx runs on 1024 × 1024 (it takes about 30 s per channel on 4096 × 4096 here); its rate per
# pixel does not depend on the size. A peer's time is its wall time less the same command without the
# equation. Prints a table of Mpix/s (pixels of the whole result per second).
#
#   bench/compare_expression.sh        EXPRESSION_BENCH (default build/release/bench/expression_bench),
#                                      RUNS (best of, default 3) and WORK (scratch folder) may be set.
set -euo pipefail

root=$(cd "$(dirname "$0")/.." && pwd)
bench=${EXPRESSION_BENCH:-$root/build/release/bench/expression_bench}
runs=${RUNS:-3}
work=${WORK:-${TMPDIR:-/tmp}/rastertools-expression-peers}
mkdir -p "$work"
[ -x "$bench" ] || { echo "compare_expression: build first: $bench is missing" >&2; exit 1; }
for tool in convert vips bc; do
  command -v $tool >/dev/null || { echo "compare_expression: needs $tool (imagemagick, libvips-tools, bc)" >&2; exit 1; }
done

# Best wall time of a command over RUNS, in seconds.
best() {
  local best_time=""
  for _ in $(seq "$runs"); do
    local start end t
    start=$(date +%s.%N)
    "$@" >/dev/null 2>&1
    end=$(date +%s.%N)
    t=$(echo "$end - $start" | bc -l)
    if [ -z "$best_time" ] || [ "$(echo "$t < $best_time" | bc -l)" = 1 ]; then best_time=$t; fi
  done
  echo "$best_time"
}

rate() { # pixels seconds -> Mpix/s
  echo "scale=2; $1 / ($2 * 1000000)" | bc -l
}

# ---- ImageMagick -fx on 1024 × 1024
fx_size=1024
fx_a() { convert -limit thread "$1" -size ${fx_size}x${fx_size} xc:black -channel R -fx 'sin(i/20)*0.5+0.5' +channel null:; }
fx_b() {
  convert -limit thread "$1" -size ${fx_size}x${fx_size} xc:black \
    -channel R -fx 'sin(i/64)*cos(j/64)*0.5+0.5' \
    -channel G -fx 'r=hypot(i-w/2,j-h/2)/w*8; r-floor(r)' \
    -channel B -fx 'n=sin(i/64)*cos(j/64); (i+j)/(w+h)*(1-abs(n))' +channel null:
}
fx_base() { convert -limit thread "$1" -size ${fx_size}x${fx_size} xc:black null:; }

# ---- libvips: a chain of operations through memory-mapped .v files in the scratch folder
size=4096
vips_a() {
  export VIPS_CONCURRENCY=$1
  vips xyz "$work/xy.v" $size $size
  vips extract_band "$work/xy.v" "$work/x.v" 0
  vips linear "$work/x.v" "$work/deg.v" 2.8647889756541161 0 # x / 20 radians, in degrees
  vips math "$work/deg.v" "$work/sin.v" sin
  vips linear "$work/sin.v" "$work/a.v" 0.5 0.5
}
vips_b() {
  export VIPS_CONCURRENCY=$1
  local h=$((size / 2))
  vips perlin "$work/n.v" $size $size --cell-size 64
  vips linear "$work/n.v" "$work/r.v" 0.5 0.5
  vips xyz "$work/xy.v" $size $size
  vips linear "$work/xy.v" "$work/c.v" 1 -$h
  vips multiply "$work/c.v" "$work/c.v" "$work/c2.v"
  vips extract_band "$work/c2.v" "$work/cx.v" 0
  vips extract_band "$work/c2.v" "$work/cy.v" 1
  vips add "$work/cx.v" "$work/cy.v" "$work/d2.v"
  vips math2_const "$work/d2.v" "$work/d.v" pow 0.5
  vips linear "$work/d.v" "$work/g8.v" "$(echo "8 / $size" | bc -l)" 0
  vips round "$work/g8.v" "$work/gf.v" floor
  vips subtract "$work/g8.v" "$work/gf.v" "$work/g.v"
  vips extract_band "$work/xy.v" "$work/x.v" 0
  vips extract_band "$work/xy.v" "$work/y.v" 1
  vips add "$work/x.v" "$work/y.v" "$work/s.v"
  vips abs "$work/n.v" "$work/an.v"
  vips linear "$work/an.v" "$work/om.v" -1 1
  vips multiply "$work/s.v" "$work/om.v" "$work/bs.v"
  vips linear "$work/bs.v" "$work/b.v" "$(echo "1 / (2 * $size)" | bc -l)" 0
  vips bandjoin "$work/r.v $work/g.v $work/b.v" "$work/out.v"
}
vips_base() { export VIPS_CONCURRENCY=$1; vips xyz "$work/xy.v" $size $size; vips copy "$work/xy.v" "$work/copy.v"; }

# ---- rastertools: Mpix/s as the benchmark reports it
declare -A ours
while read -r name value; do ours[$name]=$value; done < <(
  "$bench" --benchmark_format=csv 2>/dev/null | awk -F, '/^"(Processor|OpenCL)/ {
    gsub(/"/, "", $1); split($1, p, "/");
    for (i = 1; i <= NF; i++) if ($i ~ /^[0-9.e+]+$/) last = $i;
    print p[1] "/" p[2] "/" p[3], last }')

printf '%-4s %-8s %14s %14s %14s %14s\n' "" threads "bytecode" "OpenCL" "libvips" "-fx"
for expr in a b; do
  index=$([ $expr = a ] && echo 0 || echo 1)
  for threads in 1 2; do
    fx_time=$(echo "$(best fx_$expr "$threads") - $(best fx_base "$threads")" | bc -l)
    vips_time=$(echo "$(best vips_$expr "$threads") - $(best vips_base "$threads")" | bc -l)
    printf '%-4s %-8s %14s %14s %14s %14s\n' "($expr)" "$threads" \
      "${ours[Processor/$index/$threads]:-?}" "${ours[OpenCL/$index/real_time]:-?}" \
      "$(rate $((size * size)) "$vips_time")" "$(rate $((fx_size * fx_size)) "$fx_time")"
  done
done
rm -f "$work"/*.v
