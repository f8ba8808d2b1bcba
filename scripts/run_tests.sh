#!/usr/bin/env bash
# Install what is missing, build, run every test, then the short fuzz pass.
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
build="${SAR_BUILD_DIR:-$here/build}"
"$here/scripts/bootstrap.sh"
cd "$build"
ctest --output-on-failure -j"$(nproc)" --timeout 900
# The short fuzz pass: every parser's target for about 15 s; any finding fails the run.
SAR_BUILD_DIR="$build" bash "$here/scripts/run_fuzz.sh" "${SAR_FUZZ_SECONDS:-15}"
