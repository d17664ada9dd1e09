#!/usr/bin/env bash
# Installs what building and testing vxcore3 needs on Debian 12. Safe to run again.
set -euo pipefail
packages=(
  ca-certificates cmake ninja-build g++ clang libclang-rt-14-dev pkg-config
  libsqlite3-dev libre2-dev libicu-dev libgtest-dev libgmock-dev libbenchmark-dev
  # the vx host: decoding and thumbnails, metadata, command line, CRC-32
  libvips-dev libexiv2-dev libcli11-dev zlib1g-dev
  # its demo collection: real photographs shipped by Debian, and the vips command that derives
  # near-duplicates from them
  mate-backgrounds libvips-tools
  # the host's end-to-end tests open its HTML report in a headless browser; its benchmark
  # compares with another similar-image finder
  chromium findimagedupes
)
missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
if [ ${#missing[@]} -gt 0 ]; then
  SUDO=""
  [ "$(id -u)" -ne 0 ] && SUDO="sudo"
  export DEBIAN_FRONTEND=noninteractive
  $SUDO apt-get update -qq
  $SUDO apt-get install -y -qq --no-install-recommends "${missing[@]}"
fi
