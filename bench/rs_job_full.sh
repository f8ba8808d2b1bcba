#!/usr/bin/env bash
# The RADARSAT-1 job end to end on a simulated full-size standard-beam (S3) scene, against the
# bare transforms the same scene needs: wall time and peak memory of `focussing` (from
# /usr/bin/time -v), the time of each stage (from the job's log), and the time of a forward and
# a backward transform over every range line and every azimuth column (bench_scene_transforms).
#
#   bench/rs_job_full.sh [LINES [SAMPLES [THREADS]]]     default 25000 6000 2
#
# The simulated product (clutter of the unsteered beam, about six PRFs of centroid, and point
# targets) is kept in $SAR_BENCH_DIR (default out/bench_rs) and reused by later runs of the same
# size. The job runs with the shipped parameter file.
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
build="${SAR_BUILD_DIR:-$here/build}"
lines="${1:-25000}"
samples="${2:-6000}"
threads="${3:-2}"
work="${SAR_BENCH_DIR:-$here/out/bench_rs}"

if [ ! -x /usr/bin/time ]; then
  echo "rs_job_full: /usr/bin/time is needed for the peak memory (Debian package 'time')" >&2
  exit 2
fi
cmake --build "$build" -j2 --target sarsim-rs focussing bench_scene_transforms >/dev/null

input="$work/input_${lines}x${samples}"
if [ ! -s "$input/dat_01.001" ]; then
  rm -rf "$input"
  mkdir -p "$input"
  echo "== simulating ${lines} x ${samples} (clutter and point targets)"
  "$build/tools/sarsim-rs" --out "$input" --beam S3 --lines "$lines" --samples "$samples" --noise 0 --clutter-db 3 \
    --target 45.000,10.000,0,2 --target 45.010,10.030,0,2 --target 44.992,9.985,100,2 >/dev/null
fi

job="$work/job"
rm -rf "$job"
exe="$build/src/jobs/focussing"
"$exe" --setup "$job" --mode RS --arg 0="$input/dat_01.001" --arg 2="$job/scene" --arg 3=1024 --arg 4=1024 \
  --arg 12=OK --arg 13=1.0 >/dev/null

echo "== focussing (${threads} threads)"
set +e
OMP_NUM_THREADS="$threads" VANTERRA_INIT_DIR="$job" /usr/bin/time -v "$exe" "main_focussing_asar_RS#$job/job.txt" \
  2>"$job/time.txt" >/dev/null
status=$?
set -e
if [ "$status" -ne 0 ]; then
  echo "rs_job_full: the job failed with status $status" >&2
  cat "$job/Vanterra.working_error" >&2 || true
  exit 1
fi
wall=$(awk -F': ' '/Elapsed \(wall clock\)/ {n = split($2, p, ":"); s = 0; for (i = 1; i <= n; i++) s = s * 60 + p[i]; print s}' \
  "$job/time.txt")
peak_kb=$(awk -F': ' '/Maximum resident set size/ {print $2}' "$job/time.txt")

echo "== bare transforms of the same scene"
bare=$(SAR_BENCH_LINES="$lines" SAR_BENCH_SAMPLES="$samples" SAR_BENCH_THREADS="$threads" \
  "$build/bench/bench_scene_transforms" --benchmark_format=csv 2>/dev/null | grep '^"BM_')
range_ms=$(echo "$bare" | awk -F, '/BM_RangeLines/ {print $3}')
azimuth_ms=$(echo "$bare" | awk -F, '/BM_AzimuthColumns/ {print $3}')

echo
echo "RS job, ${lines} lines x ${samples} samples, ${threads} threads"
grep -o "Stage time .*" "$job/Vanterra.log" | sed 's/^Stage time /  stage /'
grep -E "SLC: |Doppler centroid" "$job/Vanterra.log" | sed 's/^/  /'
awk -v w="$wall" -v p="$peak_kb" -v r="$range_ms" -v a="$azimuth_ms" 'BEGIN {
  bare = (r + a) / 1000.0
  printf "  wall time            %9.2f s\n", w
  printf "  peak memory          %9.2f GiB\n", p / 1048576.0
  printf "  bare transforms      %9.2f s (range lines %.2f s, azimuth columns %.2f s)\n", bare, r / 1000.0, a / 1000.0
  printf "  job / bare           %9.2f\n", w / bare
}'
