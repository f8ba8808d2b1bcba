#!/usr/bin/env bash
# Install what is missing, build, then run one IM job end to end in out/demo: simulate a
# full-width level 0 product of point targets over clutter (with its orbit and auxiliary
# files), lay out a working directory, focus it with the host's entry, measure the targets of
# the SLC against the simulator's truth and show where the quick-look is.
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
build="${SAR_BUILD_DIR:-$here/build}"
"$here/scripts/bootstrap.sh"

demo="$here/out/demo"
rm -rf "$demo"
mkdir -p "$demo/input"
echo "== simulating an IM scene (5000 lines x 5616 samples, clutter and four point targets)"
"$build/tools/sarsim" --out "$demo/input" --lines 5000 --samples 5616 --noise 0 --clutter-db 25 --clutter-contrast low --yaw-steering on \
  --target 45.000,10.000,0,40 --target 45.010,10.030,0,40 --target 44.992,9.985,100,35 \
  --target 45.004,10.060,0,40 >/dev/null
product=$(ls "$demo"/input/ASA_IM__0*.N1)
orbit=$(ls "$demo"/input/DOR_VOR_AX*)
ins=$(ls "$demo"/input/ASA_INS_AX*)
xca=$(ls "$demo"/input/ASA_XCA_AX*)

exe="$build/src/jobs/focussing"
"$exe" --setup "$demo" --arg 0="$product" --arg 1="$orbit" --arg 2="$ins" --arg 3="$xca" \
  --arg 4="$demo/demo" --arg 5=1024 --arg 6=1024 --arg 12=OK --arg 13=1.0 >/dev/null

echo "== running: focussing \"main_focussing_asar_IM#$demo/job.txt\""
set +e
# The job's console chatter (estimator progress) goes to a file; its log is Vanterra.log.
VANTERRA_INIT_DIR="$demo" "$exe" "main_focussing_asar_IM#$demo/job.txt" >"$demo/focussing.out"
status=$?
set -e
echo "== exit status: $status"
grep -E "EXTR:|Doppler centroid|SLC:|Stage time" "$demo/Vanterra.log" || true
if [ "$status" -ne 0 ]; then
  echo "== error record ($demo/Vanterra.working_error):"
  cat "$demo/Vanterra.working_error"
  exit "$status"
fi

# Map the truth (raw line of the first packet, sample of the nearest window) onto the SLC grid.
truth="$demo/input/truth.txt"
slc_line=$(grep -o "SLC: .*" "$demo/Vanterra.log" | tail -n 1)
first_line=$(echo "$slc_line" | awk '{print $9}')
first_sample=$(echo "$slc_line" | awk '{print $13}')
key() { awk -v k="$1" '$1 == k {print $3; exit}' "$truth"; }
off_line=$(awk -v a="$first_line" -v b="$(key first_line_time_sec85)" -v p="$(key prf)" 'BEGIN{printf "%.4f", (a-b)*p}')
off_sample=$(awk -v a="$first_sample" -v b="$(key near_range_time)" -v f="$(key sampling_frequency)" \
  'BEGIN{printf "%.4f", (a-b)*f}')
echo "== point targets of the SLC against the truth (sarirf)"
"$build/tools/sarirf" "$demo/demo_slc" --truth "$truth" --first-line "$off_line" --first-sample "$off_sample" \
  --json "$demo/irf.json"
echo "== products:"
ls -l "$demo"/demo_slc*
echo "== quick-look: $demo/demo_slc.tif"
