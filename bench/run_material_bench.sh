#!/usr/bin/env bash
# Material benchmark: a generated binary glTF with 1,000 materials and 2,000
# textures (a base-colour file per material, a normal map from 8 embedded
# images of 8 MiB each, every image shared by 125 materials). Times the
# read and the whole import in fresh processes (see run_import_bench.sh) and
# reports the time per material and what the conversion allocates at its
# peak against the embedded image bytes: each image should be held once.
#
# Environment: REPS (default 3), MATERIALS (1000), IMAGES (8),
# IMAGE_BYTES (8388608), SKIP_BUILD=1 to reuse the build.
set -euo pipefail

root=$(cd "$(dirname "$0")/.." && pwd)
build="$root/build/bench-release"
reps=${REPS:-3}
materials=${MATERIALS:-1000}
images=${IMAGES:-8}
image_bytes=${IMAGE_BYTES:-8388608}

if [[ "${SKIP_BUILD:-0}" != 1 ]]; then
    cmake -S "$root" -B "$build" -DCMAKE_BUILD_TYPE=Release -DSCENE_BENCH=ON \
        -DSCENE_SANITIZE=OFF -DSCENE_TESTS=OFF >/dev/null
    cmake --build "$build" -j2 --target make_material_model import_case scene_assimp >/dev/null
fi
models="$build/bench-models"
mkdir -p "$models"
model="$models/materials_${materials}_${images}x${image_bytes}.glb"
[[ -s "$model" ]] || "$build/bench/make_material_model" "$model" "$materials" "$images" \
    "$image_bytes" >/dev/null
log="$model.log"
: >"$log"
for ((r = 0; r < reps; ++r)); do
    for c in read import; do
        "$build/bench/import_case" "$c" "$model" >>"$log"
    done
done

median() { sort -g | awk '{ v[NR] = $1 } END { print (NR % 2) ? v[(NR + 1) / 2] : (v[NR / 2] + v[NR / 2 + 1]) / 2 }'; }
field() { sed -n "s/.* $1=\([^ ]*\).*/\1/p"; }
read_s=$(grep '^read ' "$log" | field seconds | median)
read_mib=$(grep '^read ' "$log" | field peak_kib | median)
import_s=$(grep '^import ' "$log" | field import_seconds | median)
import_mib=$(grep '^import ' "$log" | field peak_kib | median)
heap_kib=$(grep '^import ' "$log" | field heap_peak_kib | median)
objects=$(grep '^import ' "$log" | field objects | median)
awk -v m="$materials" -v i="$images" -v b="$image_bytes" -v rs="$read_s" -v rk="$read_mib" \
    -v is="$import_s" -v ik="$import_mib" -v hk="$heap_kib" -v o="$objects" 'BEGIN {
    embedded = i * b / 1024
    printf "model: %d materials, %d textures, %d embedded images, %.1f MiB embedded; %d objects made\n",
           m, 2 * m, i, embedded / 1024, o
    printf "ReadFile %.3f s (peak %.1f MiB); whole import %.3f s (peak %.1f MiB)\n",
           rs, rk / 1024, is, ik / 1024
    printf "conversion: %.1f us per material; host heap peak %.1f MiB = %.3f x the embedded bytes\n",
           (is - rs) * 1e6 / m, hk / 1024, hk / embedded
}'
echo "target: host heap peak <= 1.10 x the embedded bytes (per-run lines in $log)"
