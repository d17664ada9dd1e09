#!/usr/bin/env bash
# Installs the built library into a scratch prefix, then builds the host program against it twice,
# through the CMake package and through pkg-config, and runs both.
set -euo pipefail
build_dir=$1
source_dir=$2
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
cmake --install "$build_dir" --prefix "$work/prefix" >/dev/null
export LD_LIBRARY_PATH="$work/prefix/lib:${LD_LIBRARY_PATH:-}"

cmake -G Ninja -S "$source_dir/tests/host" -B "$work/host" -DCMAKE_PREFIX_PATH="$work/prefix" \
  -DCMAKE_CXX_COMPILER="${CXX:-c++}" >/dev/null
ninja -C "$work/host" >/dev/null
"$work/host/host_cmake" "$work"

export PKG_CONFIG_PATH="$work/prefix/lib/pkgconfig"
# shellcheck disable=SC2046
c++ -o "$work/host_pc" "$source_dir/tests/host/host.cpp" $(pkg-config --cflags --libs vxcore3)
rm -f "$work"/host.*
"$work/host_pc" "$work"
echo "installed headers and library serve both build systems"
