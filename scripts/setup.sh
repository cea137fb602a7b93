#!/usr/bin/env bash
# Installs what the project needs on a Debian 12 machine. Idempotent: when every
# package is already there it only checks and returns.
set -euo pipefail

packages=(cmake g++ make libassimp-dev assimp-utils assimp-testmodels rapidjson-dev
          libpugixml-dev googletest libgtest-dev libbenchmark-dev pkgconf python3
          libpng-dev libzip-dev zlib1g-dev liblz4-dev liblzma-dev libzstd-dev
          chromium parallel)

missing=()
for p in "${packages[@]}"; do
    if ! dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'ok installed'; then
        missing+=("$p")
    fi
done
[ ${#missing[@]} -eq 0 ] && exit 0

echo "setup: installing ${missing[*]}"
sudo=""
if [ "$(id -u)" -ne 0 ]; then
    command -v sudo >/dev/null || { echo "setup: need root or sudo to install ${missing[*]}" >&2; exit 1; }
    sudo="sudo"
fi
$sudo apt-get update -qq
DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "${missing[@]}"
