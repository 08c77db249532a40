#!/usr/bin/env bash
# The packages end to end. Builds them with scripts/package.sh (which fails on lintian errors),
# then:
#   - installs the Debian packages with dpkg -i; pyvisa.ResourceManager() without a library
#     path finds the installed runtime, lists the simulated sensors and measures each; the
#     example source builds with cc $(pkg-config --cflags --libs visa) and runs; a CMake
#     project with find_package(LbPmxVisa) builds it too; then purges the packages (dpkg -r
#     would keep the passport's conffile) and checks that nothing of them is left. The
#     packages are purged on any failure as well. Refuses to run when they were installed
#     before, since it could not put them back.
#   - under Wine (a prefix of its own, build/wineprefix-package): unzips the Windows ZIP,
#     imports its LbViPmx64.reg, adds the logging values it documents, runs the example from
#     its folder and finds its measurement and the passport's log lines; then imports
#     LbViPmx64-unregister.reg and finds the key gone.
set -uo pipefail
cd "$(dirname "$0")/../.."
root=$PWD
SUDO=""; [ "$(id -u)" -eq 0 ] || SUDO=sudo
packages=(lbvisa-dev python3-pmxsim lbpmx-passport pmxcontrol2-sim lbvisa-runtime)
key='HKLM\SOFTWARE\National Instruments\NI-VISA for Windows 95/NT\CurrentVersion\IoLibraries\LbViPmx.dll'
unset LBVISA_PASSPORTS PMXSIM_DEVICES LD_LIBRARY_PATH LBVIPMX_LOG_LEVEL LBVIPMX_LOG_FILE

present() {  # names the packages dpkg knows anything of (installed, or configuration left)
  local p
  for p in "${packages[@]}"; do
    dpkg-query -W -f='${Status}\n' "$p" 2>/dev/null | grep -qv "not-installed" && echo "$p"
  done
}
if [ -n "$(present)" ]; then
  echo "already on this machine: $(present | tr '\n' ' ')- purge them first (dpkg -P)"; exit 1
fi

tmp=$(mktemp -d)
installed=0
cleanup() {
  [ $installed -eq 1 ] && $SUDO dpkg --purge "${packages[@]}" >"$tmp/purge.log" 2>&1
  rm -rf "$tmp"
}
trap cleanup EXIT
trap 'exit 1' INT TERM HUP
status=0
fail() { echo "FAILED: $*"; status=1; }
# expect_measurement <name> <log>: the example's output holds a power value and a trace.
expect_measurement() {
  if grep -qE "^  Measured power: -?[0-9]+\.[0-9]+ dBm" "$2" && grep -qE "^  Trace received: [1-9][0-9]* points" "$2"; then
    echo "$1: $(grep -E '^  Measured power' "$2" | sed 's/^ *//')"
  else
    fail "$1 shows no measurement"; cat "$2"
  fi
}

echo "building the packages"
if ! timeout 540 bash scripts/package.sh >"$tmp/package.log" 2>&1; then
  cat "$tmp/package.log"; echo "FAILED: scripts/package.sh"; exit 1
fi
grep -E "^[EW]: " "$tmp/package.log" | sed 's/^/  lintian /'
version=$(sed -nE 's/^project\([A-Za-z]+ VERSION ([0-9.]+).*/\1/p' CMakeLists.txt)
debs=(build/packages/{lbvisa-runtime,pmxcontrol2-sim,lbpmx-passport,lbvisa-dev,python3-pmxsim}_"${version}"_*.deb)
zip=build/packages/LbPmxVisa-$version-win64.zip

# --- Debian packages
installed=1
if ! $SUDO dpkg -i "${debs[@]}" >"$tmp/install.log" 2>&1; then
  cat "$tmp/install.log"; echo "FAILED: dpkg -i"; exit 1
fi
echo "installed: $(dpkg-query -W -f='${Package} ${Version}, ' "${packages[@]}")"

# pyvisa as a user runs it: no library path, no configuration of its own, only system packages.
cat >"$tmp/installed.py" <<'PY'
import ctypes
import sys
sys.path.insert(0, sys.argv[1])
import pyvisa
import pyvisa_smoke

rm = pyvisa.ResourceManager()
print("  library: %s" % rm.visalib.library_path)
assert str(rm.visalib.library_path).startswith("/usr/lib/"), rm.visalib.library_path
names = rm.list_resources()
print("  resources: %s" % ", ".join(names))
assert len(names) == 2, names
# The simulated library the installed passport loaded (the same instance: same file, same soname).
sim = ctypes.CDLL("libPmxControl2_64.so.2")
sim.PmxSimQueueResult.argtypes = [ctypes.c_char_p, ctypes.c_int32, ctypes.c_void_p, ctypes.c_int32]
for name in names:
    inst = rm.open_resource(name)
    pyvisa_smoke.run_session(inst, sim)
    inst.close()
rm.close()
PY
if (cd "$tmp" && HOME=$tmp timeout 300 /usr/bin/python3 -I installed.py "$root/tests") >"$tmp/pyvisa.log" 2>&1; then
  grep -E "library:|resources:|power after" "$tmp/pyvisa.log"
else
  fail "pyvisa with the installed packages"; cat "$tmp/pyvisa.log"
fi

example=/usr/share/doc/lbvisa-dev/examples/measure.c
if cc -o "$tmp/measure" "$example" $(pkg-config --cflags --libs visa) >"$tmp/cc.log" 2>&1; then
  (cd "$tmp" && timeout 300 ./measure) >"$tmp/measure.log" 2>&1 || fail "the example built with pkg-config"
  expect_measurement "cc with pkg-config" "$tmp/measure.log"
else
  fail "cc \$(pkg-config --cflags --libs visa)"; cat "$tmp/cc.log"
fi

mkdir -p "$tmp/cmake"
cat >"$tmp/cmake/CMakeLists.txt" <<CM
cmake_minimum_required(VERSION 3.21)
project(measure C)
find_package(LbPmxVisa REQUIRED)
add_executable(measure $example)
target_link_libraries(measure PRIVATE LbPmxVisa::visa)
CM
if cmake -S "$tmp/cmake" -B "$tmp/cmake/build" >"$tmp/cmake.log" 2>&1 \
   && cmake --build "$tmp/cmake/build" >>"$tmp/cmake.log" 2>&1; then
  (cd "$tmp" && timeout 300 cmake/build/measure) >"$tmp/measure-cmake.log" 2>&1 || fail "the example built with CMake"
  expect_measurement "CMake find_package" "$tmp/measure-cmake.log"
else
  fail "CMake project with find_package(LbPmxVisa)"; cat "$tmp/cmake.log"
fi

before=$status
$SUDO dpkg --purge "${packages[@]}" >"$tmp/purge.log" 2>&1 || { fail "dpkg --purge"; cat "$tmp/purge.log"; }
installed=0
left=$(present)
[ -z "$left" ] || fail "still known to dpkg: $left"
for path in /etc/lbvisa /usr/include/lbvisa /usr/lib/x86_64-linux-gnu/lbvisa; do
  [ ! -e "$path" ] || fail "$path is left"
done
! /sbin/ldconfig -p | grep -qE "lib(visa|NiViSv64|PmxControl2_64)\.so" || fail "the loader's cache still lists the libraries"
[ $status -ne $before ] || echo "purged; nothing left"

# --- Windows ZIP under Wine
export WINEDEBUG=-all WINEPREFIX=$root/build/wineprefix-package
# shellcheck source=scripts/checks/lib/wine-prefix.sh
source "$root/scripts/checks/lib/wine-prefix.sh"
ensure_wine_prefix || exit 1
mkdir -p "$tmp/zip"
(cd "$tmp/zip" && cmake -E tar xf "$root/$zip") || { echo "FAILED: cannot unpack $zip"; exit 1; }
top=$(ls -d "$tmp"/zip/*/ | head -n1)
for f in LbViPmx64.reg LbViPmx64-unregister.reg bin/lbpmx-measure.exe bin/visa64.dll bin/NiViSv64.dll \
         bin/LbViPmx64.dll bin/PmxControl2_64.dll; do
  [ -f "$top$f" ] || fail "the ZIP lacks $f"
done
wreg() { wine reg "$@" </dev/null >"$tmp/reg.log" 2>&1; }
failreg() { fail "$*"; cat "$tmp/reg.log"; }
wreg delete "$key" /f
# The unregistration file is imported last, so a failed run leaves no key behind either.
wreg import "${top}LbViPmx64.reg" || failreg "wine reg import LbViPmx64.reg"
wreg query "$key" /v Path || failreg "no Path value after the import"
winlog="Z:${tmp//\//\\}\\passport.log"
wreg add "$key" /v LOG_LEVEL /d DEBUG /f && wreg add "$key" /v LOG_FILE /d "$winlog" /f \
  || failreg "cannot add the logging values"
(cd "${top}bin" && timeout 300 wine lbpmx-measure.exe) >"$tmp/wine.log" 2>&1 </dev/null \
  || fail "the unzipped example under Wine"
expect_measurement "Wine, unzipped" "$tmp/wine.log"
! grep -q "cannot load passport" "$tmp/wine.log" || fail "the registered passport did not load"
if [ -s "$tmp/passport.log" ]; then
  echo "Wine, unzipped: the passport logged $(wc -l <"$tmp/passport.log") lines as registered"
else
  fail "no log lines from the registered LOG_LEVEL and LOG_FILE"
fi
# Installed elsewhere: the passport and the sensor library in a folder of their own, registered
# by full path with an environment variable (REG_EXPAND_SZ), as installers write it.
mkdir -p "$tmp/elsewhere" && mv "${top}bin/LbViPmx64.dll" "${top}bin/PmxControl2_64.dll" "$tmp/elsewhere/" \
  || fail "cannot move the passport"
export LB_ELSEWHERE="Z:${tmp//\//\\}\\elsewhere"
wreg add "$key" /v Path /t REG_EXPAND_SZ /d '%LB_ELSEWHERE%\LbViPmx64.dll' /f \
  || failreg "cannot register the passport by full path"
(cd "${top}bin" && timeout 300 wine lbpmx-measure.exe) >"$tmp/wine-elsewhere.log" 2>&1 </dev/null \
  || fail "the example under Wine with the passport in another folder"
expect_measurement "Wine, passport in a folder of its own" "$tmp/wine-elsewhere.log"
wreg import "${top}LbViPmx64-unregister.reg" || failreg "wine reg import LbViPmx64-unregister.reg"
! wreg query "$key" || failreg "the key is still there after LbViPmx64-unregister.reg"
exit $status
