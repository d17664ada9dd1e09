#!/usr/bin/env bash
# `vx dupes` beside findimagedupes on the demo collection, in the same run on the same folder:
# wall time to fingerprint and compare, and pairwise precision, recall and F1 against the
# collection's known groups. Then the sweep that the defaults of `vx dupes` were chosen from.
#
#   bench/vx_dupes_bench.sh [BUILD_DIR] [WORK_DIR]
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
build=${1:-$root/build/release}
work=${2:-$(mktemp -d)}
vx=$build/tools/vx/vx
[ -x "$vx" ] || { echo "build vx first: $vx is missing" >&2; exit 1; }
command -v findimagedupes >/dev/null || { echo "findimagedupes is not installed" >&2; exit 1; }

"$root/tools/vx/scripts/make_demo_collection.sh" "$work/demo" >/dev/null
photos=$work/demo/photos
truth=$work/demo/groups.tsv

# Pairwise scores of predicted groups (one a line, tab-separated) against the truth:
# "precision recall f1 pairs".
score() {
  awk -F'\t' -v truth="$truth" '
    BEGIN {
      while ((getline line < truth) > 0) {
        n = split(line, f, "\t"); g++
        for (i = 1; i <= n; i++) group[f[i]] = g
        truePairs += n * (n - 1) / 2
      }
    }
    {
      for (i = 1; i <= NF; i++) for (j = i + 1; j <= NF; j++) {
        pairs++
        if ($i in group && group[$i] == group[$j]) hits++
      }
    }
    END {
      p = pairs ? hits / pairs : 0; r = truePairs ? hits / truePairs : 0
      printf "%.3f %.3f %.3f %d\n", p, r, (p + r) ? 2 * p * r / (p + r) : 0, pairs
    }' "$1"
}

now() { date +%s.%N; }
since() { awk -v a="$1" -v b="$(now)" 'BEGIN { printf "%.3f", b - a }'; }

# The machine may be shared: each tool runs three times, alternating; the median counts.
median() { printf '%s\n' "$@" | sort -g | sed -n 2p; }
echo "== fingerprint and compare, $(find "$photos" -name '*.jpg' | wc -l) photographs, $(nproc) cores, median of 3"
fid_runs=() vx_runs=()
for _ in 1 2 3; do
  start=$(now)
  findimagedupes -R -q "$photos" 2>/dev/null | tr ' ' '\t' >"$work/fid.tsv"
  fid_runs+=("$(since "$start")")

  start=$(now)
  "$vx" create "$work/bench.vxm" --force >/dev/null
  "$vx" import "$work/bench.vxm" "$photos" -q >/dev/null
  "$vx" dupes "$work/bench.vxm" >"$work/vx.tsv"
  vx_runs+=("$(since "$start")")
done
echo "runs: findimagedupes ${fid_runs[*]} s; vx ${vx_runs[*]} s"
fid_seconds=$(median "${fid_runs[@]}")
vx_seconds=$(median "${vx_runs[@]}")

printf '%-32s %8s %9s %7s %6s %6s\n' tool seconds precision recall F1 pairs
read -r p r f n < <(score "$work/fid.tsv")
printf '%-32s %8.2f %9s %7s %6s %6s\n' "findimagedupes (defaults)" "$fid_seconds" "$p" "$r" "$f" "$n"
read -r p r f n < <(score "$work/vx.tsv")
printf '%-32s %8.2f %9s %7s %6s %6s\n' "vx create+import+dupes" "$vx_seconds" "$p" "$r" "$f" "$n"
awk -v v="$vx_seconds" -v f="$fid_seconds" 'BEGIN { printf "time ratio vx / findimagedupes: %.2f\n", v / f }' 

echo "== findimagedupes over its threshold, from fingerprints taken once"
findimagedupes -f "$work/fid.db" -R -n -q "$photos" 2>/dev/null
printf '%-9s %9s %7s %6s\n' threshold precision recall F1
for t in 50 60 70 75 80 85 90 95; do
  findimagedupes -f "$work/fid.db" -q -t "$t%" 2>/dev/null | tr ' ' '\t' >"$work/sweep.tsv"
  read -r p r f n < <(score "$work/sweep.tsv")
  printf '%-9s %9s %7s %6s\n' "$t%" "$p" "$r" "$f"
done

echo "== sweep of vx dupes over method, rotation and minimum score (same database)"
printf '%-11s %-7s %5s %9s %7s %6s\n' method rotate min precision recall F1
for method in quick fuzzy histogram duplicates; do
  for rotate in "" --rotate; do
    for min in 80 84 88 90 92 94 96 98; do
      "$vx" dupes "$work/bench.vxm" --method "$method" $rotate --min-score "$min" >"$work/sweep.tsv"
      read -r p r f n < <(score "$work/sweep.tsv")
      printf '%-11s %-7s %5s %9s %7s %6s\n' "$method" "${rotate:+yes}" "$min" "$p" "$r" "$f"
    done
  done
done
