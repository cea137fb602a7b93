#!/usr/bin/env bash
# Compressed-model benchmark: the whole import of the 1M-triangle binary PLY
# grid from .ply, .ply.gz and .ply.zst, each run in a fresh process, beside
# the decompressors' own time for the same files (gzip -dc, zstd -dc into
# /dev/null). The overhead of a compressed import is its time minus the plain
# import's; the target is at most the decompressor's own time plus 10 %.
#
# Environment: REPS (default 5), TRIANGLES (default 1000000), SKIP_BUILD=1
# to reuse build/bench-release.
set -euo pipefail

reps=${REPS:-5}
count=${TRIANGLES:-1000000}

for tool in gzip zstd; do
    command -v "$tool" >/dev/null || { echo "run_archive_bench: needs $tool" >&2; exit 1; }
done
# shellcheck source=bench_common.sh
source "$(dirname "$0")/bench_common.sh"
mkdir -p "$models/gz" "$models/zst"
plain="$models/grid_$count.ply"
[[ -s "$plain" ]] || "$generate" "$plain" "$count" >/dev/null
# Each compressed copy in its own folder, so no plain file of the inner name
# is found first.
gz="$models/gz/grid_$count.ply.gz"
zst="$models/zst/grid_$count.ply.zst"
[[ -s "$gz" ]] || gzip -6 -c "$plain" >"$gz"
[[ -s "$zst" ]] || zstd -q -3 -c "$plain" >"$zst"

# CPU seconds (user+sys) of a command.
cpu_of() { /usr/bin/time -f '%U %S' "$@" 2>&1 >/dev/null | tail -1 | awk '{ print $1 + $2 }'; }

log="$models/archive_bench.log"
: >"$log"
for ((r = 0; r < reps; ++r)); do
    for model in "$plain" "$gz" "$zst"; do
        echo "$(basename "$model") $("$run" import "$model")" >>"$log"
    done
    echo "gunzip cpu=$(cpu_of gzip -dc "$gz") " >>"$log"
    echo "unzstd cpu=$(cpu_of zstd -q -dc "$zst") " >>"$log"
done

stat_of() { grep "^$1 " "$log" | field "$2" | median; }
base_cpu=$(stat_of "$(basename "$plain")" cpu)
base_wall=$(stat_of "$(basename "$plain")" seconds)
printf '%-24s %10s %9s %9s %10s %12s %8s\n' model size_MiB wall_s cpu_s peak_MiB overhead_cpu_s decomp_s
for model in "$plain" "$gz" "$zst"; do
    name=$(basename "$model")
    case "$name" in *.gz) decomp=$(stat_of gunzip cpu) ;; *.zst) decomp=$(stat_of unzstd cpu) ;; *) decomp=0 ;; esac
    awk -v m="$name" -v s="$(stat -c %s "$model")" -v w="$(stat_of "$name" seconds)" \
        -v u="$(stat_of "$name" cpu)" -v k="$(stat_of "$name" peak_kib)" -v u0="$base_cpu" \
        -v d="$decomp" \
        'BEGIN { printf "%-24s %10.1f %9.3f %9.3f %10.1f %12.3f %8.3f\n",
                 m, s / 1048576, w, u, k / 1024, u - u0, d }'
done
echo "plain import wall ${base_wall} s; target: overhead_cpu_s <= 1.1 x decomp_s (runs in $log)"
