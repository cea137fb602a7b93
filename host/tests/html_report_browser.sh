#!/usr/bin/env bash
# The batch page in a real browser: a batch over a fixed list of corpus files
# (a few of which fail) with --report-html, opened in headless Chromium. The
# page must load without console errors and every thumbnail must decode
# (naturalWidth > 0); a screenshot is kept in the build folder to look at.
#
# usage: html_report_browser.sh SCENE_IMPORT CORPUS_DIR ARTEFACT_DIR
set -uo pipefail

host=$(readlink -f "$1")
corpus=$2
artefacts=$3
browser=$(command -v chromium || command -v chromium-browser || true)
if [ -z "$browser" ]; then
    echo "html report in a browser: chromium not found (scripts/setup.sh installs it), skipped"
    exit 77
fi
if [ ! -d "$corpus" ]; then
    echo "html report in a browser: $corpus not found (package assimp-testmodels), skipped"
    exit 77
fi
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
export ASAN_OPTIONS="${ASAN_OPTIONS:+$ASAN_OPTIONS:}detect_leaks=0"
mkdir -p "$artefacts"
artefacts=$(readlink -f "$artefacts")

models=(OBJ/box.obj OBJ/WusonOBJ.obj OBJ/cube_usemtl.obj OBJ/point_cloud.obj PLY/cube.ply
        STL/Spider_ascii.stl 3DS/fels.3ds 3DS/RotatingCube.3DS Collada/duck.dae
        Collada/cameras.dae Collada/lights.dae Collada/teapots.DAE AC/Wuson.ac
        AC/SphereWithLight.ac MD2/faerie.md2 OFF/Wuson.off X/Testwuson.X
        OFF/invalid.off)
inputs=()
for m in "${models[@]}"; do
    [ -f "$corpus/$m" ] && inputs+=("$corpus/$m")
done
# Failures whatever the corpus holds: noise and a file cut short, with markup
# in the name that the page must show as text.
echo "this is not a model of any kind" >"$work/<b>noise & 'x'.ply"
head -c 300 "$corpus/Collada/duck.dae" >"$work/cut & short.dae"
inputs+=("$work/<b>noise & 'x'.ply" "$work/cut & short.dae")

page="$artefacts/batch_report.html"
rm -f "$page" "$artefacts/batch_report.png"
"$host" -q -j 2 --report-html "$page" "${inputs[@]}" >"$work/table.txt"
code=$?
if [ "$code" -ne 1 ] || [ ! -s "$page" ]; then
    echo "FAILED: the batch answered $code (1 expected with failures) or wrote no page"
    cat "$work/table.txt"
    exit 1
fi

# The check runs in the test's own copy of the page, so the page itself stays
# free of scripts; it writes its verdict into the title, which --dump-dom shows.
cp "$page" "$work/check.html"
cat >>"$work/check.html" <<'JS'
<script>
window.addEventListener('load', () => {
  const imgs = [...document.images];
  const bad = imgs.filter(i => !(i.complete && i.naturalWidth > 0)).length;
  document.title = 'CHECK images=' + imgs.length + ' broken=' + bad +
                   ' cards=' + document.querySelectorAll('.card').length;
});
</script>
JS
run_browser() {
    local profile
    profile=$(mktemp -d -p "$work")
    timeout 120 "$browser" --headless --no-sandbox --disable-gpu --disable-background-networking \
        --disable-component-update --disable-sync --no-first-run --user-data-dir="$profile" \
        --enable-logging=stderr --v=0 "$@"
}
run_browser --virtual-time-budget=5000 --dump-dom "file://$work/check.html" \
    >"$work/dom.html" 2>"$work/console.txt"
run_browser --window-size=1280,1600 --screenshot="$artefacts/batch_report.png" "file://$page" \
    >/dev/null 2>>"$work/console.txt"

failures=0
verdict=$(grep -o 'CHECK images=[0-9]* broken=[0-9]* cards=[0-9]*' "$work/dom.html")
echo "browser: $verdict"
images=$(sed -n 's/.*images=\([0-9]*\).*/\1/p' <<<"$verdict")
broken=$(sed -n 's/.*broken=\([0-9]*\).*/\1/p' <<<"$verdict")
cards=$(sed -n 's/.*cards=\([0-9]*\).*/\1/p' <<<"$verdict")
if [ "${cards:-0}" -ne "${#inputs[@]}" ]; then
    echo "FAILED: ${cards:-no} cards for ${#inputs[@]} files"
    failures=$((failures + 1))
fi
if [ "${images:-0}" -lt 10 ] || [ "${broken:-1}" -ne 0 ]; then
    echo "FAILED: ${images:-no} thumbnails, ${broken:-?} of them do not decode"
    failures=$((failures + 1))
fi
# The page's own console messages (Chromium logs them as CONSOLE lines).
if grep -i 'CONSOLE' "$work/console.txt" | grep -iv 'CHECK images'; then
    echo "FAILED: the page logged to the console"
    failures=$((failures + 1))
fi
if grep -q '<b>noise' "$page"; then
    echo "FAILED: a file name reached the page as markup"
    failures=$((failures + 1))
fi
if [ ! -s "$artefacts/batch_report.png" ]; then
    echo "FAILED: no screenshot"
    failures=$((failures + 1))
fi
echo "page: $page ($(wc -c <"$page") bytes), screenshot: $artefacts/batch_report.png"
[ "$failures" -eq 0 ]
