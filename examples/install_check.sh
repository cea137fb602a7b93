#!/usr/bin/env bash
# Checks the SDK as an outside consumer sees it:
#   - `cmake --install` into a fresh prefix; every public header compiles on
#     its own and none includes assimp;
#   - the libraries export nothing of the implementation's private namespaces;
#   - examples/embed builds out of tree with only that prefix on
#     CMAKE_PREFIX_PATH (and once more through pkg-config), finds the module in
#     the installed layout and prints the same world positions as the installed
#     host's `--list nodes`;
#   - `cpack -G DEB` packages headers, libraries, module, host and package files.
#
# usage: install_check.sh BUILD_DIR SOURCE_DIR
set -euo pipefail
build=$(readlink -f "$1")
source=$(readlink -f "$2")
sample=$source/samples/sample.gltf
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
prefix=$work/prefix
fail() { echo "install check: $*" >&2; exit 1; }
# The sanitized build's leak checker needs the same allowance as the host's tests.
export LSAN_OPTIONS="${LSAN_OPTIONS:+$LSAN_OPTIONS:}use_tls=0"

cmake --install "$build" --prefix "$prefix" >/dev/null
includes=$prefix/include/scene_assimp
libdir=$(dirname "$(find "$prefix" -name 'libscene.so.1' -print -quit)")
[ -n "$libdir" ] && [ -d "$libdir" ] || fail "libscene.so.1 not installed"

# Headers: each alone, two at a time.
mapfile -t headers < <(cd "$includes" && find . -name '*.h' | sort)
[ ${#headers[@]} -gt 10 ] || fail "only ${#headers[@]} public headers installed"
if grep -lE '#[[:space:]]*include[[:space:]]*[<"]assimp/' "${headers[@]/#/$includes/}"; then
    fail "public headers include assimp"
fi
printf '%s\0' "${headers[@]}" | xargs -0 -n 1 -P 2 sh -c \
    'printf "#include \"%s\"\n" "$1" | g++ -std=c++20 -fsyntax-only -Wall -Wextra -I"$0" -x c++ - ||
     { echo "install check: $1 does not compile alone" >&2; exit 255; }' "$includes"

# Exports: the private namespaces of the libraries stay inside them.
for lib in "$libdir"/libbase1.so.1 "$libdir"/libscene.so.1; do
    leaked=$(nm -D --defined-only -C "$lib" | grep -E 'attrib_map_detail|format_detail|\bas::' || true)
    [ -z "$leaked" ] || fail "$(basename "$lib") exports private symbols: $(head -3 <<<"$leaked")"
done
[ -f "$libdir/scene_assimp/plugins/scene_assimp.so" ] || fail "module not under lib/scene_assimp/plugins"

# The example against the installed package, then through pkg-config.
cmake -S "$source/examples/embed" -B "$work/embed" -DCMAKE_PREFIX_PATH="$prefix" \
      -DCMAKE_BUILD_TYPE=Release >/dev/null
cmake --build "$work/embed" >/dev/null
"$work/embed/embed_import" "$sample" >"$work/embed.txt"
grep -q '^ *mesh ' "$work/embed.txt" || fail "the example printed no mesh"
PKG_CONFIG_PATH=$libdir/pkgconfig g++ -std=c++20 -o "$work/embed_pc" \
    "$source/examples/embed/main.cpp" $(PKG_CONFIG_PATH=$libdir/pkgconfig pkg-config --cflags --libs scene_assimp) \
    -Wl,-rpath,"$libdir"
"$work/embed_pc" "$sample" | cmp -s - "$work/embed.txt" || fail "pkg-config build prints otherwise"

# The installed host finds its module in the installed layout too; its node
# listing gives the same world positions as the example.
installed_host=$prefix/bin/scene-import
env -u SCENE_ASSIMP_MODULE "$installed_host" -q "$sample" --list nodes >"$work/host.nodes" ||
    fail "the installed host cannot import the sample"
awk '$1 == "node" {print $2, $3, $4, $5}' "$work/embed.txt" >"$work/embed.nodes"
python3 - "$work/embed.nodes" "$work/host.nodes" <<'PY' ||
import sys
def load(path):
    rows = {}
    for line in open(path):
        name, *xyz = line.split()
        rows[name] = [float(v) for v in xyz]
    return rows
embed, host = load(sys.argv[1]), load(sys.argv[2])
if not embed or set(embed) != set(host):
    sys.exit(f"node names differ: {sorted(set(embed) ^ set(host))[:5]}")
for name, p in embed.items():
    if any(abs(a - b) > 1e-6 * max(1.0, abs(b)) for a, b in zip(p, host[name])):
        sys.exit(f"{name}: example {p}, host {host[name]}")
PY
    fail "the example and the host disagree on world positions"

# The Debian package.
(cd "$build" && cpack -G DEB -B "$work/deb" >/dev/null)
deb=$(find "$work/deb" -maxdepth 1 -name '*.deb' -print -quit)
[ -n "$deb" ] || fail "cpack made no .deb"
dpkg-deb --contents "$deb" >"$work/contents"
for want in include/scene_assimp/b_attrib_map.h include/scene_assimp/scene_module.h \
            'libbase1\.so\.1' 'libscene\.so\.1' scene_assimp/plugins/scene_assimp.so \
            bin/scene-import cmake/scene_assimp/scene_assimpConfig.cmake \
            scene_assimpConfigVersion.cmake pkgconfig/scene_assimp.pc; do
    grep -q -- "$want" "$work/contents" || fail "the package lacks $want"
done
dpkg-deb --field "$deb" Depends | grep -q libassimp5 || fail "the package does not depend on libassimp5"
echo "install check: ${#headers[@]} headers, example and package OK"
