#!/usr/bin/env bash
# pyvisa (Debian's /usr/bin/python3) against the native build's `visa` library: the features
# that reach the library's own functions (tests/pyvisa_visa_library.py). LB_DEV_BUILD_DIR
# chooses another build folder.
set -uo pipefail
cd "$(dirname "$0")/../.."
dev=${LB_DEV_BUILD_DIR:-build/dev}
# The embedded defaults: the passport beside the runtime, the two default simulated sensors.
unset LBVISA_PASSPORTS PMXSIM_DEVICES
lib="$PWD/$dev/bin/libvisa.so"
[ -f "$lib" ] || { echo "missing $lib"; exit 1; }
[ -f "$PWD/$dev/bin/LbViPmx64.so" ] || { echo "missing $PWD/$dev/bin/LbViPmx64.so"; exit 1; }
timeout 300 /usr/bin/python3 -I tests/pyvisa_visa_library.py "$lib"
