#!/usr/bin/env bash
# Runs the vendor-style example (examples/vendor_style.c: formatted VISA I/O only) natively
# (build/dev) and as a Windows program under Wine (build/mingw) with the simulated sensors'
# defaults. Fails when a run fails, hangs, or shows no power measurement or no full trace.
# LB_DEV_BUILD_DIR and LB_MINGW_BUILD_DIR choose other build folders.
set -uo pipefail
cd "$(dirname "$0")/../.."
export WINEDEBUG=-all
export WINEPREFIX="${WINEPREFIX:-$PWD/build/wineprefix}"
# The embedded defaults: the passport beside the runtime, the two default simulated sensors.
unset LBVISA_PASSPORTS PMXSIM_DEVICES

dev=${LB_DEV_BUILD_DIR:-build/dev}
mingw=${LB_MINGW_BUILD_DIR:-build/mingw}
status=0
run() {  # name, command...
  local name=$1 log rc; shift
  log=$(mktemp)
  timeout 300 "$@" >"$log" 2>&1
  rc=$?
  if [ $rc -ne 0 ]; then
    echo "$name: FAILED (exit $rc)"; cat "$log"; status=1
  elif ! grep -qE "^  Measured power: -?[0-9]+\.[0-9]+ dBm" "$log" \
       || ! grep -qE "^  ASCII trace: 16 points" "$log" \
       || ! grep -qE "^  Trace received: 16 points" "$log"; then
    echo "$name: FAILED (no measurement in the output)"; cat "$log"; status=1
  else
    echo "$name: $(grep -E '^  Measured power' "$log" | sed 's/^ *//'), $(grep -E '^  Trace received' "$log" | cut -c3-28)"
  fi
  rm -f "$log"
}

for exe in "$dev/bin/vendor-style" "$mingw/bin/vendor-style.exe"; do
  [ -f "$exe" ] || { echo "missing $exe"; status=1; }
done
[ $status -eq 0 ] || exit 1
run native "$dev/bin/vendor-style"
run wine wine "$mingw/bin/vendor-style.exe"
exit $status
