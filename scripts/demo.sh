#!/usr/bin/env bash
# Sets everything up, builds vxcore3 and runs the demo: a database is created, its store files are
# listed with their sizes, it is reopened and the engine's statistics are printed.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/setup.sh
cmake -G Ninja -S . -B build/release -DCMAKE_BUILD_TYPE=Release -DVX_BUILD_TESTS=OFF >/dev/null
ninja -C build/release -j"$(nproc)" vxdemo
rm -rf build/demo-db && mkdir -p build/demo-db
build/release/tools/vxdemo/vxdemo build/demo-db/demo.vxm
