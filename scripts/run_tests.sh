#!/usr/bin/env bash
# Install what is missing, build, and run every test.
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
build="${SAR_BUILD_DIR:-$here/build}"
"$here/scripts/bootstrap.sh"
cd "$build"
ctest --output-on-failure -j"$(nproc)" --timeout 900
