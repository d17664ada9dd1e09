#!/usr/bin/env bash
# Builds the demo collection from the photographs Debian ships in mate-backgrounds: each photograph
# becomes a folder under OUT_DIR/photos holding the original and five near-duplicates made with
# libvips (scaled to half, cropped to the central 80 %, recompressed at quality 30, turned by
# 180 degrees, brightened). Writes OUT_DIR/groups.tsv: one group a line, paths separated by
# tabs, the truth that `vx dupes` and other finders are scored against.
#
#   make_demo_collection.sh OUT_DIR [PHOTO_DIR]
set -euo pipefail
out=${1:?usage: make_demo_collection.sh OUT_DIR [PHOTO_DIR]}
photos=${2:-/usr/share/backgrounds/mate/nature}
command -v vips >/dev/null || { echo "the vips command (libvips-tools) is missing" >&2; exit 1; }
shopt -s nullglob
sources=("$photos"/*.jpg)
[ ${#sources[@]} -gt 0 ] || { echo "no photographs in $photos" >&2; exit 1; }

rm -rf "$out"
mkdir -p "$out/photos"
out=$(cd "$out" && pwd)
: >"$out/groups.tsv"
for src in "${sources[@]}"; do
  name=$(basename "$src" .jpg)
  dir="$out/photos/$name"
  mkdir -p "$dir"
  width=$(vipsheader -f width "$src")
  height=$(vipsheader -f height "$src")
  # The original as Debian ships it; the rest derive from it.
  cp "$src" "$dir/$name.jpg"
  vips resize "$src" "$dir/$name-half.jpg[Q=90]" 0.5
  vips crop "$src" "$dir/$name-crop.jpg[Q=90]" $((width / 10)) $((height / 10)) \
    $((width * 8 / 10)) $((height * 8 / 10))
  vips copy "$src" "$dir/$name-q30.jpg[Q=30]"
  vips rot "$src" "$dir/$name-rot180.jpg[Q=90]" d180
  vips linear "$src" "$dir/$name-bright.jpg[Q=90]" 1.15 20 --uchar
  printf '%s\n' "$dir"/*.jpg | sort | paste -sd '\t' >>"$out/groups.tsv"
done
echo "demo collection: $(find "$out/photos" -name '*.jpg' | wc -l) photographs in ${#sources[@]} groups under $out/photos"
