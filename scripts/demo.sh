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

echo
echo "demo: the tool and command list is in out/list.txt, the tool session in out/lifecycle.txt,"
echo "      the settings it committed in out/settings.json and the document it saved in out/lifecycle.rtd"
