#!/usr/bin/env bash
# Runs the vendor-style example (examples/vendor_style.c: formatted VISA I/O only) natively
# (build/dev) and as a Windows program under Wine (build/mingw) with the simulated sensors'
# defaults. Fails when a run fails, hangs, or shows no power measurement or no full trace (16
# points that hold the simulated pulse near -20 dBm, so the trace settings reached the sensor).
# LB_DEV_BUILD_DIR and LB_MINGW_BUILD_DIR choose other build folders.
set -uo pipefail
cd "$(dirname "$0")/../.."
. scripts/checks/lib/run-example.sh
run_example vendor-style "^  Measured power: -?[0-9]+\.[0-9]+ dBm" "^  ASCII trace: 16 points:.* -(19|20)\." \
    "^  Trace received: 16 points:.* -(19|20)\."
