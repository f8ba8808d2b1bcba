#!/usr/bin/env bash
# Install what is missing, build, then run one IM job end to end in out/demo: simulate a level 0
# product of point targets (with its orbit and auxiliary files), lay out a working directory,
# focus, and show what the host would see (log, error record or product files).
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
build="${SAR_BUILD_DIR:-$here/build}"
"$here/scripts/bootstrap.sh"

demo="$here/out/demo"
rm -rf "$demo"
mkdir -p "$demo/input"
echo "== simulating an IM scene (4096 lines x 2048 samples, three point targets)"
"$build/tools/sarsim" --out "$demo/input" --lines 4096 --samples 2048 \
  --target 45.000,10.000,0,1 --target 45.010,10.020,0,2 --target 44.990,10.010,100,1.5 >/dev/null
product=$(ls "$demo"/input/ASA_IM__0*.N1)
orbit=$(ls "$demo"/input/DOR_VOR_AX*)
ins=$(ls "$demo"/input/ASA_INS_AX*)
xca=$(ls "$demo"/input/ASA_XCA_AX*)

exe="$build/src/jobs/focussing"
"$exe" --setup "$demo" --trace --arg 0="$product" --arg 1="$orbit" --arg 2="$ins" --arg 3="$xca" \
  --arg 4="$demo/demo" >/dev/null

echo "== running: focussing \"main_focussing_asar_IM#$demo/job.txt\""
set +e
VANTERRA_INIT_DIR="$demo" "$exe" "main_focussing_asar_IM#$demo/job.txt"
status=$?
set -e
echo "== exit status: $status"
echo "== log ($demo/Vanterra.log): extraction and the end of the run"
grep "EXTR:" "$demo/Vanterra.log" || true
tail -n 9 "$demo/Vanterra.log"
if [ -f "$demo/Vanterra.working_error" ]; then
  echo "== error record ($demo/Vanterra.working_error):"
  cat "$demo/Vanterra.working_error"
fi
echo "== truth of the simulated scene: $demo/input/truth.txt"
if ls "$demo"/demo_slc* >/dev/null 2>&1; then
  ls "$demo"/demo_slc*
else
  echo "== no product written yet: the focuser stops at its first stage still to come"
fi
