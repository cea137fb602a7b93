#!/usr/bin/env bash
# Hand-run robustness sweep: feeds N seeded mutants of model files to
# scene-import and counts how the host ends. The host must never die by a
# signal or hang, whatever the reader does with the bytes: a mutant that
# does is kept as a reproducer.
#
# usage: bench/mutation_sweep.sh SCENE_IMPORT N [SEED_FILE...]
# Environment: FIRST_SEED (1), JOBS (2), TIMEOUT per import (10 s, the host's
#              --timeout; the outer guard is that plus 20 s), KEEP (folder for
#              reproducers, ./mutation-reproducers).
# Without seed files it takes the binary and text models of several formats
# from assimp's corpus (/usr/share/assimp/models). Mutant i of the run uses
# seed FIRST_SEED + i on seed file number i modulo the file count, so any
# line of the log can be made again with host/tests/mutate.py.
set -uo pipefail

host=$(readlink -f "$1")
count=$2
shift 2
here=$(cd "$(dirname "$0")/.." && pwd)
mutate="$here/host/tests/mutate.py"
corpus=/usr/share/assimp/models
if [ $# -eq 0 ]; then
    set -- "$corpus"/PLY/cube_binary.ply "$corpus"/PLY/cube.ply "$corpus"/MD5/*.md5mesh \
        "$corpus"/3MF/*.3mf "$corpus"/X/test.x "$corpus"/X/anim_test.x "$corpus"/Collada/duck.dae \
        "$corpus"/Collada/cube_triangulate.dae "$corpus"/LWO/LWO2/*.lwo "$corpus"/OBJ/box.obj \
        "$corpus"/STL/Spider_binary.stl "$corpus"/3DS/fels.3ds "$corpus"/glTF2/BoxTextured-glTF-Binary/*.glb
fi
seeds=()
for f in "$@"; do [ -f "$f" ] && seeds+=("$(readlink -f "$f")"); done
[ ${#seeds[@]} -gt 0 ] || { echo "mutation sweep: no seed files" >&2; exit 2; }
first=${FIRST_SEED:-1}
jobs=${JOBS:-2}
limit=${TIMEOUT:-10}
keep=$(readlink -f "${KEEP:-mutation-reproducers}")
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
export host mutate limit keep work

one() {
    local i=$1 file=$2 seed=$3
    local ext=${file##*.}
    local dir="$work/$i"
    mkdir -p "$dir"
    local model="$dir/m.$ext"
    python3 "$mutate" "$seed" "$file" "$model"
    local start=$(date +%s%N)
    timeout -k 5 $((limit + 20)) "$host" -q --timeout "$limit" "$model" -o "$dir/out.json" \
        >/dev/null 2>"$dir/err"
    local code=$?
    local ms=$((($(date +%s%N) - start) / 1000000))
    local kind=other
    if [ $code -eq 124 ] || [ $code -eq 137 ]; then kind=host-hang
    elif [ $code -gt 128 ]; then kind=host-signal
    elif grep -q 'crashed reading' "$dir/err"; then kind=assimp-crash
    elif grep -q 'gave up after' "$dir/err"; then kind=assimp-hang
    elif [ $code -eq 0 ]; then kind=imported
    elif [ $code -eq 1 ]; then kind=rejected
    fi
    # Nothing may be left behind but a complete document of a success.
    if ls -A "$dir" | grep -q '\.tmp$'; then kind="$kind+leftover"; fi
    if [[ $kind == host-* || $kind == *leftover ]]; then
        mkdir -p "$keep"
        cp "$model" "$keep/seed$seed-$(basename "$file")"
        cp "$dir/err" "$keep/seed$seed-$(basename "$file").stderr"
    fi
    printf '%s\t%s\t%s\t%s\t%s ms\n' "$kind" "$code" "$seed" "$(basename "$file")" "$ms"
    rm -rf "$dir"
}
export -f one

start=$(date +%s)
for ((i = 0; i < count; ++i)); do
    printf '%s\0%s\0%s\0' "$i" "${seeds[$((i % ${#seeds[@]}))]}" "$((first + i))"
done | xargs -0 -n 3 -P "$jobs" bash -c 'one "$@"' _ >"$work/log"
seconds=$(($(date +%s) - start))

echo "mutation sweep: $count mutants of ${#seeds[@]} files in $seconds s"
cut -f1 "$work/log" | sort | uniq -c | sort -rn
echo "host exit codes:"
cut -f2 "$work/log" | sort -n | uniq -c
grep -E '^(assimp-crash|assimp-hang|host-)' "$work/log" | sort >"${LOG:-/dev/null}"
deaths=$(grep -cE '^host-' "$work/log")
leftovers=$(grep -c 'leftover' "$work/log")
echo "host signal deaths or hangs: $deaths, leftover files: $leftovers"
[ "$deaths" -eq 0 ] && [ "$leftovers" -eq 0 ]
