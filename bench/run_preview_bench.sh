#!/usr/bin/env bash
# Preview benchmark: imports the grid models of run_import_bench.sh (made here
# when missing, in the same Release build) and renders a preview of each, in a
# fresh process per run. Prints the median import time, the median preview
# time (render + PNG file) and their ratio.
#
# Environment: REPS (default 3), FORMATS (default "ply"), SIZE (default 512),
# TRIANGLES (default "1000000 4000000"), SKIP_BUILD=1 to reuse the build.
set -euo pipefail

root=$(cd "$(dirname "$0")/.." && pwd)
build="$root/build/bench-release"
reps=${REPS:-3}
formats=${FORMATS:-"ply"}
size=${SIZE:-512}
triangles=${TRIANGLES:-"1000000 4000000"}

if [[ "${SKIP_BUILD:-0}" != 1 ]]; then
    cmake -S "$root" -B "$build" -DCMAKE_BUILD_TYPE=Release -DSCENE_BENCH=ON \
        -DSCENE_SANITIZE=OFF -DSCENE_TESTS=OFF >/dev/null
    cmake --build "$build" -j2 --target make_grid_model import_case scene_assimp >/dev/null
fi
generate="$build/bench/make_grid_model"
run="$build/bench/import_case"
models="$build/bench-models"
mkdir -p "$models"

median() { sort -g | awk '{ v[NR] = $1 } END { print (NR % 2) ? v[(NR + 1) / 2] : (v[NR / 2] + v[NR / 2 + 1]) / 2 }'; }
field() { sed -n "s/.* $1=\([^ ]*\).*/\1/p"; }

printf '%-22s %6s %10s %11s %9s %9s\n' model size import_s preview_s ratio peak_MiB
for count in $triangles; do
    for format in $formats; do
        model="$models/grid_$count.$format"
        [[ -s "$model" ]] || "$generate" "$model" "$count" >/dev/null
        log="$models/grid_$count.$format.preview.log"
        : >"$log"
        for ((r = 0; r < reps; ++r)); do
            "$run" preview "$model" --preview "$models/grid_$count.$format.png" --size "$size" >>"$log"
        done
        import=$(field import_seconds <"$log" | median)
        preview=$(field preview_seconds <"$log" | median)
        peak=$(field peak_kib <"$log" | median)
        awk -v m="$(basename "$model")" -v s="$size" -v i="$import" -v p="$preview" -v k="$peak" \
            'BEGIN { printf "%-22s %6d %10.3f %11.3f %9.3f %9.1f\n", m, s, i, p, p / i, k / 1024 }'
    done
done
echo "target: preview_s / import_s < 0.25 (images in $models/*.png)"
