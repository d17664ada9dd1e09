#!/usr/bin/env bash
# Sets everything up, then: builds with GCC and runs every test; builds with clang under
# AddressSanitizer and UndefinedBehaviorSanitizer and runs every test there; runs each fuzz
# target for a few seconds.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/setup.sh
jobs=$(nproc)
fuzz_seconds=${VX_FUZZ_SECONDS:-10}

echo "== GCC build and tests"
cmake -G Ninja -S . -B build/gcc -DCMAKE_BUILD_TYPE=RelWithDebInfo -DVX_BUILD_BENCH=ON >/dev/null
ninja -C build/gcc -j"$jobs"
(cd build/gcc && ctest -j"$jobs" --output-on-failure)

echo "== clang AddressSanitizer + UndefinedBehaviorSanitizer build, tests and fuzz targets"
CC=clang CXX=clang++ cmake -G Ninja -S . -B build/asan -DCMAKE_BUILD_TYPE=Debug \
  -DVX_SANITIZE=address,undefined -DVX_BUILD_FUZZ=ON >/dev/null
ninja -C build/asan -j"$jobs"
(cd build/asan && ASAN_OPTIONS=detect_leaks=1 ctest -j"$jobs" --output-on-failure)
for f in build/asan/fuzz/*_fuzz; do
  [ -x "$f" ] || continue
  echo "-- $(basename "$f") for ${fuzz_seconds}s"
  mkdir -p "build/asan/corpus/$(basename "$f")"
  "$f" -max_total_time="$fuzz_seconds" -max_len=4096 -timeout=10 -rss_limit_mb=2048 \
    -print_final_stats=0 "build/asan/corpus/$(basename "$f")" 2>&1 | tail -n 2
done
echo "== all tests passed"
