#!/usr/bin/env bash
# The GNU parallel recipe of docs/cluster.md on this machine: a folder of
# small corpus models converted as 4 shards by 4 local workers, the shards'
# reports merged, and the result compared with one batch of the same folder
# (records and totals equal, order aside; the same documents written). Then
# a resumed shard skips what is up to date, and a merge with a shard missing
# fails naming it.
#
# usage: cluster_recipe.sh SCENE_IMPORT CORPUS_DIR
set -uo pipefail

host=$(readlink -f "$1")
corpus=$2
if [ ! -d "$corpus" ] || ! command -v parallel >/dev/null; then
    echo "cluster recipe: $corpus or GNU parallel not found, skipped"
    exit 77
fi
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
export ASAN_OPTIONS="${ASAN_OPTIONS:+$ASAN_OPTIONS:}detect_leaks=0"

# shellcheck source=check.sh
source "$(dirname "$(readlink -f "$0")")/check.sh"

# About twenty small models in a tree, and one file no reader takes.
for dir in PLY OBJ STL OFF; do
    mkdir -p "$work/in/$dir"
    find "$corpus/$dir" -maxdepth 1 -type f -size -24k \( -name '*.ply' -o -name '*.obj' \
        -o -name '*.stl' -o -name '*.off' \) | sort | head -6 | xargs -r cp -t "$work/in/$dir"
done
echo "this is not a model of any kind" >"$work/in/noise.ply"
count=$(find "$work/in" -type f | wc -l)
echo "cluster recipe: $count models"

# ---- One machine ----
"$host" -q -j 2 --batch "$work/in" -o "$work/single/" --report "$work/single.json" >/dev/null

# ---- The recipe: 4 shards on 4 local workers, then the merge ----
mkdir -p "$work/reports"
parallel -j 4 "$host" -q -j 1 --batch "$work/in" -o "$work/out/" --shard {}/4 \
    --report "$work/reports/shard-{}.json" ::: 1 2 3 4 >/dev/null
"$host" --merge-reports "$work/merged.json" "$work"/reports/shard-*.json \
    --report-html "$work/library.html" 2>"$work/merge.err"
code=$?
check "the merge of 4 shards is whole (exit $code)" [ $code -eq 0 ]
check "the library's page has a card per file" \
    [ "$(grep -c '<div class="card' "$work/library.html")" -eq "$count" ]
check "the merged report equals the single run" python3 - "$work/single.json" "$work/merged.json" \
    "$work/single" "$work/out" "$count" <<'PY'
import json, sys
single, merged = (json.load(open(p)) for p in sys.argv[1:3])
def records(report, out):
    # What differs between two runs of the same file: times, memory, the folder.
    return {r["file"]: {k: (v.replace(out, "OUT") if k == "output" else v)
                        for k, v in r.items() if k not in ("seconds", "peakMemoryKiB")}
            for r in report["records"]}
a, b = records(single, sys.argv[3]), records(merged, sys.argv[4])
assert len(a) == int(sys.argv[5]), (len(a), sys.argv[5])
assert a == b, [(f, a.get(f), b.get(f)) for f in set(a) | set(b) if a.get(f) != b.get(f)]
for total in ("files", "imported", "skipped", "failed"):
    assert single[total] == merged[total], (total, single[total], merged[total])
assert single["failed"] >= 1 and merged["missingShards"] == [] and merged["shards"] == 4
PY
check "the same documents written" diff <(cd "$work/single" && find . -type f | sort) \
    <(cd "$work/out" && find . -type f | sort)

# ---- A resumed shard leaves what is up to date ----
model=$(python3 -c 'import json,sys; print(next(r["file"] for r in json.load(open(sys.argv[1]))["records"] if r["status"] == "imported"))' \
    "$work/reports/shard-2.json")
touch "$model"
"$host" -q -j 1 --batch "$work/in" -o "$work/out/" --shard 2/4 --skip-existing \
    --report "$work/resumed.json" >/dev/null
check "a rerun skips the documents newer than their model" python3 - "$work/resumed.json" "$model" <<'PY'
import json, sys
report = json.load(open(sys.argv[1]))
status = {r["file"]: r["status"] for r in report["records"]}
assert status.pop(sys.argv[2]) == "imported", sys.argv[2]
assert set(status.values()) <= {"skipped", "failed"} and "skipped" in status.values(), status
assert report["skipped"] == sum(1 for s in status.values() if s == "skipped")
PY

# ---- A shard missing ----
"$host" --merge-reports "$work/partial.json" "$work"/reports/shard-[123].json 2>"$work/merge.err"
code=$?
check "a merge with a shard missing is exit 1 (got $code)" [ $code -eq 1 ]
check "... naming it" grep -q "shard 4/4 has no report" "$work/merge.err"

echo "cluster recipe: $failures failures"
[ $failures -eq 0 ]
