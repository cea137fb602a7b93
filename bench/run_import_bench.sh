#!/usr/bin/env bash
# Import benchmark: builds Release in build/bench-release, generates grid
# models of 1 and 4 million triangles there and times three cases, each run
# in a fresh process:
#   (a) read    assimp's ReadFile alone with the importer's default flags
#   (b) import  module load + importer + import into a factory
#   (c) json    (b) plus the factory written as JSON
#   (d) unchecked  (b) without assimp's structure validation, whose cost is
#               the difference between (b) and (d)
# Prints the median wall time, CPU time (user+sys) and peak RSS of each case
# and their ratios to (a). The CPU ratio is the steadier one when other work
# shares the cores.
#
# Environment: REPS (default 3), FORMATS (default "ply glb"),
# TRIANGLES (default "1000000 4000000"), SKIP_BUILD=1 to reuse the build.
set -euo pipefail

root=$(cd "$(dirname "$0")/.." && pwd)
build="$root/build/bench-release"
reps=${REPS:-3}
formats=${FORMATS:-"ply glb"}
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
json="$models/out.json"
trap 'rm -f "$json"' EXIT

# The conversion must really produce meshes, or the figures mean nothing.
"$generate" "$models/check.ply" 2000 >/dev/null
"$run" json "$models/check.ply" --json "$json" >/dev/null
if ! grep -q '"positions^' "$json"; then
    echo "run_import_bench: the import wrote no mesh positions; is the mesh conversion built?" >&2
    exit 1
fi

median() { sort -g | awk '{ v[NR] = $1 } END { print (NR % 2) ? v[(NR + 1) / 2] : (v[NR / 2] + v[NR / 2 + 1]) / 2 }'; }
field() { sed -n "s/.* $1=\([^ ]*\).*/\1/p"; }

printf '%-22s %-7s %9s %9s %10s %7s %7s %7s\n' model case wall_s cpu_s peak_MiB wall/a cpu/a mem/a
for count in $triangles; do
    for format in $formats; do
        model="$models/grid_$count.$format"
        [[ -s "$model" ]] || "$generate" "$model" "$count" >/dev/null
        log="$models/grid_$count.$format.log"
        : >"$log"
        # Cases interleaved per repetition, so a burst of outside load hits
        # all of them alike.
        for ((r = 0; r < reps; ++r)); do
            for c in read import json unchecked; do
                "$run" "$c" "$model" --json "$json" >>"$log"
            done
        done
        declare -A wall cpu mem
        for c in read import json unchecked; do
            wall[$c]=$(grep "^$c " "$log" | field seconds | median)
            cpu[$c]=$(grep "^$c " "$log" | field cpu | median)
            mem[$c]=$(grep "^$c " "$log" | field peak_kib | median)
        done
        for c in read import json unchecked; do
            awk -v m="$(basename "$model")" -v c="$c" -v w="${wall[$c]}" -v u="${cpu[$c]}" \
                -v k="${mem[$c]}" -v w0="${wall[read]}" -v u0="${cpu[read]}" -v k0="${mem[read]}" \
                'BEGIN { printf "%-22s %-7s %9.3f %9.3f %10.1f %7.3f %7.3f %7.3f\n",
                         m, c, w, u, k / 1024, w / w0, u / u0, k / k0 }'
        done
        unset wall cpu mem
    done
done
echo "targets on 4M triangles: import wall/a <= 1.15, import mem/a <= 1.10 (per-run lines in $models/*.log)"
