#!/usr/bin/env bash
# Sets everything up, then: builds with GCC and runs every test; builds with clang under
# AddressSanitizer and UndefinedBehaviorSanitizer and runs every test there; runs each fuzz
# target for a few seconds; builds the threaded code under ThreadSanitizer and runs its tests.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/setup.sh
jobs=$(nproc)
fuzz_seconds=${VX_FUZZ_SECONDS:-10}

echo "== GCC build and tests"
cmake -G Ninja -S . -B build/gcc -DCMAKE_BUILD_TYPE=Release -DVX_BUILD_BENCH=ON >/dev/null
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
  name=$(basename "$f")
  mkdir -p "build/asan/corpus/$name"
  if ! "$f" -max_total_time="$fuzz_seconds" -max_len=4096 -timeout=10 -rss_limit_mb=2048 \
      "build/asan/corpus/$name" >"build/asan/$name.log" 2>&1; then
    tail -n 80 "build/asan/$name.log"
    echo "fuzz target $name failed"
    exit 1
  fi
  grep -E '^Done [0-9]+ runs' "build/asan/$name.log" || tail -n 1 "build/asan/$name.log"
done
echo "== clang ThreadSanitizer build of the threaded code and its tests"
CC=clang CXX=clang++ cmake -G Ninja -S . -B build/tsan -DCMAKE_BUILD_TYPE=RelWithDebInfo \
  -DVX_SANITIZE=thread >/dev/null
threaded_tests=(vxlib/vxlib_test interfaces/vxsq/vxsq_test core/engine/engine_test core/catalog/catalog_test
                core/selection/selection_test core/selection/selengine_test)
ninja -C build/tsan -j"$jobs" "${threaded_tests[@]##*/}"
for t in "${threaded_tests[@]}"; do
  TSAN_OPTIONS="halt_on_error=1" "build/tsan/$t" --gtest_brief=1
done
echo "== all tests passed"
