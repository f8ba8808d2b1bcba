#!/usr/bin/env bash
# Build the fuzz targets (clang, libFuzzer, AddressSanitizer + UBSan) in their own folder, lay
# out the seed corpora, and run every target SECONDS long, one after the other. Exits non-zero
# on the first target that finds a crash, a leak, undefined behaviour or a slow input; the
# reproducer is left in the fuzz build folder's "findings/<target>/".
#
#   bash scripts/run_fuzz.sh 15            # CI's short pass
#   bash scripts/run_fuzz.sh 1800 orbit_text profile   # chosen targets only
#
# Corpora grow in "<fuzz build>/corpus/<target>" from run to run.
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
seconds="${1:-15}"
shift || true
fuzz_build="${SAR_FUZZ_BUILD_DIR:-$here/build-fuzz}"
normal_build="${SAR_BUILD_DIR:-$here/build}"

targets_all=(level0_header level0_walk asa_ins asa_xca asa_xch orbit_envisat orbit_text profile job_list raster_header
             configuration xml_header description)
if (($#)); then targets=("$@"); else targets=("${targets_all[@]}"); fi

for p in clang libclang-rt-14-dev; do
  if ! dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed"; then
    sudo=""
    [ "$(id -u)" -eq 0 ] || sudo="sudo"
    $sudo apt-get update -qq
    DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends clang libclang-rt-14-dev
    break
  fi
done

launcher=()
command -v ccache >/dev/null && launcher=(-DCMAKE_CXX_COMPILER_LAUNCHER=ccache)
cmake -S "$here" -B "$fuzz_build" -DSAR_FUZZ=ON -DCMAKE_CXX_COMPILER=clang++ -DCMAKE_BUILD_TYPE=RelWithDebInfo \
  "${launcher[@]}" >/dev/null
cmake --build "$fuzz_build" -j"$(nproc)" --target "${targets[@]/#/fuzz_}"

bash "$here/fuzz/make_seeds.sh" "$fuzz_build/seeds" "$normal_build"

# The targets write each input to a file; a target that dies leaves its folder here, not in /tmp.
export SAR_FUZZ_SCRATCH="$fuzz_build/scratch"
mkdir -p "$SAR_FUZZ_SCRATCH"

# A slow input is a finding: no parser may take a second on a megabyte.
status=0
for t in "${targets[@]}"; do
  corpus="$fuzz_build/corpus/$t"
  findings="$fuzz_build/findings/$t"
  mkdir -p "$corpus" "$findings"
  dict=()
  [ -f "$here/fuzz/dict/$t.dict" ] && dict=(-dict="$here/fuzz/dict/$t.dict")
  echo "fuzz_$t: ${seconds} s"
  if ! (cd "$findings" && "$fuzz_build/fuzz/fuzz_$t" "$corpus" "$fuzz_build/seeds/$t" "${dict[@]}" \
        -max_total_time="$seconds" -max_len=1048576 -len_control=0 -timeout=1 -rss_limit_mb=2048 -print_final_stats=1 \
        -artifact_prefix="$findings/" >"$findings/log.txt" 2>&1); then
    echo "fuzz_$t: FINDING, see $findings"
    grep -E "^(==[0-9]+==ERROR|SUMMARY|.*runtime error)" "$findings/log.txt" | head -5 || true
    status=1
  else
    grep -E "stat::number_of_executed_units|cov: " "$findings/log.txt" | tail -2 || true
  fi
done
exit $status
