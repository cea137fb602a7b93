#!/usr/bin/env bash
# The main job: installs what is missing, builds the release host and module,
# and imports the project's sample model, printing its summary. Arguments, when
# given, replace the sample: scripts/run.sh model.fbx -o model.json
set -euo pipefail
cd "$(dirname "$0")/.."
# Set-up and build talk on standard error, so that "scripts/run.sh MODEL -o -"
# leaves only the document on standard output.
scripts/setup.sh >&2
build=${BUILD_DIR:-build/release}
cmake -S . -B "$build" -DCMAKE_BUILD_TYPE=Release -DSCENE_TESTS=OFF >/dev/null
cmake --build "$build" -j2 --target scene-import >&2
[ $# -gt 0 ] || set -- samples/sample.gltf
exec "$build/host/scene-import" "$@"
