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
# size. The job runs with the shipped parameter file, with the bound of ../shared/perfbound
# measured in the same run (SAR_BENCH_NO_BOUND=1 leaves it out).
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
build="${SAR_BUILD_DIR:-$here/build}"
source "$here/bench/measure.sh"
lines="${1:-25000}"
samples="${2:-6000}"
threads="${3:-2}"
work="${SAR_BENCH_DIR:-$here/out/bench_rs}"

bench_need_time
cmake --build "$build" -j2 --target sarsim-rs focussing bench_scene_transforms >/dev/null
bench_load start
bench_bound

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
bench_run_job "$threads" "$job" "$exe" "main_focussing_asar_RS#$job/job.txt"

echo "== bare transforms of the same scene"
read -r range_ms azimuth_ms <<<"$(bench_bare "$lines" "$samples" "$threads")"
bare=$(awk -v r="$range_ms" -v a="$azimuth_ms" 'BEGIN {printf "%.3f", (r + a) / 1000.0}')

echo
echo "RS job, ${lines} lines x ${samples} samples, ${threads} threads"
bench_stages "$job/Vanterra.log"
grep -E "SLC: |Doppler centroid" "$job/Vanterra.log" | sed 's/^/  /'
bench_figures "$bare" "$(awk -v r="$range_ms" -v a="$azimuth_ms" \
  'BEGIN {printf "range lines %.2f s, azimuth columns %.2f s", r / 1000.0, a / 1000.0}')" "$(bench_bound_for "$threads")"
bench_load end
