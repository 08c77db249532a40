# shellcheck shell=bash
# Sourced by the checks that drive the native build's `visa` library from Python, from the
# repository's root folder. Sets dev (the build folder: LB_DEV_BUILD_DIR, default build/dev) and
# lib (the library's absolute path), clears what would replace the embedded defaults (the
# passport beside the runtime, the two default simulated sensors), and exits when the library or
# the passport is missing.
dev=${LB_DEV_BUILD_DIR:-build/dev}
unset LBVISA_PASSPORTS PMXSIM_DEVICES
lib="$PWD/$dev/bin/libvisa.so"
[ -f "$lib" ] || { echo "missing $lib"; exit 1; }
[ -f "$PWD/$dev/bin/LbViPmx64.so" ] || { echo "missing $PWD/$dev/bin/LbViPmx64.so"; exit 1; }
