#!/usr/bin/env bash
# Inputs that make assimp crash or hang, made here from corpus files, must
# not take the host down: it ends with exit 1 and one line naming the crash
# or the time-out, within the time limit plus 5 s, and leaves no file behind.
# With --no-isolation the crash is the host's own; that is not tried here.
#
# usage: crash_containment.sh SCENE_IMPORT CORPUS_DIR
set -uo pipefail

host=$(readlink -f "$1")
corpus=$2
mutate="$(dirname "$(readlink -f "$0")")/mutate.py"
limit=5
if [ ! -d "$corpus" ]; then
    echo "crash containment: $corpus not found (package assimp-testmodels), skipped"
    exit 77
fi
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
# Under the sanitizers a crash of the reader must stay a signal, as it is for
# users; leak reports of a child that assimp left half-done are not the point.
export ASAN_OPTIONS="${ASAN_OPTIONS:+$ASAN_OPTIONS:}handle_segv=0:handle_sigbus=0:handle_sigfpe=0:handle_abort=0:detect_leaks=0"

# name, then "cut LENGTH" or "seed N", then the corpus file.
cases=(
    "ply-cut-44 cut 44 PLY/cube_binary.ply"
    "ply-cut-223 cut 223 PLY/cube_binary.ply"
    "ply-cut-120 cut 120 PLY/cube_binary.ply"
    "ply-cut-300 cut 300 PLY/cube_binary.ply"
    "md5-29 seed 29 MD5/SimpleCube.md5mesh"
    "md5-185 seed 185 MD5/SimpleCube.md5mesh"
    "3mf-342 seed 342 3MF/box.3mf"
    "ply-989 seed 989 PLY/cube_binary.ply"
    "3mf-1 seed 1 3MF/box.3mf"
    "3mf-2 seed 2 3MF/box.3mf"
    "x-3 seed 3 X/test.x"
    "x-4 seed 4 X/anim_test.x"
    "dae-5 seed 5 Collada/duck.dae"
    "dae-6 seed 6 Collada/COLLADA.dae"
)

failures=0 crashes=0 hangs=0
for c in "${cases[@]}"; do
    read -r name how arg file <<<"$c"
    ext=${file##*.}
    model="$work/$name.$ext"
    out="$work/out-$name"
    mkdir -p "$out"
    if [ "$how" = cut ]; then set -- --cut "$arg"; else set -- "$arg"; fi
    if ! python3 "$mutate" "$@" "$corpus/$file" "$model"; then
        echo "$name: cannot make the input from $file"
        failures=$((failures + 1))
        continue
    fi
    start=$(date +%s)
    timeout -k 5 $((limit + 30)) "$host" -q --timeout $limit "$model" -o "$out/scene.json" \
        >/dev/null 2>"$work/$name.err"
    code=$?
    seconds=$(($(date +%s) - start))
    line=$(grep -m1 -E 'crashed reading|gave up after' "$work/$name.err")
    verdict=ok
    if [ $code -gt 1 ]; then
        verdict="host ended with $code"
    elif [ $seconds -gt $((limit + 5)) ]; then
        verdict="took $seconds s"
    elif [ -n "$line" ] && [ $code -ne 1 ]; then
        verdict="crash reported with exit $code"
    elif [ $code -ne 0 ] && [ -n "$(ls -A "$out")" ]; then
        verdict="left $(ls -A "$out" | tr '\n' ' ')"
    elif [ $code -eq 0 ] && [ -n "$(ls -A "$out" | grep -v '^scene.json$')" ]; then
        verdict="left $(ls -A "$out" | tr '\n' ' ')"
    fi
    case $line in *crashed*) crashes=$((crashes + 1)) ;; *gave*) hangs=$((hangs + 1)) ;; esac
    [ "$verdict" = ok ] || failures=$((failures + 1))
    echo "$name: exit $code, $seconds s, ${line:-no crash line}: $verdict"
done
echo "crash containment: ${#cases[@]} inputs, assimp crashes $crashes, hangs $hangs, failures $failures"
# The inputs must really exercise the isolation: at least one crash and one hang.
[ $failures -eq 0 ] && [ $crashes -gt 0 ] && [ $hangs -gt 0 ]
