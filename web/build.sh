#!/usr/bin/env bash
# Builds the browser page into BUILD_DIR/dist with Debian's emscripten:
# the modem core, KISS FFT compiled from Debian's source package, and the
# page's own files. Usage: web/build.sh [BUILD_DIR] [JOBS]
set -euo pipefail
cd "$(dirname "$0")/.."
build=${1:-build-web}
jobs=${2:-2}
mkdir -p "$build"
build=$(cd "$build" && pwd)

# KISS FFT has no WebAssembly binary in Debian: unpack its source package once.
kiss=$build/kissfft-src
if [ ! -f "$kiss/kiss_fftr.c" ]; then
  rm -rf "$build/kissfft-pkg" && mkdir -p "$build/kissfft-pkg"
  (cd "$build/kissfft-pkg" && apt-get source -qq kissfft >/dev/null 2>&1) || {
    echo "web: 'apt-get source kissfft' failed (make web adds the deb-src entry)" >&2
    exit 1
  }
  rm -rf "$kiss" && mv "$build"/kissfft-pkg/kissfft-*/ "$kiss" && rm -rf "$build/kissfft-pkg"
fi

# Debian's emscripten finds its JavaScript optimiser's modules here.
export NODE_PATH=/usr/share/nodejs
emcmake cmake -S . -B "$build" -DCMAKE_BUILD_TYPE=Release -DSORVEL_WERROR=ON \
  -DSORVEL_KISSFFT_SOURCE_DIR="$kiss" >/dev/null
cmake --build "$build" -j "$jobs"
echo "web: page in $build/dist (serve it over http://localhost, then open index.html)"
