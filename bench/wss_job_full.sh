#!/usr/bin/env bash
# The level 1 WSS job on a full-size simulated ASA_WSS_1P product: five sub-swaths of SAMPLES
# samples (default 2000) and BURSTS bursts (default 20) of 1500 lines, a burst cycle of 900
# lines. Simulates the product once (kept in out/bench_wss), runs `sarfocus wss` under
# /usr/bin/time -v with the bound of ../shared/perfbound in the same run, and prints the wall
# time, the peak memory and the ratio to the bound.
#   bench/wss_job_full.sh [SAMPLES [BURSTS [THREADS]]]
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
build="${SAR_BUILD_DIR:-$here/build}"
source "$here/bench/measure.sh"
samples="${1:-2000}"
bursts="${2:-20}"
threads="${3:-2}"
dir="$here/out/bench_wss"
bench_need_time
cmake --build "$build" -j2 --target sarsim sarfocus focussing >/dev/null
bench_load start
bench_bound
mkdir -p "$dir/in"
product=$(ls "$dir"/in/ASA_WSS_1P*.N1 2>/dev/null | head -n 1 || true)
if [ -z "$product" ] || [ ! -f "$dir/in/.size_${samples}_${bursts}" ]; then
  rm -rf "$dir/in" && mkdir -p "$dir/in"
  echo "== simulating an ASA_WSS_1P product: 5 x $samples samples, $bursts bursts of 1500 lines"
  "$build/tools/sarsim" wss --out "$dir/in" --samples "$samples" --bursts "$bursts" --burst-lines 1500 \
    --cycle-lines 900 --target 3,9000,1000,20000 >/dev/null
  touch "$dir/in/.size_${samples}_${bursts}"
  product=$(ls "$dir"/in/ASA_WSS_1P*.N1 | head -n 1)
fi
orbit="$here/../shared/data/real/DOR_VOR_AX"
rm -rf "$dir/out" "$dir/run" && mkdir -p "$dir/run"
echo "== sarfocus wss $(basename "$product") ($(du -h "$product" | cut -f1)), $threads threads"
bench_run_job "$threads" "$dir/run" "$build/src/jobs/sarfocus" wss "$product" --orbit "$orbit" --out "$dir/out" \
  --no-quicklook --threads "$threads"
echo
echo "WSS job, 5 x $samples samples, $bursts bursts, $threads threads"
# sarfocus waits for focussing: the peak is the larger of the two processes.
bench_stages "$(ls "$dir"/out/.sarfocus/*/Vanterra.log | tail -n 1)"
bench_figures "" "" "$(bench_bound_for "$threads")"
bench_load end
