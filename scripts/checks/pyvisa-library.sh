#!/usr/bin/env bash
# pyvisa (Debian's /usr/bin/python3) against the native build's `visa` library: the features
# that reach the library's own functions (tests/pyvisa_visa_library.py). LB_DEV_BUILD_DIR
# chooses another build folder.
set -uo pipefail
cd "$(dirname "$0")/../.."
. scripts/checks/lib/native-visa.sh
timeout 300 /usr/bin/python3 -I tests/pyvisa_visa_library.py "$lib"
