#!/usr/bin/env bash
# Import throughput of vx for 12-megapixel JPEGs (4000 x 3000, made from Debian's photographs)
# with two decoding threads, and where the time goes: the importer sums each stage over its
# workers, so the shares below are of the workers' busy time. The bound beside it is what
# decoding alone would allow on the same threads, measured in the same run.
#
#   bench/vx_import_bench.sh [BUILD_DIR] [WORK_DIR] [IMAGES]
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
build=${1:-$root/build/release}
work=${2:-$(mktemp -d)}
count=${3:-24}
threads=2
vx=$build/tools/vx/vx
[ -x "$vx" ] || { echo "build vx first: $vx is missing" >&2; exit 1; }

shopt -s nullglob
sources=(/usr/share/backgrounds/mate/nature/*.jpg)
[ ${#sources[@]} -gt 0 ] || { echo "no photographs: install mate-backgrounds" >&2; exit 1; }
rm -rf "$work/12mp" && mkdir -p "$work/12mp"
for ((i = 0; i < count; i++)); do
  src=${sources[i % ${#sources[@]}]}
  # Each copy differs a little (a brightness step), so no two files are byte-equal.
  vips thumbnail "$src" "$work/12mp/t.v" 4000 --height 3000 --size both --crop centre
  vips linear "$work/12mp/t.v" "$work/12mp/img$i.jpg[Q=92]" 1 "$i" --uchar
done
rm -f "$work/12mp/t.v"

# The floor: reading the same bytes, warm from the page cache, as the CRC pass does.
start=$(date +%s.%N)
cat "$work"/12mp/*.jpg >/dev/null
read_seconds=$(awk -v a="$start" -v b="$(date +%s.%N)" 'BEGIN { print b - a }')

rm -f "$work"/import.*
"$vx" create "$work/import.vxm" >/dev/null
json=$("$vx" import "$work/import.vxm" "$work/12mp" -j "$threads" -q --json)
echo "$json" | awk -v n="$count" -v threads="$threads" -v cores="$(nproc)" -v readSeconds="$read_seconds" '
  function field(name,   m) { match($0, "\"" name "\":[0-9.e+-]+"); return substr($0, RSTART + length(name) + 3, RLENGTH - length(name) - 3) + 0 }
  {
    wall = field("wall"); crc = field("crc"); dec = field("decode"); meta = field("metadata")
    thumb = field("thumbnail"); lib = field("library"); busy = crc + dec + meta + thumb + lib
    printf "%d images of 4000 x 3000, %d threads, %d cores\n", n, threads, cores
    printf "import: %.2f s, %.2f images/s\n", wall, n / wall
    printf "shares of worker time: decode %.1f %%, library %.1f %%, thumbnail encode %.1f %%, CRC %.1f %%, metadata %.1f %%\n",
           100 * dec / busy, 100 * lib / busy, 100 * thumb / busy, 100 * crc / busy, 100 * meta / busy
    bound = n / (dec / threads)
    printf "decoding alone would allow %.2f images/s: the import runs at %.0f %% of that bound\n", bound, 100 * (n / wall) / bound
    printf "reading the bytes alone: %.0f images/s (import / read = %.3f)\n", n / readSeconds, readSeconds / wall
  }'
