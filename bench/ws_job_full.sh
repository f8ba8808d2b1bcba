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
bursts="${1:-1200}"
samples="${2:-5000}"
shift $(( $# < 2 ? $# : 2 ))
thread_counts=("$@")
[ ${#thread_counts[@]} -gt 0 ] || thread_counts=(2)
work="${SAR_BENCH_DIR:-$here/out/bench_ws}"

if [ ! -x /usr/bin/time ]; then
  echo "ws_job_full: /usr/bin/time is needed for the peak memory (Debian package 'time')" >&2
  exit 2
fi
cmake --build "$build" -j2 --target sarsim focussing bench_ws_transforms >/dev/null

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
set +e
OMP_NUM_THREADS="$threads" VANTERRA_INIT_DIR="$job" /usr/bin/time -v "$exe" "main_focussing_asar_WS#$job/job.txt" \
  2>"$job/time.txt" >/dev/null
status=$?
set -e
if [ "$status" -ne 0 ]; then
  echo "ws_job_full: the job failed with status $status" >&2
  cat "$job/Vanterra.working_error" >&2 || true
  exit 1
fi
wall=$(awk -F': ' '/Elapsed \(wall clock\)/ {n = split($2, p, ":"); s = 0; for (i = 1; i <= n; i++) s = s * 60 + p[i]; print s}' \
  "$job/time.txt")
peak_kb=$(awk -F': ' '/Maximum resident set size/ {print $2}' "$job/time.txt")
cycle_ms=$(SAR_BENCH_SAMPLES="$samples" SAR_BENCH_THREADS="$threads" \
  "$build/bench/bench_ws_transforms" --benchmark_format=csv 2>/dev/null | awk -F, '/BM_WsCycleTransforms/ {print $3}')

echo
echo "WS job, ${bursts} bursts of ${samples} samples, ${threads} threads"
grep -o "Stage time .*" "$job/Vanterra.log" | sed 's/^Stage time /  stage /' || true
line=$(awk -v w="$wall" -v p="$peak_kb" -v c="$cycle_ms" -v b="$bursts" 'BEGIN {
  bare = c * b / 1000.0
  printf "  wall time            %9.2f s\n", w
  printf "  peak memory          %9.2f GiB\n", p / 1048576.0
  printf "  bare transforms      %9.2f s (%.2f ms a burst cycle)\n", bare, c
  printf "  job / bare           %9.2f\n", w / bare
}')
echo "$line"
summary+="${threads} threads: $(echo "$line" | awk '/wall time/ {w=$3} /peak memory/ {m=$3} /job \/ bare/ {r=$4} END {printf "wall %s s, peak %s GiB, job / bare %s", w, m, r}')"$'\n'
rm -f "$job"/SS? "$job"/rgfoc_ss?
done
echo
echo "Summary (${bursts} bursts x ${samples} samples):"
printf '%s' "$summary" | sed 's/^/  /'
