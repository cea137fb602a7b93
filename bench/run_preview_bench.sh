#!/usr/bin/env bash
# Preview benchmark: imports the grid models of run_import_bench.sh (made here
# when missing, in the same Release build) and renders a preview of each, in a
# fresh process per run. Prints the median import time, the median preview
# time (render + PNG file) and their ratio.
#
# Environment: REPS (default 3), FORMATS (default "ply"), SIZE (default 512),
# TRIANGLES (default "1000000 4000000"), SKIP_BUILD=1 to reuse the build.
set -euo pipefail

reps=${REPS:-3}
formats=${FORMATS:-"ply"}
size=${SIZE:-512}
triangles=${TRIANGLES:-"1000000 4000000"}

# shellcheck source=bench_common.sh
source "$(dirname "$0")/bench_common.sh"

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
