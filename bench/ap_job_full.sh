#!/usr/bin/env bash
# The AP job end to end on a simulated full-size alternating polarisation product, with the
# same figures as bench/im_job_full.sh (whose arguments it takes): the bound of the same run,
# wall time, stages and peak memory with 1 and 2 threads, ratios, and the scaling line.
SAR_BENCH_MODE=AP exec "$(dirname "${BASH_SOURCE[0]}")/im_job_full.sh" "$@"
