# Shared by the benchmark scripts (sourced): builds Release in
# build/bench-release unless SKIP_BUILD=1, and names the generator, the case
# runner and the model folder. Also median and field helpers for the logs.
root=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
build="$root/build/bench-release"

if [[ "${SKIP_BUILD:-0}" != 1 ]]; then
    cmake -S "$root" -B "$build" -DCMAKE_BUILD_TYPE=Release -DSCENE_BENCH=ON \
        -DSCENE_SANITIZE=OFF -DSCENE_TESTS=OFF >/dev/null
    cmake --build "$build" -j2 --target make_grid_model import_case scene_assimp >/dev/null
fi
generate="$build/bench/make_grid_model"
run="$build/bench/import_case"
models="$build/bench-models"
mkdir -p "$models"

median() { sort -g | awk '{ v[NR] = $1 } END { print (NR % 2) ? v[(NR + 1) / 2] : (v[NR / 2] + v[NR / 2 + 1]) / 2 }'; }
field() { sed -n "s/.* $1=\([^ ]*\).*/\1/p"; }
