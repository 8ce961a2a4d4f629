#!/usr/bin/env bash
# Builds the browser page into BUILD_DIR/dist with Debian's emscripten:
# the modem core (with the KISS FFT in third_party/), and the
# page's own files. Usage: web/build.sh [BUILD_DIR] [JOBS]
set -euo pipefail
cd "$(dirname "$0")/.."
build=${1:-build-web}
jobs=${2:-2}
mkdir -p "$build"
build=$(cd "$build" && pwd)

# Debian's emscripten finds its JavaScript optimiser's modules here.
export NODE_PATH=/usr/share/nodejs
emcmake cmake -S . -B "$build" -DCMAKE_BUILD_TYPE=Release -DSORVEL_WERROR=ON >/dev/null
cmake --build "$build" -j "$jobs"
echo "web: page in $build/dist (serve it over http://localhost, then open index.html)"
