#!/usr/bin/env bash
# Side-by-side speed against peer tools (ImageMagick, libvips, GEGL) on one deterministic 4096 × 4096 RGBA8
# image. Every tool runs each operation in the same run with 1 and 2 threads. A peer's own load-and-save time
# (the same image through unchanged) is subtracted from its wall time; rastertools reports the time of the
# render itself ("rendered in N ms"), which is what the subtraction approximates and is far steadier when a
# filter takes less time than the file input and output around it. The table compares the operations alone.
#
#   bench/compare_peers.sh [OPERATION...]      (default: every operation below)
#
# RASTERTOOLS (default build/release/app/rastertools), RUNS (best of, default 3), PEER_LIMIT (seconds a peer
# may take for one run, default 30; a slower peer's rate is left out) and WORK (scratch folder) may be set.
# Later filters add a line to OPERATIONS and a case to each tool's function.
#
# Run with every operation and every tool, it also keeps the speed record: bench/speed-record.md gets the
# table with the date, the machine and the commit, and the README's Speed table is made again from it
# (bench/update_readme_speed.sh), so that the README shows only what the code of that commit renders.
set -euo pipefail

root=$(cd "$(dirname "$0")/.." && pwd)
rastertools=${RASTERTOOLS:-$root/build/release/app/rastertools}
runs=${RUNS:-3}
work=${WORK:-${TMPDIR:-/tmp}/rastertools-peers}
size=4096
OPERATIONS=(noise-gaussian noise-uniform diffuse edge twirl-90 sphere-50)
OPERATIONS+=(motionblur-10 motionblur-50 motionblur-200)
OPERATIONS+=(texture-1 texture-3)
OPERATIONS+=(lighting-directional lighting-spot)
# Voronoi cells of 32 pixels with lines of 10 %, once against each of GEGL's cell-like filters.
OPERATIONS+=(voronoi-mosaic voronoi-cubism voronoi-cellnoise)
complete_run=1
[ $# -gt 0 ] && { OPERATIONS=("$@"); complete_run=0; }
[ -n "${TOOLS:-}" ] && complete_run=0
peer_limit=${PEER_LIMIT:-30}

# ---- Peers from Debian
packages=(imagemagick libvips-tools gegl bc)
missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'ok installed' || missing+=("$p")
done
if [ ${#missing[@]} -gt 0 ]; then
  echo "compare_peers: installing ${missing[*]}" >&2
  SUDO=""
  [ "$(id -u)" -ne 0 ] && SUDO="sudo"
  export DEBIAN_FRONTEND=noninteractive
  $SUDO apt-get update -qq
  $SUDO apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
fi
[ -x "$rastertools" ] || { echo "compare_peers: build first: $rastertools is missing" >&2; exit 1; }

# ---- The test image: seeded plasma with alpha, uncompressed, so that decoding costs little.
mkdir -p "$work"
input=$work/input.tif
if [ ! -s "$input" ]; then
  /usr/bin/convert -seed 7 -size ${size}x${size} plasma:fractal -alpha set -channel A -fx '0.5+0.5*sin(i/97)' \
    +channel -depth 8 -compress none "$input"
fi

# A vips matrix file: a line of taps through the centre of a (2R + 1)-square mask at 30 degrees. Prints its path.
line_matrix() {
  local r=$1 file=$work/line-$1.mat
  if [ ! -s "$file" ]; then
    awk -v r="$r" 'BEGIN {
      n = 2 * r + 1; c = cos(3.14159265358979 / 6); s = sin(3.14159265358979 / 6); count = 0
      for (y = 0; y < n; y++) for (x = 0; x < n; x++) {
        dx = x - r; dy = y - r; along = dx * c + dy * s; across = -dx * s + dy * c
        m[y, x] = (across > -0.5 && across <= 0.5 && along >= -r && along <= r) ? 1 : 0; count += m[y, x]
      }
      print n, n, count, 0
      for (y = 0; y < n; y++) { line = ""; for (x = 0; x < n; x++) line = line m[y, x] " "; print line }
    }' > "$file"
  fi
  echo "$file"
}

# The libvips convolution matrix: width, height, scale, offset, then the rows.
printf '3 3 1 0\n-1 0 1\n-2 0 2\n-1 0 1\n' > "$work/gradient.mat"

# ---- One command per tool and operation; "copy" is the tool's load-and-save baseline. Prints nothing when
# the tool lacks the operation. $1 operation, $2 output, $3 threads.
rastertools_command() {
  local common="--threads $3 --device cpu"
  case $1 in
  copy) echo "$rastertools apply copy $common $input $2" ;;
  noise-gaussian) echo "$rastertools apply addnoise --intensity 30 --gaussian true $common $input $2" ;;
  noise-uniform) echo "$rastertools apply addnoise --intensity 30 --gaussian false $common $input $2" ;;
  # Tiles of 1024: each tile blurs its own rotated strip, so small tiles would repeat the radius's pad rows,
  # and larger ones make longer lines than the caches hold.
  motionblur-*) echo "$rastertools apply motionblur --radius ${1#motionblur-} --angle 30 --tile 1024 $common $input $2" ;;
  # The whole image: a circle of half the side about the middle, as ImageMagick's swirl and implode take.
  twirl-90) echo "$rastertools apply twirl --angle 90 --radius $((size / 2)) $common $input $2" ;;
  sphere-50) echo "$rastertools apply sphere --intensity 50 --radius $((size / 2)) $common $input $2" ;;
  # Up to 512 × 0.01 = 5 pixels, as far as -spread 5.
  diffuse) echo "$rastertools apply diffuse --intensity 0.01 $common $input $2" ;;
  edge) echo "$rastertools apply verticaledgedetect $common $input $2" ;;
  # Procedural textures: R from x alone, and three channels of about fifteen operations with one noise call.
  texture-1) echo "$rastertools apply proceduraltexture --angles rad --eq 'r=sin(x / 20) * 0.5 + 0.5' $common $input $2" ;;
  texture-3) echo "$rastertools apply proceduraltexture --angles rad --eq 'rgb=t = noise(x / 64, y / 64); vec3(fract(x / 37 + t), abs(sin(y / 23 - t * 2)), clamp(x / w * 0.5 + t * 0.5, 0, 1))' $common $input $2" ;;
  # One light; the spot over the relief of the image's own luminance, as the peers' shading takes it.
  lighting-directional) echo "$rastertools apply lighting --light 2 $common $input $2" ;;
  lighting-spot) echo "$rastertools apply lighting --light 0 --depth 5 --outercone 60 $common $input $2" ;;
  voronoi-*) echo "$rastertools apply voronoi --size 32 --line-width 10 $common $input $2" ;;
  esac
}
imagemagick_command() {
  local common="-limit thread $3"
  case $1 in
  copy) echo "/usr/bin/convert $common $input -compress none $2" ;;
  noise-gaussian) echo "/usr/bin/convert $common $input -attenuate 1 +noise Gaussian -compress none $2" ;;
  noise-uniform) echo "/usr/bin/convert $common $input -attenuate 1 +noise Uniform -compress none $2" ;;
  motionblur-*) echo "/usr/bin/convert $common $input -motion-blur 0x${1#motionblur-}+30 -compress none $2" ;;
  twirl-90) echo "/usr/bin/convert $common $input -swirl 90 -compress none $2" ;;
  sphere-50) echo "/usr/bin/convert $common $input -implode -0.5 -compress none $2" ;;
  diffuse) echo "/usr/bin/convert $common $input -spread 5 -compress none $2" ;;
  edge) echo "/usr/bin/convert $common $input -morphology Convolve '3x3: -1,0,1 -2,0,2 -1,0,1' -compress none $2" ;;
  # -fx has no coherent noise of this kind: its three-channel texture uses a sine in its place, which costs
  # about as much per pixel.
  texture-1) echo "/usr/bin/convert $common $input -channel R -fx 'sin((i+0.5)/20)*0.5+0.5' +channel -compress none $2" ;;
  texture-3) echo "/usr/bin/convert $common $input -channel RGB -fx 't=sin((i+0.5)/64+(j+0.5)/64); c==0 ? frac((i+0.5)/37+t) : (c==1 ? abs(sin((j+0.5)/23-t*2)) : min(max((i+0.5)/w*0.5+t*0.5,0),1))' +channel -compress none $2" ;;
  # A distant light over the image's intensity as relief.
  lighting-*) echo "/usr/bin/convert $common $input -shade 135x30 -compress none $2" ;;
  esac
}
vips_command() {
  local env="env VIPS_CONCURRENCY=$3"
  case $1 in
  copy) echo "$env vips copy $input $2" ;;
  # No single noise operation: a gaussian image added to the input and cast back to 8 bits, in one pipeline.
  noise-gaussian) echo "$env sh -c 'vips gaussnoise $work/noise.v $size $size --sigma 25 && vips add $input $work/noise.v $work/sum.v && vips cast $work/sum.v $2 uchar'" ;;
  # An integer convolution with a one-pixel line of 2R + 1 taps at 30 degrees.
  motionblur-*) echo "$env vips conv $input $2 $(line_matrix "${1#motionblur-}") --precision integer" ;;
  # The 3 × 3 horizontal gradient as an integer convolution (negative sums clip to 0 in 8 bits).
  edge) echo "$env vips conv $input $2 $work/gradient.mat --precision integer" ;;
  # The one-channel texture as an operation chain: x, scaled into degrees (vips's sin takes degrees), the sine,
  # then into 0..255, put in place of the red band.
  texture-1) echo "$env sh -c 'vips xyz $work/xy.v $size $size && vips extract_band $work/xy.v $work/x.v 0 && vips linear $work/x.v $work/deg.v 2.8647889756541161 1.4323944878270580 && vips math $work/deg.v $work/s.v sin && vips linear $work/s.v $work/r.v 127.5 127.5 --uchar && vips extract_band $input $work/gba.v 1 --n 3 && vips bandjoin \"$work/r.v $work/gba.v\" $2'" ;;
  esac
}
gegl_command() {
  local env="env GEGL_THREADS=$3"
  case $1 in
  copy) echo "$env gegl -i $input -o $2" ;;
  noise-gaussian) echo "$env gegl -i $input -o $2 -- gegl:noise-rgb gaussian=true" ;;
  noise-uniform) echo "$env gegl -i $input -o $2 -- gegl:noise-rgb gaussian=false" ;;
  motionblur-*) echo "$env gegl -i $input -o $2 -- gegl:motion-blur-linear length=$((2 * ${1#motionblur-})) angle=30" ;;
  twirl-90) echo "$env gegl -i $input -o $2 -- gegl:whirl-pinch whirl=90 pinch=0 radius=1" ;;
  sphere-50) echo "$env gegl -i $input -o $2 -- gegl:spherize amount=0.5" ;;
  diffuse) echo "$env gegl -i $input -o $2 -- gegl:noise-spread amount-x=5 amount-y=5" ;;
  # A distant light over the image's own relief (the image again as the height map).
  lighting-*) echo "$env gegl -i $input -o $2 -- gegl:bump-map azimuth=135 elevation=30 depth=5 aux=[ gegl:load path=$input ]" ;;
  # Cells of 32 pixels: mosaic's tiles (with its grout lines), cubism's squares, and the cell noise pattern
  # rendered over the image's area. The noise is a source without bounds, so it is cropped to the image's size
  # (without the crop gegl goes on rendering an endless plane and the run never ends).
  voronoi-mosaic) echo "$env gegl -i $input -o $2 -- gegl:mosaic tile-size=32" ;;
  voronoi-cubism) echo "$env gegl -i $input -o $2 -- gegl:cubism tile-size=32" ;;
  voronoi-cellnoise) echo "$env gegl -i $input -o $2 -- gegl:cell-noise scale=0.03125 gegl:crop width=$size height=$size" ;;
  esac
}
# TOOLS (default all four) picks the tools, e.g. TOOLS="rastertools vips" to leave out the slowest.
read -r -a tools <<<"${TOOLS:-rastertools imagemagick vips gegl}"

# Best wall time of $runs runs, in seconds; empty when the command fails.
best_time() {
  local best="" start end t
  for _ in $(seq "$runs"); do
    start=$(date +%s.%N)
    if ! timeout "$peer_limit" bash -c "$1" >/dev/null 2>&1; then echo ""; return; fi
    end=$(date +%s.%N)
    t=$(echo "$end - $start" | bc -l)
    if [ -z "$best" ] || [ "$(echo "$t < $best" | bc -l)" = 1 ]; then best=$t; fi
  done
  echo "$best"
}

# rastertools: the best of $runs render times that it reports, in seconds; empty when the command fails.
best_render_time() {
  local best="" output t
  for _ in $(seq "$runs"); do
    output=$(eval "$1" 2>/dev/null) || { echo ""; return; }
    t=$(sed -n 's/.*rendered in \([0-9.]*\) ms.*/\1/p' <<<"$output")
    [ -n "$t" ] || { echo ""; return; }
    t=$(echo "$t / 1000" | bc -l)
    if [ -z "$best" ] || [ "$(echo "$t < $best" | bc -l)" = 1 ]; then best=$t; fi
  done
  echo "$best"
}

megapixels=$(echo "$size * $size / 1000000" | bc -l)
printf '%-16s %-12s %7s %12s %10s\n' operation tool threads "Mpix/s" "ours/best"
record_rows=$(mktemp)
trap 'rm -f "$record_rows"' EXIT
for threads in 1 2; do
  declare -A baseline=()
  for tool in "${tools[@]}"; do
    if [ "$tool" = rastertools ]; then baseline[$tool]=0; continue; fi # it times its render itself
    baseline[$tool]=$(best_time "$("${tool}_command" copy "$work/out-$tool.tif" "$threads")")
  done
  for op in "${OPERATIONS[@]}"; do
    declare -A rate=()
    for tool in "${tools[@]}"; do
      command=$("${tool}_command" "$op" "$work/out-$tool.tif" "$threads")
      [ -n "$command" ] && [ -n "${baseline[$tool]}" ] || continue
      if [ "$tool" = rastertools ]; then
        net=$(best_render_time "$command")
        [ -n "$net" ] || { echo "compare_peers: $tool failed on $op" >&2; continue; }
      else
        t=$(best_time "$command")
        [ -n "$t" ] || { echo "compare_peers: $tool failed on $op or took longer than $peer_limit s" >&2; continue; }
        # At least a millisecond of work, so that a result within the baseline's noise stays finite.
        net=$(echo "t = $t - ${baseline[$tool]}; if (t < 0.001) t = 0.001; t" | bc -l)
      fi
      rate[$tool]=$(echo "$megapixels / $net" | bc -l)
    done
    fastest_peer=0
    for tool in "${tools[@]}"; do
      [ "$tool" = rastertools ] || [ -z "${rate[$tool]:-}" ] && continue
      [ "$(echo "${rate[$tool]} > $fastest_peer" | bc -l)" = 1 ] && fastest_peer=${rate[$tool]}
    done
    fastest_name="-"
    for tool in "${tools[@]}"; do
      [ "$tool" = rastertools ] || [ -z "${rate[$tool]:-}" ] && continue
      [ "${rate[$tool]}" = "$fastest_peer" ] && fastest_name=$tool
    done
    for tool in "${tools[@]}"; do
      [ -n "${rate[$tool]:-}" ] || continue
      ratio="-"
      if [ "$tool" = rastertools ] && [ "$(echo "$fastest_peer > 0" | bc -l)" = 1 ]; then
        ratio=$(printf '%.2fx' "$(echo "${rate[$tool]} / $fastest_peer" | bc -l)")
      fi
      printf '%-16s %-12s %7s %12.1f %10s\n' "$op" "$tool" "$threads" "${rate[$tool]}" "$ratio"
    done
    if [ -n "${rate[rastertools]:-}" ]; then
      if [ "$fastest_name" = "-" ]; then
        printf '| %s | %s | %.1f | none | - | - |\n' "$op" "$threads" "${rate[rastertools]}" >>"$record_rows"
      else
        printf '| %s | %s | %.1f | %s | %.1f | %.2f× |\n' "$op" "$threads" "${rate[rastertools]}" "$fastest_name" \
          "$fastest_peer" "$(echo "${rate[rastertools]} / $fastest_peer" | bc -l)" >>"$record_rows"
      fi
    fi
    unset rate
  done
  unset baseline
done

# ---- The speed record, from a complete run only.
if [ "$complete_run" = 1 ]; then
  record=$root/bench/speed-record.md
  commit=$(git -C "$root" log -1 --format='%h (%s)' 2>/dev/null || echo unknown)
  [ -z "$(git -C "$root" status --porcelain --untracked-files=no 2>/dev/null)" ] || commit="$commit with changes not committed"
  cpu=$(sed -n 's/^model name[[:space:]]*: //p' /proc/cpuinfo | head -1)
  {
    echo "Measured $(date -u +%Y-%m-%d) by \`bench/compare_peers.sh\` at commit $commit, on ${cpu:-an unknown processor}"
    echo "with $(nproc) cores: $size × $size RGBA8, best of $runs runs, Mpix/s of the operation alone."
    echo
    echo "| operation | threads | rastertools | fastest peer | peer | ratio |"
    echo "|---|---|---|---|---|---|"
    cat "$record_rows"
  } >"$record"
  "$root/bench/update_readme_speed.sh"
  echo "compare_peers: wrote $record and the README's Speed table" >&2
fi
