#!/usr/bin/env bash
# The WS job end to end on a simulated wide swath product: extraction, burst range focusing,
# burst Doppler and burst azimuth focusing of the five sub-swaths. For each thread count the
# wall time and peak memory of `focussing` (from /usr/bin/time -v), the time of each stage
# (from the job's log), and the bare transforms the burst chain needs for the same scene
# (bench_ws_transforms, one burst cycle times the bursts).
#
#   bench/ws_job_full.sh [BURSTS [SAMPLES [THREADS...]]]     default 1200 5000 2
#
# A full scene of 1200 bursts of 5000 samples needs about 2 GB for the product and 30 GB of
# work files at once (extracted echoes, range focused bursts, focused lines); smaller BURSTS
# scale it down. The product is kept in $SAR_BENCH_DIR (default out/bench_ws) and reused.
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
build="${SAR_BUILD_DIR:-$here/build}"
source "$here/bench/measure.sh"
bursts="${1:-1200}"
samples="${2:-5000}"
shift $(( $# < 2 ? $# : 2 ))
thread_counts=("$@")
[ ${#thread_counts[@]} -gt 0 ] || thread_counts=(2)
work="${SAR_BENCH_DIR:-$here/out/bench_ws}"

bench_need_time
cmake --build "$build" -j2 --target sarsim focussing bench_ws_transforms >/dev/null
bench_load start
bench_bound

# 525 packets open the acquisition; a cycle is about 360 packets.
packets=$(( 525 + bursts * 360 ))
input="$work/input_${bursts}x${samples}"
if ! ls "$input"/ASA_WS__0*.N1 >/dev/null 2>&1; then
  rm -rf "$input"
  mkdir -p "$input"
  echo "== simulating ${bursts} bursts of ${samples} samples"
  "$build/tools/sarsim" --out "$input" --mode ws --lines "$packets" --samples "$samples" --noise 0 \
    --target 45.000,10.000,0,40 >/dev/null
fi
product=$(ls "$input"/ASA_WS__0*.N1)
orbit=$(ls "$input"/DOR_VOR_AX*)
ins=$(ls "$input"/ASA_INS_AX*)
xca=$(ls "$input"/ASA_XCA_AX*)
xch=$(ls "$here"/../shared/data/real/ASA_XCH_AX/ASA_XCH_AX* | head -1)

job="$work/job"
exe="$build/src/jobs/focussing"
summary=""
for threads in "${thread_counts[@]}"; do
rm -rf "$job"
"$exe" --setup "$job" --mode WS --arg 0="$product" --arg 1="$orbit" --arg 2="$ins" --arg 3="$xca" \
  --arg 4="$job/scene" --arg 7="$xch" --arg 12=NotOK >/dev/null
echo "== focussing (${threads} threads)"
bench_run_job "$threads" "$job" "$exe" "main_focussing_asar_WS#$job/job.txt"
cycle_ms=$(SAR_BENCH_SAMPLES="$samples" SAR_BENCH_THREADS="$threads" \
  "$build/bench/bench_ws_transforms" --benchmark_format=csv 2>/dev/null | awk -F, '/BM_WsCycleTransforms/ {print $3}')

echo
echo "WS job, ${bursts} bursts of ${samples} samples, ${threads} threads"
bench_stages "$job/Vanterra.log"
line=$(bench_figures "$(awk -v c="$cycle_ms" -v b="$bursts" 'BEGIN {print c * b / 1000.0}')" \
  "$(awk -v c="$cycle_ms" 'BEGIN {printf "%.2f ms a burst cycle", c}')" "$(bench_bound_for "$threads")")
echo "$line"
summary+="$(bench_summary_line "$line" "$threads")"$'\n'
rm -f "$job"/SS? "$job"/rgfoc_ss?
done
echo
bench_load end
echo "Summary (${bursts} bursts x ${samples} samples):"
printf '%s' "$summary" | sed 's/^/  /'
