#!/usr/bin/env bash
# The Python example and the pmxsim module with Debian's pytest (/usr/bin/python3, python3-pytest,
# python3-pyvisa): examples/python (the measurement script against the simulated sensors) and
# tests/pmxsim/test_pmxsim_module.py, through the `visa` library of the native build.
# LB_DEV_BUILD_DIR chooses another build folder.
set -uo pipefail
cd "$(dirname "$0")/../.."
dev=${LB_DEV_BUILD_DIR:-build/dev}
# The embedded defaults: the passport beside the runtime, the two default simulated sensors.
unset LBVISA_PASSPORTS PMXSIM_DEVICES PMXSIM_CONFIG
lib="$PWD/$dev/bin/libvisa.so"
[ -f "$lib" ] || { echo "missing $lib"; exit 1; }
[ -f "$PWD/$dev/bin/LbViPmx64.so" ] || { echo "missing $PWD/$dev/bin/LbViPmx64.so"; exit 1; }
export PYVISA_LIBRARY="$lib" PYTHONDONTWRITEBYTECODE=1
timeout 300 /usr/bin/python3 -m pytest -q -p no:cacheprovider examples/python \
    tests/pmxsim/test_pmxsim_module.py
