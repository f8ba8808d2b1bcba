#!/usr/bin/env bash
# Install the Debian packages the engine needs (only those missing), then configure and build.
# Idempotent: a second run installs nothing and rebuilds only what changed.
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
build="${SAR_BUILD_DIR:-$here/build}"

packages=(build-essential cmake pkg-config libfftw3-dev libsleef-dev libeigen3-dev libxml2-dev libcli11-dev
          libgtest-dev libgmock-dev libbenchmark-dev gdal-bin libgdal-dev
          clang libclang-rt-14-dev)
missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
if ((${#missing[@]})); then
  echo "Installing: ${missing[*]}"
  sudo=""
  [ "$(id -u)" -eq 0 ] || sudo="sudo"
  $sudo apt-get update -qq
  DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "${missing[@]}"
fi

# Wanted but not needed: GNU parallel lets the batch test run the emitted command line for real
# (the test is skipped without it). A machine that cannot install it still builds and tests.
optional=(parallel)
for p in "${optional[@]}"; do
  if ! dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed"; then
    sudo=""
    [ "$(id -u)" -eq 0 ] || sudo="sudo"
    { $sudo apt-get update -qq && DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "$p"; } \
      >/dev/null 2>&1 || echo "Optional package $p not installed: the tests that need it are skipped"
  fi
done

cmake -S "$here" -B "$build" -DCMAKE_BUILD_TYPE=Release >/dev/null
cmake --build "$build" -j"$(nproc)"
