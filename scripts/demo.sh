#!/usr/bin/env bash
# The main job on a built-in demo: sets everything up, builds the vx command, makes a collection
# of real photographs (Debian's mate-backgrounds) with near-duplicates derived from them by
# libvips, imports it into a new database, asks `vx similar` and `vx dupes`, and writes HTML
# reports with thumbnails.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/setup.sh
cmake -G Ninja -S . -B build/release -DCMAKE_BUILD_TYPE=Release -DVX_BUILD_TESTS=OFF >/dev/null
ninja -C build/release -j"$(nproc)" vx
vx=$PWD/build/release/tools/vx/vx
demo=$PWD/build/demo

echo "== the demo collection"
tools/vx/scripts/make_demo_collection.sh "$demo"
photos=$demo/photos
db=$demo/photos.vxm

echo "== vx create, vx import"
rm -f "$demo"/photos.*
"$vx" create "$db"
"$vx" import "$db" "$photos" --plain
"$vx" stats "$db"

echo "== vx similar: the photographs most like Storm.jpg (shape, turned copies included)"
"$vx" similar "$db" "$photos/Storm/Storm.jpg" --rotate --max 8 --html "$demo/similar.html"

# An image that is not in the database: a new crop of one of the photographs.
query=$demo/query-ladybird.jpg
vips crop "$photos/LadyBird/LadyBird.jpg" "$query" 400 200 1800 1200
echo "== vx similar: a file outside the database, $query"
"$vx" similar "$db" "$query" --max 5

echo "== vx dupes: groups of near-duplicates, one a line"
"$vx" dupes "$db" --html "$demo/dupes.html" | sed "s|$photos/||g"

echo
echo "Reports:"
echo "  $demo/dupes.html"
echo "  $demo/similar.html"
echo "Try: $vx info $db $photos/Storm/Storm.jpg"
