#!/usr/bin/env bash
# Installs the Debian packages that the build, tests, CLI and benchmarks need.
# Idempotent: asks dpkg first and touches apt only for what is missing.
set -euo pipefail

packages=(
  cmake make g++ pkg-config
  libkissfft-dev libeigen3-dev
  libgtest-dev libgmock-dev libbenchmark-dev
  openjdk-17-jdk-headless junit4
  libsndfile1-dev libcli11-dev
  android-liblog-dev
  espeak-ng
)

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
