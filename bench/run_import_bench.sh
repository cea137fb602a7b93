#!/usr/bin/env bash
# Import benchmark: builds Release in build/bench-release, generates grid
# models of 1 and 4 million triangles there and times these cases, each run
# in a fresh process:
#   read     assimp's ReadFile alone with its own vertex join (the flags the
#            importer used before it welded vertices itself)
#   plain    assimp's ReadFile alone with the importer's flags (no join)
#   import   module load + importer + import into a factory
#   json     import plus the factory written as JSON
#   unchecked  import without assimp's structure validation ("importValidate"
#            false); its cost is the difference between import and unchecked
#   assjson  assimp's command-line tool: `assimp export MODEL OUT -fassjson`
# Prints the median wall time, CPU time (user+sys) and peak RSS of each case,
# the ratios of CPU time and memory to "read" and of json to assjson, and the
# growth exponents from the smallest to the largest model (time ~ n^e). The
# CPU figures are the steadier ones when other work shares the cores; the
# load average is printed with them.
#
# Environment: REPS (default 3), FORMATS (default "ply glb"),
# TRIANGLES (default "1000000 4000000"), SKIP_BUILD=1 to reuse the build,
# NO_ASSJSON=1 to leave assimp's exporter out.
set -euo pipefail

reps=${REPS:-3}
formats=${FORMATS:-"ply glb"}
triangles=${TRIANGLES:-"1000000 4000000"}
cases="read plain import json unchecked"
if [[ "${NO_ASSJSON:-0}" != 1 ]] && command -v assimp >/dev/null; then
    cases="$cases assjson"
fi

# shellcheck source=bench_common.sh
source "$(dirname "$0")/bench_common.sh"
json="$models/out.json"
trap 'rm -f "$json" "$models/out.assjson"' EXIT

# The conversion must really produce meshes, or the figures mean nothing.
"$generate" "$models/check.ply" 2000 >/dev/null
"$run" json "$models/check.ply" --json "$json" >/dev/null
if ! grep -q '"positions^' "$json"; then
    echo "run_import_bench: the import wrote no mesh positions; is the mesh conversion built?" >&2
    exit 1
fi

# One run of one case, as one line "<case> seconds=.. cpu=.. peak_kib=..".
run_case() {
    local c=$1 model=$2
    case $c in
    read) "$run" read "$model" ;;
    plain) "$run" read-plain "$model" | sed 's/^read-plain /plain /' ;;
    import) "$run" import "$model" ;;
    unchecked) "$run" unchecked "$model" ;;
    json) "$run" json "$model" --json "$json" ;;
    assjson)
        /usr/bin/time -f 'assjson %e %U %S %M' -o "$models/time.txt" \
            assimp export "$model" "$models/out.assjson" -fassjson >/dev/null 2>&1
        awk '{ printf "assjson seconds=%s cpu=%.2f peak_kib=%s bytes=%s\n", $2, $3 + $4, $5, b }' \
            b="$(stat -c %s "$models/out.assjson")" "$models/time.txt"
        ;;
    esac
}

echo "load average before: $(cut -d' ' -f1-3 /proc/loadavg), $(nproc) cores"
printf '%-22s %-8s %9s %9s %10s %8s %8s\n' model case wall_s cpu_s peak_MiB cpu/read mem/read
declare -A figures
for format in $formats; do
    for count in $triangles; do
        model="$models/grid_$count.$format"
        [[ -s "$model" ]] || "$generate" "$model" "$count" >/dev/null
        log="$models/grid_$count.$format.log"
        : >"$log"
        # Cases interleaved per repetition, so a burst of outside load hits
        # all of them alike.
        for ((r = 0; r < reps; ++r)); do
            for c in $cases; do
                run_case "$c" "$model" >>"$log"
            done
        done
        for c in $cases; do
            for f in seconds cpu peak_kib; do
                figures[$format,$count,$c,$f]=$(grep "^$c " "$log" | field $f | median)
            done
        done
        for c in $cases; do
            awk -v m="$(basename "$model")" -v c="$c" -v w="${figures[$format,$count,$c,seconds]}" \
                -v u="${figures[$format,$count,$c,cpu]}" -v k="${figures[$format,$count,$c,peak_kib]}" \
                -v u0="${figures[$format,$count,read,cpu]}" -v k0="${figures[$format,$count,read,peak_kib]}" \
                'BEGIN { printf "%-22s %-8s %9.3f %9.3f %10.1f %8.3f %8.3f\n",
                         m, c, w, u, k / 1024, u / u0, k / k0 }'
        done
    done
done
echo "load average after: $(cut -d' ' -f1-3 /proc/loadavg)"

# Targets: import <= 0.40 x read in CPU and <= 0.50 x in memory; json <=
# 0.35 x assjson in CPU; doubling the triangles at most doubles time and
# memory (exponent <= 1).
first=${triangles%% *}
last=${triangles##* }
echo
printf '%-8s %-10s %12s %12s %12s %10s %10s %10s\n' format triangles import/read mem/read \
    json/assjson e_cpu e_mem e_json
for format in $formats; do
    for count in $triangles; do
        awk -v f="$format" -v n="$count" \
            -v ui="${figures[$format,$count,import,cpu]}" -v ur="${figures[$format,$count,read,cpu]}" \
            -v ki="${figures[$format,$count,import,peak_kib]}" -v kr="${figures[$format,$count,read,peak_kib]}" \
            -v uj="${figures[$format,$count,json,cpu]}" -v ua="${figures[$format,$count,assjson,cpu]:-0}" \
            -v u1="${figures[$format,$first,import,cpu]}" -v k1="${figures[$format,$first,import,peak_kib]}" \
            -v j1="${figures[$format,$first,json,cpu]}" -v n1="$first" -v last="$last" \
            'BEGIN {
                 e = sprintf("%10s %10s %10s", "-", "-", "-")
                 if (n != n1 && n == last)
                     e = sprintf("%10.2f %10.2f %10.2f", log(ui / u1) / log(n / n1),
                                 log(ki / k1) / log(n / n1), log(uj / j1) / log(n / n1))
                 r = "-"
                 if (ua > 0)
                     r = sprintf("%.3f", uj / ua)
                 printf "%-8s %-10s %12.3f %12.3f %12s %s\n", f, n, ui / ur, ki / kr, r, e }'
    done
done
echo "(e_cpu, e_mem, e_json: growth exponents of the import's CPU time and peak memory and of" \
     "the import plus JSON's CPU time, from $first to $last triangles)"
echo "targets: import/read <= 0.40, mem/read <= 0.50, json/assjson <= 0.35, exponents <= 1 (per-run lines in $models/*.log)"
