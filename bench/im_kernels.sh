#!/usr/bin/env bash
# Speed and image quality of the three azimuth kernels on one simulated IM scene, in one run:
# for each PerformInterpolation value the job runs with the shipped parameters otherwise, its
# azimuth stage time and wall time are taken from the log, and the point targets of its SLC
# are measured against the simulator's truth with sarirf (peak position error in lines and
# samples, -3 dB widths, PSLR, ISLR and phase).
#
#   bench/im_kernels.sh [LINES [SAMPLES [THREADS [KERNELS...]]]]   default 8000 5616 2 0 1 2
#
# The simulated product is shared with bench/im_job_full.sh ($SAR_BENCH_DIR, out/bench_im).
# SAR_BENCH_SQUINT_HZ=F simulates (and keeps apart) a scene whose beam is squinted to the
# centroid F instead of following the yaw-steering law; AzimuthOverlap is then taken from
# SAR_BENCH_AZIMUTH_OVERLAP when set. SAR_BENCH_EDGES=1 adds (and keeps apart) two targets
# near the near and far edges of the swath, where a range block's single equivalent velocity
# and centroid are furthest from the targets' own. SAR_BENCH_PARAMS, a sed script, edits the
# parameter file of every run (e.g. 's/^SamplesInBlock = .*/SamplesInBlock = 5120/').
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
build="${SAR_BUILD_DIR:-$here/build}"
lines="${1:-8000}"
samples="${2:-5616}"
threads="${3:-2}"
shift $(( $# < 3 ? $# : 3 ))
kernels=("$@")
[ ${#kernels[@]} -gt 0 ] || kernels=(0 1 2)
work="${SAR_BENCH_DIR:-$here/out/bench_im}"
cmake --build "$build" -j2 --target sarsim focussing sarirf >/dev/null

squint="${SAR_BENCH_SQUINT_HZ:-}"
edges=()
[ "${SAR_BENCH_EDGES:-0}" = 1 ] && edges=(--target 44.916,10.540,0,40 --target 45.090,9.530,0,40)
input="$work/input_${lines}x${samples}${squint:+_squint$squint}${edges:+_edges}"
if ! ls "$input"/ASA_IM__0*.N1 >/dev/null 2>&1; then
  rm -rf "$input"
  mkdir -p "$input"
  echo "== simulating ${lines} x ${samples} (clutter and point targets)"
  "$build/tools/sarsim" --out "$input" --lines "$lines" --samples "$samples" --noise 0 --clutter-db 25 \
    --clutter-contrast low --yaw-steering on ${squint:+--squint-hz "$squint"} --target 45.000,10.000,0,40 --target 45.010,10.030,0,40 \
    --target 44.992,9.985,100,35 "${edges[@]}" >/dev/null
fi
product=$(ls "$input"/ASA_IM__0*.N1)
orbit=$(ls "$input"/DOR_VOR_AX*)
ins=$(ls "$input"/ASA_INS_AX*)
xca=$(ls "$input"/ASA_XCA_AX*)
truth="$input/truth.txt"
key() { awk -v k="$1" '$1 == k {print $3; exit}' "$truth"; }

exe="${SAR_FOCUSSING:-$build/src/jobs/focussing}"  # another build of the engine to compare
for kernel in "${kernels[@]}"; do
  job="$work/kernel_$kernel"
  rm -rf "$job"
  "$exe" --setup "$job" --arg 0="$product" --arg 1="$orbit" --arg 2="$ins" --arg 3="$xca" \
    --arg 4="$job/scene" --arg 5=1024 --arg 6=1024 --arg 12=OK --arg 13=1.0 >/dev/null
  sed -i "s/^PerformInterpolation = .*/PerformInterpolation = $kernel/" "$job/des/parameters_IM.hdr"
  [ -z "${SAR_BENCH_AZIMUTH_OVERLAP:-}" ] ||
    sed -i "s/^AzimuthOverlap = .*/AzimuthOverlap = $SAR_BENCH_AZIMUTH_OVERLAP/" "$job/des/parameters_IM.hdr"
  [ -z "${SAR_BENCH_PARAMS:-}" ] || sed -i "$SAR_BENCH_PARAMS" "$job/des/parameters_IM.hdr"
  start=$(date +%s.%N)
  # Processor time (user and system) beside the wall time: on a shared machine it is the figure
  # the load disturbs least.
  if ! OMP_NUM_THREADS="$threads" VANTERRA_INIT_DIR="$job" /usr/bin/time -f "%U %S" -o "$job/cpu.txt" \
      "$exe" "main_focussing_asar_IM#$job/job.txt" >/dev/null; then
    echo "im_kernels: kernel $kernel failed" >&2
    cat "$job/Vanterra.working_error" >&2 || true
    exit 1
  fi
  wall=$(awk -v s="$start" -v e="$(date +%s.%N)" 'BEGIN {printf "%.2f", e - s}')
  azimuth=$(grep -o "Stage time azimuth *[0-9.]*" "$job/Vanterra.log" | awk '{print $4}')
  cpu=$(awk '{printf "%.2f", $1 + $2}' "$job/cpu.txt")
  slc=$(grep -o "SLC: .*" "$job/Vanterra.log" | tail -n 1)
  first_line=$(echo "$slc" | awk '{print $9}')
  first_sample=$(echo "$slc" | awk '{print $13}')
  off_line=$(awk -v a="$first_line" -v b="$(key first_line_time_sec85)" -v p="$(key prf)" 'BEGIN{printf "%.4f", (a-b)*p}')
  off_sample=$(awk -v a="$first_sample" -v b="$(key near_range_time)" -v f="$(key sampling_frequency)" \
    'BEGIN{printf "%.4f", (a-b)*f}')
  echo "== kernel $kernel (PerformInterpolation $kernel, $threads threads): wall ${wall} s, processor ${cpu} s, azimuth stage ${azimuth} s"
  "$build/tools/sarirf" "$job/scene_slc" --truth "$truth" --first-line "$off_line" --first-sample "$off_sample" \
    --json "$job/irf.json" | sed 's/^/  /'
  rm -f "$job/scene_slc"
done
