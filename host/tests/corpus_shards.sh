#!/usr/bin/env bash
# assimp's whole model corpus as one batch and as 4 shards: the shards'
# merged report holds the same files with the same statuses and the same
# totals as the single run.
#
# usage: corpus_shards.sh SCENE_IMPORT CORPUS_DIR
set -uo pipefail

host=$(readlink -f "$1")
corpus=$2
if [ ! -d "$corpus" ]; then
    echo "corpus shards: $corpus not found (package assimp-testmodels), skipped"
    exit 77
fi
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
# A crash of the reader must stay a signal under the sanitizers, as for users.
export ASAN_OPTIONS="${ASAN_OPTIONS:+$ASAN_OPTIONS:}handle_segv=0:handle_sigbus=0:handle_sigfpe=0:handle_abort=0:detect_leaks=0"

# shellcheck source=check.sh
source "$(dirname "$(readlink -f "$0")")/check.sh"

# The corpus as a tree of links, without the one file that makes assimp
# allocate without bound (the sweep covers it under a cap).
cp -rs "$(readlink -f "$corpus")" "$work/in"
rm -f "$work/in/invalid/OutOfMemory.off"

"$host" -q -j 2 --batch "$work/in" --report "$work/single.json" >/dev/null
for k in 1 2 3 4; do
    "$host" -q -j 2 --batch "$work/in" --shard "$k/4" --report "$work/shard-$k.json" >/dev/null
done
"$host" --merge-reports "$work/merged.json" "$work"/shard-*.json 2>"$work/merge.err"
code=$?
check "the merge of the 4 shards is whole (exit $code)" [ $code -eq 0 ]
check "the merged report equals the single run" python3 - "$work/single.json" \
    "$work/merged.json" <<'PY'
import json, sys
single, merged = (json.load(open(p)) for p in sys.argv[1:3])
a = {r["file"]: r["status"] for r in single["records"]}
b = {r["file"]: r["status"] for r in merged["records"]}
assert a == b, [(f, a.get(f), b.get(f)) for f in set(a) | set(b) if a.get(f) != b.get(f)][:10]
for total in ("files", "imported", "skipped", "failed"):
    assert single[total] == merged[total], (total, single[total], merged[total])
print(f"corpus shards: {single['files']} files, {single['imported']} imported,"
      f" {single['failed']} failed, in both")
PY

echo "corpus shards: $failures failures"
[ $failures -eq 0 ]
