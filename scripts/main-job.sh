#!/usr/bin/env bash
# Main job: installs what is missing, builds everything with the release preset and runs the
# example program lbpmx-measure, which lists the sensors through the VISA C API, opens the first
# and shows one measurement going through the whole stack. With nothing configured, the VISA
# runtime loads the passport from beside itself and the simulated sensor library attaches its two
# default sensors (PMX-M01 "100000" and PMX-M10 "100001").
set -euo pipefail
cd "$(dirname "$0")/.."
bash scripts/setup.sh
launcher=(); command -v ccache >/dev/null && launcher=(-DCMAKE_C_COMPILER_LAUNCHER=ccache -DCMAKE_CXX_COMPILER_LAUNCHER=ccache)
cmake --preset release "${launcher[@]}"
cmake --build --preset release -j2
echo
echo "== lbpmx-measure"
build/release/bin/lbpmx-measure
