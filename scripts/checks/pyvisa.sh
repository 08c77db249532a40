#!/usr/bin/env bash
# Smoke test with a real VISA client: Debian's pyvisa (/usr/bin/python3) loads the `visa` library
# of the native build and talks to the simulated sensors through the passport
# (tests/pyvisa_smoke.py). LB_DEV_BUILD_DIR chooses another build folder.
set -uo pipefail
cd "$(dirname "$0")/../.."
. scripts/checks/lib/native-visa.sh
# -I: only the system's packages, whatever the user's environment or working folder holds.
timeout 300 /usr/bin/python3 -I tests/pyvisa_smoke.py "$lib"
