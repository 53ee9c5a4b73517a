#!/usr/bin/env bash
# The main job: builds rastertools and shows it at work on the bundled examples; results go to out/.
set -euo pipefail
cd "$(dirname "$0")/.."
./scripts/setup.sh
cmake --preset release >/dev/null
cmake --build --preset release -j "$(nproc)" --target rastertools
bin=build/release/app/rastertools
mkdir -p out
export RASTERTOOLS_SETTINGS="$PWD/out/settings.json"
rm -f "$RASTERTOOLS_SETTINGS"

"$bin" list | tee out/list.txt
"$bin" play examples/lifecycle.play | tee out/lifecycle.txt

# Filters on the sample photo, each through the pixel pipeline on the default device.
photo=examples/coffee.png
render() { # OUTPUT FILTER [--PARAM VALUE]...
  local output=$1
  shift
  "$bin" apply "$@" "$photo" "out/$output"
  echo "rendered out/$output"
}
render coffee-noise-gaussian.png addnoise --intensity 25 --gaussian true
render coffee-noise-uniform.png addnoise --intensity 25 --gaussian false
render coffee-noise-mono.png addnoise --intensity 25 --mono true
render coffee-noise-rgba16.tif addnoise --intensity 25 --format rgba16
render coffee-diffuse.png diffuse --intensity 0.02
render coffee-edges.png verticaledgedetect
render coffee-unsharpmask.png unsharpmask --radius 9 --factor 1 --threshold 0.02
render coffee-motionblur.png motionblur --radius 20 --angle 30
render coffee-twirl.png twirl --angle 90 --radius 200
render coffee-sphere.png sphere --intensity 50 --radius 200
render coffee-texture-rings.png proceduraltexture --eq 'rgb=fract(hypot(rx, ry) / 24)' --eq 'a=1' --origin 300,200
render coffee-texture-marble.png proceduraltexture --preset 3 --opacity 0.6
render coffee-lighting.png lighting --light 0 --depth 5 --outercone 60
render coffee-voronoi.png voronoi --size 24

# A document: the photo as a layer, noise applied to its pixels, then a live noise layer on top.
doc=out/coffee.rtd
"$bin" doc new "$photo" -o "$doc"
"$bin" doc filter "$doc" addnoise --intensity 10 --mono true
"$bin" doc filter "$doc" addnoise --intensity 20 --live
# A few strokes of the pixel brush on the document's pixels, each a step of its history.
"$bin" doc paint "$doc" --stroke 40,40 200,120 360,60 --colour 220,40,40 --size 6
"$bin" doc paint "$doc" --stroke 40,200 360,220 --colour 30,60,220 --size 3
"$bin" doc render "$doc" out/coffee-document.png
"$bin" doc show "$doc" | tee out/coffee-document.txt

echo
echo "demo: the tool and command list is in out/list.txt, the tool session in out/lifecycle.txt,"
echo "      the settings it committed in out/settings.json and the document it saved in out/lifecycle.rtd;"
echo "      the sample photo with each filter in out/coffee-*.png (and .tif), and a layered document with a"
echo "      live filter layer in out/coffee.rtd, rendered to out/coffee-document.png (layers in out/coffee-document.txt)"
