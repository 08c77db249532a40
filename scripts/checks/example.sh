#!/usr/bin/env bash
# Runs the example program lbpmx-measure natively (build/dev) and as a Windows program under
# Wine (build/mingw) with the simulated sensors' defaults. Fails when a run fails, hangs, or
# shows no power measurement or no binary trace. LB_DEV_BUILD_DIR and LB_MINGW_BUILD_DIR choose
# other build folders.
set -uo pipefail
cd "$(dirname "$0")/../.."
. scripts/checks/lib/run-example.sh
run_example lbpmx-measure "^  Measured power: -?[0-9]+\.[0-9]+ dBm" \
    "^  Trace received: [1-9][0-9]* points"
