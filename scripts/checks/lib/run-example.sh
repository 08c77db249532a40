# shellcheck shell=bash
# Sourced by the example checks, from the repository's root folder, after `set -uo pipefail`.
# run_example PROGRAM REGEX... runs the example program PROGRAM natively (build/dev) and as a
# Windows program under Wine (build/mingw) with the simulated sensors' defaults. A run fails when
# the program fails or hangs, or when no line of its output matches one of the (extended)
# REGEXes; run_example answers 0 when both runs pass. LB_DEV_BUILD_DIR and LB_MINGW_BUILD_DIR
# choose other build folders.
export WINEDEBUG=-all
export WINEPREFIX="${WINEPREFIX:-$PWD/build/wineprefix}"
# The embedded defaults: the passport beside the runtime, the two default simulated sensors.
unset LBVISA_PASSPORTS PMXSIM_DEVICES

run_example() {  # program, regex...
  local program=$1 dev=${LB_DEV_BUILD_DIR:-build/dev} mingw=${LB_MINGW_BUILD_DIR:-build/mingw}
  shift
  local native="$dev/bin/$program" windows="$mingw/bin/$program.exe" exe status=0
  for exe in "$native" "$windows"; do
    [ -f "$exe" ] || { echo "missing $exe"; status=1; }
  done
  [ $status -eq 0 ] || return 1
  run_example_once native "$@" -- "$native" || status=1
  run_example_once wine "$@" -- wine "$windows" || status=1
  return $status
}

run_example_once() {  # name, regex..., --, command...
  local name=$1 log rc regex status=0
  local -a regexes=()
  shift
  while [ "$1" != -- ]; do regexes+=("$1"); shift; done
  shift
  log=$(mktemp)
  timeout 300 "$@" >"$log" 2>&1
  rc=$?
  if [ $rc -ne 0 ]; then
    echo "$name: FAILED (exit $rc)"; status=1
  else
    for regex in "${regexes[@]}"; do grep -qE "$regex" "$log" || status=1; done
    [ $status -eq 0 ] || echo "$name: FAILED (no measurement in the output)"
  fi
  if [ $status -eq 0 ]; then
    echo "$name: $(grep -oE 'Measured power: -?[0-9.]+ dBm' "$log"), $(grep -oE 'Trace received: [0-9]+ points' "$log")"
  else
    cat "$log"
  fi
  rm -f "$log"
  return $status
}
