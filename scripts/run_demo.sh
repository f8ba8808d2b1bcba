#!/usr/bin/env bash
# Install what is missing, build, and run one IM job end to end in out/demo: lay out a working
# directory, focus the product, and show what the host would see (log, error or product files).
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
build="${SAR_BUILD_DIR:-$here/build}"
"$here/scripts/bootstrap.sh"

real="$here/../shared/data/real"
demo="$here/out/demo"
rm -rf "$demo"
exe="$build/src/jobs/focussing"
"$exe" --setup "$demo" --trace \
  --arg 0="$real/ASA_IM__0P_truncated/ASA_IM__0CNPDE20120329_071134_000000163113_00121_52721_6279.N1" \
  --arg 1="$real/DOR_VOR_AX/DOR_VOR_AXVF-P20080331_075200_20080301_215527_20080303_002327" \
  --arg 2="$real/ASA_INS_AX/ASA_INS_AXVIEC20110124_114858_20101228_112000_20141231_235959" \
  --arg 4="$demo/demo" >/dev/null

echo "== running: focussing \"main_focussing_asar_IM#$demo/job.txt\""
set +e
VANTERRA_INIT_DIR="$demo" "$exe" "main_focussing_asar_IM#$demo/job.txt"
status=$?
set -e
echo "== exit status: $status"
echo "== log ($demo/Vanterra.log), last lines:"
tail -n 12 "$demo/Vanterra.log"
if [ -f "$demo/Vanterra.working_error" ]; then
  echo "== error record ($demo/Vanterra.working_error):"
  cat "$demo/Vanterra.working_error"
fi
ls "$demo"/demo_slc* 2>/dev/null && echo "== products above" || echo "== no product written (the focuser stops at its first stage still to come)"
