#!/usr/bin/env bash
# Batch conversion end to end: a success, a model assimp rejects, one that
# crashes it and one that hangs it (made here from corpus files), and two
# inputs with the same file name, converted in one batch. Every file must have
# its record, the batch must go on past the crash and the hang, the output
# folder holds a document for each success only, and the exit code, the
# table's order and the plain progress lines are checked. Then a folder batch
# (relative names, other files skipped, -q) and an unwritable output folder.
#
# usage: batch_conversion.sh SCENE_IMPORT CORPUS_DIR
set -uo pipefail

host=$(readlink -f "$1")
corpus=$2
mutate="$(dirname "$(readlink -f "$0")")/mutate.py"
if [ ! -d "$corpus" ]; then
    echo "batch conversion: $corpus not found (package assimp-testmodels), skipped"
    exit 77
fi
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
# A crash of the reader must stay a signal under the sanitizers, as for users.
export ASAN_OPTIONS="${ASAN_OPTIONS:+$ASAN_OPTIONS:}handle_segv=0:handle_sigbus=0:handle_sigfpe=0:handle_abort=0:detect_leaks=0"

# shellcheck source=check.sh
source "$(dirname "$(readlink -f "$0")")/check.sh"

mkdir -p "$work/in/a" "$work/in/b"
cp "$corpus/PLY/cube.ply" "$work/in/a/same.ply"
cp "$corpus/PLY/cube.ply" "$work/in/b/same.ply"
echo "this is not a model of any kind" >"$work/in/noise.ply"
python3 "$mutate" 29 "$corpus/MD5/SimpleCube.md5mesh" "$work/in/crash.md5mesh"
head -c 44 "$corpus/PLY/cube_binary.ply" >"$work/in/hang.ply"

# ---- Several models, each way of ending ----
out="$work/out/new/folder"
start=$(date +%s)
"$host" -j 2 --timeout 2 "$work/in/a/same.ply" "$work/in/noise.ply" "$work/in/crash.md5mesh" \
    "$work/in/hang.ply" "$work/in/b/same.ply" -o "$out/" --report "$work/report.json" \
    >"$work/table" 2>"$work/progress"
code=$?
seconds=$(($(date +%s) - start))
check "exit 1 when a file failed (got $code)" [ $code -eq 1 ]
check "the hang cost its time limit only ($seconds s)" [ $seconds -le 10 ]
check "one progress line per file" [ "$(grep -c '^\[[0-9]/5\] ' "$work/progress")" -eq 5 ]
check "the collision is reported" grep -q "goes to '$out/same.ply-2.json'" "$work/progress"
check "failures head the table" python3 - "$work/table" <<'EOF'
import sys
rows = open(sys.argv[1]).read().splitlines()
statuses = [r.split()[1] for r in rows[1:6]]
assert statuses[3:] == ["imported", "imported"], statuses
assert sorted(statuses[:3]) == ["crashed", "failed", "timeout"], statuses
assert rows[6].startswith("5 files: 2 imported, 3 failed"), rows[6]
EOF
check "the report's records" python3 - "$work/report.json" "$out" <<'EOF'
import json, os, sys
report = json.load(open(sys.argv[1]))
out = sys.argv[2]
records = {os.path.relpath(r["file"], os.path.dirname(os.path.dirname(r["file"])))
           if "same" in r["file"] else os.path.basename(r["file"]): r for r in report["records"]}
assert (report["files"], report["imported"], report["failed"]) == (5, 2, 3), report
expected = {"a/same.ply": ("imported", out + "/same.ply.json"),
            "b/same.ply": ("imported", out + "/same.ply-2.json"),
            "noise.ply": ("failed", ""),
            "crash.md5mesh": ("crashed", ""),
            "hang.ply": ("timeout", "")}
for name, (status, output) in expected.items():
    r = records[name]
    assert (r["status"], r["output"]) == (status, output), (name, r)
    assert (r["reason"] == "") == (status == "imported"), (name, r)
    assert r["peakMemoryKiB"] > 0 and r["seconds"] > 0, (name, r)
ok = records["a/same.ply"]
assert ok["types"]["mesh"] == 1 and ok["vertices"] == 8 and ok["faces"] == 6, ok
assert ok["objects"] == sum(ok["types"].values()), ok
assert "segmentation fault" in records["crash.md5mesh"]["reason"]
assert "gave up after 2 s" in records["hang.ply"]["reason"]
assert sorted(os.listdir(out)) == ["same.ply-2.json", "same.ply.json"], os.listdir(out)
EOF

# ---- A folder: relative names, other files left out, -q ----
rm "$work/in/crash.md5mesh" "$work/in/hang.ply" "$work/in/noise.ply"
echo "notes" >"$work/in/a/readme.txt"
gzip -c "$corpus/PLY/cube.ply" >"$work/in/packed.ply.gz"
"$host" -q --batch "$work/in" -o "$work/tree" >"$work/table" 2>"$work/progress"
code=$?
check "exit 0 when every file imported (got $code)" [ $code -eq 0 ]
check "-q shows no progress" [ ! -s "$work/progress" ]
check "outputs keep the folder's layout" [ "$(cd "$work/tree" && find . -type f | sort | tr '\n' ' ')" = \
    "./a/same.ply.json ./b/same.ply.json ./packed.ply.gz.json " ]

# ---- An output folder that cannot be made: refused before any import ----
"$host" "$work/in/a/same.ply" "$work/in/b/same.ply" -o "$work/in/a/same.ply/sub/" \
    >"$work/table" 2>"$work/progress"
code=$?
check "an output folder that cannot be made is exit 1 (got $code)" [ $code -eq 1 ]
check "... before any import" [ ! -s "$work/table" ] && ! grep -q '^\[' "$work/progress"
check "... with its reason" grep -q "cannot create the output folder" "$work/progress"

echo "batch conversion: $failures failures"
[ $failures -eq 0 ]
