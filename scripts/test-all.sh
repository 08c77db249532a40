#!/usr/bin/env bash
# Builds and runs every test suite: native (dev), ThreadSanitizer, AddressSanitizer+UBSan and
# the Windows build under Wine, then the extra checks in scripts/checks/ (fuzzing, end-to-end
# runs). Ends with one line "N passed, N failed" over everything that ran.
set -uo pipefail
cd "$(dirname "$0")/.."
bash scripts/setup.sh || exit 1

export WINEDEBUG=-all
export WINEPREFIX="${WINEPREFIX:-$PWD/build/wineprefix}"
export CCACHE_DIR="${CCACHE_DIR:-${HOME:-/root}/.cache/ccache}"
launcher=(); command -v ccache >/dev/null && launcher=(-DCMAKE_C_COMPILER_LAUNCHER=ccache -DCMAKE_CXX_COMPILER_LAUNCHER=ccache)

passed=0; failed=0
count_junit() {  # adds the results of one ctest run from its JUnit report
  local counts
  if ! counts=$(python3 - "$1" <<'PY'
import sys, xml.etree.ElementTree as ET
cases = ET.parse(sys.argv[1]).getroot().iter("testcase")
ok = bad = 0
for case in cases:
    status = case.get("status")
    if status == "disabled":
        continue
    if status == "run" and case.find("failure") is None:
        ok += 1
    else:
        bad += 1  # failed, or not run at all
print(ok, bad)
PY
  ); then failed=$((failed + 1)); return; fi
  passed=$((passed + ${counts% *})); failed=$((failed + ${counts#* }))
}

# shellcheck source=scripts/checks/lib/wine-prefix.sh
source scripts/checks/lib/wine-prefix.sh
ensure_wine_prefix || failed=$((failed + 1))
# One persistent Wine server for the whole run, with Wine's own service processes started here,
# their output detached: started by the first Windows test instead, they could inherit that
# test's output pipes and make CTest wait.
wineserver -k >/dev/null 2>&1 && wineserver -w >/dev/null 2>&1
wineserver -p >/dev/null 2>&1 </dev/null || true
wine cmd /c exit </dev/null >/dev/null 2>&1 || true
trap 'wineserver -k >/dev/null 2>&1 || true' EXIT

for preset in dev tsan asan mingw; do
  echo "== $preset"
  log=build/$preset-ctest.log
  mkdir -p build
  if cmake --preset "$preset" "${launcher[@]}" >build/$preset-configure.log 2>&1 \
     && cmake --build --preset "$preset" -j2 >build/$preset-build.log 2>&1; then
    repeat=()
    # Under Wine a finished test process has, rarely, failed to end; such a time-out is retried
    # once (a real hang times out again and fails).
    [ "$preset" = mingw ] && repeat=(--repeat after-timeout:2)
    rm -f "build/$preset-junit.xml"
    ctest --preset "$preset" -j2 "${repeat[@]}" --output-junit "$PWD/build/$preset-junit.xml" 2>&1 | tee "$log"
    count_junit "build/$preset-junit.xml"
  else
    echo "build of $preset failed:"; tail -n 40 build/$preset-configure.log build/$preset-build.log
    failed=$((failed + 1))
  fi
done

# The clang build checks the lock annotations (-Wthread-safety, warnings are errors); it runs nothing.
echo "== clang"
if cmake --preset clang "${launcher[@]}" >build/clang-configure.log 2>&1 \
   && cmake --build --preset clang -j2 >build/clang-build.log 2>&1; then
  passed=$((passed + 1))
else
  echo "build of clang failed:"; tail -n 40 build/clang-configure.log build/clang-build.log
  failed=$((failed + 1))
fi

for check in scripts/checks/*.sh; do
  [ -e "$check" ] || continue
  echo "== $(basename "$check" .sh)"
  if bash "$check"; then passed=$((passed + 1)); else echo "check $check failed"; failed=$((failed + 1)); fi
done

echo "$passed passed, $failed failed"
[ "$failed" -eq 0 ]
