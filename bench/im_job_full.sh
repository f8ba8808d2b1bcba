#!/usr/bin/env bash
# The IM job end to end on a simulated full-size scene, against what this machine can do, in
# one run: the bound of ../shared/perfbound (the cheapest correct range-Doppler pipeline for a
# full scene, 2 and 1 threads; SAR_BENCH_NO_BOUND=1 leaves it out), then for each thread count
# the wall time and peak memory of `focussing` (from /usr/bin/time -v), the time of each stage
# (from the job's log) and the ratio job / bound, and the bare transforms of the same scene
# (bench_scene_transforms).
#
#   bench/im_job_full.sh [LINES [SAMPLES [THREADS...]]]     default 30000 5616 2 1
#
# SAR_BENCH_MODE=AP measures the AP job the same way on an alternating polarisation product of
# as many packets (the simulator's APC sub-mode; bench/ap_job_full.sh sets it).
#
# The simulated product is kept in $SAR_BENCH_DIR (default out/bench_im, out/bench_ap for AP)
# and reused by later runs of the same size. The job runs with the shipped parameter file,
# with Flag_incore set from SAR_BENCH_INCORE (default 1: the range-compressed scene held in
# memory).
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
build="${SAR_BUILD_DIR:-$here/build}"
source "$here/bench/measure.sh"
lines="${1:-30000}"
samples="${2:-5616}"
shift $(( $# < 2 ? $# : 2 ))
thread_counts=("$@")
[ ${#thread_counts[@]} -gt 0 ] || thread_counts=(2 1)
mode="${SAR_BENCH_MODE:-IM}"
case "$mode" in
  IM) sim_mode=im; product_glob='ASA_IM__0*.N1' ;;
  AP) sim_mode=apc; product_glob='ASA_AP*_0*.N1' ;;
  *) echo "$bench_name: SAR_BENCH_MODE must be IM or AP" >&2; exit 2 ;;
esac
work="${SAR_BENCH_DIR:-$here/out/bench_$(echo "$mode" | tr 'A-Z' 'a-z')}"
incore="${SAR_BENCH_INCORE:-1}"

bench_need_time
cmake --build "$build" -j2 --target sarsim focussing bench_scene_transforms >/dev/null
# The machine is shared: its load at the start and the end says how far the figures can be trusted.
bench_load start
# The bound first, in the same run: this machine's speed varies from hour to hour.
bench_bound

# Simulates a scene of $1 lines once (kept for later runs) and sets product, orbit, ins, xca.
simulate() {
  local n="$1"
  local input="$work/input_${n}x${samples}"
  if ! ls "$input"/$product_glob >/dev/null 2>&1; then
    rm -rf "$input"
    mkdir -p "$input"
    echo "== simulating ${n} x ${samples} (clutter and point targets)"
    "$build/tools/sarsim" --out "$input" --mode "$sim_mode" --lines "$n" --samples "$samples" --noise 0 --clutter-db 25 \
      --clutter-contrast low --yaw-steering on --target 45.000,10.000,0,40 --target 45.010,10.030,0,40 \
      --target 44.992,9.985,100,35 >/dev/null
  fi
  product=$(ls "$input"/$product_glob)
  orbit=$(ls "$input"/DOR_VOR_AX*)
  ins=$(ls "$input"/ASA_INS_AX*)
  xca=$(ls "$input"/ASA_XCA_AX*)
}

job="$work/job"
exe="${SAR_FOCUSSING:-$build/src/jobs/focussing}"  # another build of the engine to compare

# Runs the job once on the simulated product with $1 threads; sets wall, cpu, peak_kb and the
# work files the run left beside its products.
run_job() {
  local threads="$1" status
  # A fresh working directory for each run: a finished job deletes its working file.
  rm -rf "$job"
  "$exe" --setup "$job" --mode "$mode" --arg 0="$product" --arg 1="$orbit" --arg 2="$ins" --arg 3="$xca" \
    --arg 4="$job/scene" --arg 5=1024 --arg 6=1024 --arg 12=OK --arg 13=1.0 >/dev/null
  sed -i "s/^Flag_incore = .*/Flag_incore = $incore/" "$job/des/parameters_$mode.hdr"
  bench_run_job "$threads" "$job" "$exe" "main_focussing_asar_$mode#$job/job.txt"
  leftover=$(cd "$job" && ls -d EXTR* DCEST_resume.txt 2>/dev/null | tr '\n' ' ' || true)
}

simulate "$lines"
summary=""
declare -A wall_of=()
for threads in "${thread_counts[@]}"; do
echo "== focussing (${threads} threads)"
run_job "$threads"
wall_of[$threads]="$wall"

echo "== bare transforms of the same scene"
read -r range_ms azimuth_ms < <(bench_bare "$lines" "$samples" "$threads")

echo
echo "$mode job, ${lines} lines x ${samples} samples, ${threads} threads, Flag_incore ${incore}"
bench_stages "$job/Vanterra.log"
grep -E "SLC: " "$job/Vanterra.log" | sed 's/^/  /'
echo "  work files left      ${leftover:-none}"
line=$(bench_figures "$(awk -v r="$range_ms" -v a="$azimuth_ms" 'BEGIN {print (r + a) / 1000.0}')" \
  "$(awk -v r="$range_ms" -v a="$azimuth_ms" 'BEGIN {printf "range lines %.2f s, azimuth columns %.2f s", r / 1000.0, a / 1000.0}')" \
  "$(bench_bound_for "$threads")")
echo "$line"
summary+="$(bench_summary_line "$line" "$threads")"$'\n'
done

# The scaling line: the speed-up of 2 threads over 1 on the same scene, and half and quarter
# scenes with 2 threads, whose time per line should match the whole scene's
# (SAR_BENCH_SCALING=0 leaves it out).
if [ "${SAR_BENCH_SCALING:-1}" != 0 ] && [ -n "${wall_of[2]:-}" ]; then
  scaling="Scaling:"
  [ -n "${wall_of[1]:-}" ] &&
    scaling+=$(awk -v a="${wall_of[1]}" -v b="${wall_of[2]}" 'BEGIN {printf " 2 threads %.2f x 1 thread;", a / b}')
  for part in 2 4; do
    n=$(( lines / part ))
    simulate "$n"
    echo "== focussing ${n} lines (2 threads)"
    run_job 2
    scaling+=$(awk -v w="$wall" -v f="${wall_of[2]}" -v p="$part" -v n="$n" \
      'BEGIN {printf " 1/%d scene (%d lines) %.2f s, %.2f x the whole scene per line;", p, n, w, (w * p) / f}')
  done
  summary+="${scaling%;}"$'\n'
fi
echo
bench_load end
echo "Summary (${lines} x ${samples}, Flag_incore ${incore}):"
printf '%s' "$summary" | sed 's/^/  /'
