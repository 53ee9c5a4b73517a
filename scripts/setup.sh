#!/usr/bin/env bash
# Installs every Debian package the project needs. Idempotent, and silent when
# everything is already there.
set -euo pipefail

packages=(
  build-essential cmake ninja-build ccache pkg-config clang libclang-rt-dev clang-format
  libgtest-dev libgmock-dev libbenchmark-dev
  nlohmann-json3-dev libzstd-dev
  libpng-dev libjpeg-dev libtiff-dev liblcms2-dev libtbb-dev libcli11-dev
  libwebp-dev libheif-dev libexiv2-dev libopenexr-dev
  ocl-icd-opencl-dev opencl-headers pocl-opencl-icd clinfo
)

missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'ok installed' || missing+=("$p")
done
[ ${#missing[@]} -eq 0 ] && exit 0

echo "setup: installing ${missing[*]}" >&2
SUDO=""
[ "$(id -u)" -ne 0 ] && SUDO="sudo"
export DEBIAN_FRONTEND=noninteractive
$SUDO apt-get update -qq
$SUDO apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
