# The measuring half every whole-job benchmark shares, sourced by bench/*_job_full.sh:
# the machine's load, the bound of ../shared/perfbound (run in the same sitting, because this
# machine's speed varies from hour to hour), one job under /usr/bin/time -v, the bare transforms
# of bench_scene_transforms, and the lines that set a job against both.
#
# After `bench_run_job`, the caller reads: wall (s), cpu (s, user and system of all threads),
# peak_kb. After `bench_bound`: bound_2T, bound_1T (empty when the bound is left out).

bench_name="$(basename "$0" .sh)"

bench_need_time() {
  if [ ! -x /usr/bin/time ]; then
    echo "$bench_name: /usr/bin/time is needed for the peak memory (Debian package 'time')" >&2
    exit 2
  fi
}

bench_load() {  # LABEL
  echo "== load at $1: $(uptime | sed 's/.*load average: //') ($(nproc) cores)"
}

# SAR_BENCH_NO_BOUND=1 leaves the bound out (ratios against it are then not printed).
bench_bound() {
  bound_2T="" bound_1T=""
  local bound_sh="$here/../shared/perfbound/bound.sh"
  if [ -z "${SAR_BENCH_NO_BOUND:-}" ] && [ -x "$bound_sh" ]; then
    echo "== bound of this machine (../shared/perfbound)"
    local out
    out=$("$bound_sh")
    printf '%s\n' "$out" | grep '^bound [12]T' | sed 's/^/  /'
    bound_2T=$(printf '%s\n' "$out" | awk '/^bound 2T:/ {print $3}')
    bound_1T=$(printf '%s\n' "$out" | awk '/^bound 1T:/ {print $3}')
  fi
}

bench_bound_for() {  # THREADS -> the bound measured for that thread count, or nothing
  case "$1" in
    2) printf '%s' "$bound_2T" ;;
    1) printf '%s' "$bound_1T" ;;
  esac
}

# bench_run_job THREADS WORKDIR COMMAND...: runs the job with VANTERRA_INIT_DIR=WORKDIR, its
# time report in WORKDIR/time.txt; a failing job prints its error file and ends the benchmark.
bench_run_job() {
  local threads="$1" dir="$2"
  shift 2
  local status
  set +e
  OMP_NUM_THREADS="$threads" VANTERRA_INIT_DIR="$dir" /usr/bin/time -v "$@" 2>"$dir/time.txt" >/dev/null
  status=$?
  set -e
  if [ "$status" -ne 0 ]; then
    echo "$bench_name: the job failed with status $status" >&2
    cat "$dir/Vanterra.working_error" >&2 2>/dev/null || tail -n 20 "$dir/time.txt" >&2
    exit 1
  fi
  wall=$(awk -F': ' '/Elapsed \(wall clock\)/ {n = split($2, p, ":"); s = 0; for (i = 1; i <= n; i++) s = s * 60 + p[i]; print s}' \
    "$dir/time.txt")
  peak_kb=$(awk -F': ' '/Maximum resident set size/ {print $2}' "$dir/time.txt")
  cpu=$(awk -F': ' '/User time/ {u = $2} /System time/ {s = $2} END {printf "%.2f", u + s}' "$dir/time.txt")
}

# bench_bare LINES SAMPLES THREADS -> "range_ms azimuth_ms" of a forward and backward transform
# over every range line and every azimuth column of the scene.
bench_bare() {
  SAR_BENCH_LINES="$1" SAR_BENCH_SAMPLES="$2" SAR_BENCH_THREADS="$3" \
    "$build/bench/bench_scene_transforms" --benchmark_format=csv 2>/dev/null |
    awk -F, '/BM_RangeLines/ {r = $3} /BM_AzimuthColumns/ {a = $3} END {print r, a}'
}

bench_stages() {  # LOG: the job's per-stage times
  grep -o "Stage time .*" "$1" | sed 's/^Stage time /  stage /' || true
}

# bench_figures BARE_SECONDS BARE_TEXT BOUND: the job's lines after bench_run_job.
bench_figures() {
  awk -v w="$wall" -v c="$cpu" -v p="$peak_kb" -v bare="$1" -v what="$2" -v b="$3" 'BEGIN {
    printf "  wall time            %9.2f s\n", w
    printf "  processor time       %9.2f s (user and system, all threads)\n", c
    printf "  peak memory          %9.2f GiB\n", p / 1048576.0
    if (bare != "" && bare > 0) printf "  bare transforms      %9.2f s (%s)\n  job / bare           %9.2f\n", bare, what, w / bare
    if (b != "") printf "  bound                %9.2f s\n  job / bound          %9.2f\n", b, w / b
  }'
}

bench_summary_line() {  # FIGURES THREADS -> one line for the summary
  printf '%s threads: %s\n' "$2" "$(printf '%s\n' "$1" | awk '/wall time/ {w=$3} /peak memory/ {m=$3} /job \/ bound/ {r=$4} /job \/ bare/ {x=$4}
    END {printf "wall %s s, peak %s GiB, job / bound %s, job / bare %s", w, m, (r == "" ? "-" : r), (x == "" ? "-" : x)}')"
}
