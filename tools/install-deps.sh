#!/usr/bin/env bash
# Installs the Debian packages that the build, tests, CLI and benchmarks need.
# Idempotent: asks dpkg first and touches apt only for what is missing.
set -euo pipefail

packages=(
  cmake make g++ pkg-config
  libeigen3-dev
  libgtest-dev libgmock-dev libbenchmark-dev
  openjdk-17-jdk-headless junit4
  libsndfile1-dev libcli11-dev
  android-liblog-dev
  espeak-ng xmp fb-music-high
  python3-pybind11 python3-pytest python3-numpy python3-dev
)

# Optional groups: --fuzz (clang and its fuzzer runtime), --arm64 (the
# cross compiler, qemu and the arm64 libraries the unit tests link), --web
# (emscripten, and Chromium for the page's test).
for group in "$@"; do
  case $group in
    --fuzz) packages+=(clang libclang-rt-14-dev) ;;
    --arm64)
      if ! dpkg --print-foreign-architectures | grep -qx arm64; then
        [ "$(id -u)" -ne 0 ] && sudo dpkg --add-architecture arm64 || dpkg --add-architecture arm64
      fi
      packages+=(g++-aarch64-linux-gnu qemu-user libgtest-dev:arm64
                 libgmock-dev:arm64) ;;
    --web) packages+=(emscripten chromium) ;;
    *) echo "install-deps: unknown option $group" >&2; exit 2 ;;
  esac
done

missing=()
for p in "${packages[@]}"; do
  if ! dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'install ok installed'; then
    missing+=("$p")
  fi
done

[ ${#missing[@]} -eq 0 ] && exit 0

echo "install-deps: installing ${missing[*]}" >&2
sudo=()
[ "$(id -u)" -ne 0 ] && sudo=(sudo)
export DEBIAN_FRONTEND=noninteractive
"${sudo[@]}" apt-get update -qq
"${sudo[@]}" apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
