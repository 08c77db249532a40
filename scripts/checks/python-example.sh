#!/usr/bin/env bash
# The Python example and the pmxsim module with Debian's pytest (/usr/bin/python3, python3-pytest,
# python3-pyvisa): examples/python (the measurement script against the simulated sensors) and
# tests/pmxsim/test_pmxsim_module.py, through the `visa` library of the native build.
# LB_DEV_BUILD_DIR chooses another build folder.
set -uo pipefail
cd "$(dirname "$0")/../.."
. scripts/checks/lib/native-visa.sh
unset PMXSIM_CONFIG
export PYVISA_LIBRARY="$lib" PYTHONDONTWRITEBYTECODE=1
timeout 300 /usr/bin/python3 -m pytest -q -p no:cacheprovider examples/python \
    tests/pmxsim/test_pmxsim_module.py
