#!/usr/bin/env bash
# Builds the fuzz preset (clang, libFuzzer, ASan+UBSan) and runs every <name>_fuzzer target
# for a bounded time on its seeds in fuzz/seeds/<name>/ (all targets together stay under a
# minute). Fails on a build failure, a crash, a leak, a timeout or any sanitizer report.
# fuzz/<name>.options, when present, holds further libFuzzer flags of that target (such as a
# shorter -timeout per input).
# LB_FUZZ_BUILD_DIR chooses another build folder; LB_FUZZ_SECONDS the time per target.
set -uo pipefail
cd "$(dirname "$0")/../.."
build=${LB_FUZZ_BUILD_DIR:-build/fuzz}
seconds=${LB_FUZZ_SECONDS:-15}
launcher=(); command -v ccache >/dev/null && launcher=(-DCMAKE_C_COMPILER_LAUNCHER=ccache -DCMAKE_CXX_COMPILER_LAUNCHER=ccache)
mkdir -p "$build"

if ! { cmake --preset fuzz -B "$build" "${launcher[@]}" >"$build/configure.log" 2>&1 \
       && cmake --build "$build" --target fuzzers -j2 >"$build/build.log" 2>&1; }; then
  echo "fuzz build failed:"; tail -n 40 "$build/configure.log" "$build/build.log"
  exit 1
fi

export ASAN_OPTIONS=detect_leaks=1:halt_on_error=1
export UBSAN_OPTIONS=halt_on_error=1:print_stacktrace=1
status=0; found=0
for fuzzer in "$build"/bin/*_fuzzer; do
  [ -x "$fuzzer" ] || continue
  found=1
  name=$(basename "$fuzzer" _fuzzer)
  # New inputs go to a scratch corpus; the committed seeds stay as they are.
  corpus=$(mktemp -d)
  log="$build/$name-run.log"
  options=(-timeout=10)
  [ -f "fuzz/$name.options" ] && read -r -a options <"fuzz/$name.options"
  "$fuzzer" -max_total_time="$seconds" "${options[@]}" -rss_limit_mb=2048 -print_final_stats=1 \
      -artifact_prefix="$build/$name-" "$corpus" "fuzz/seeds/$name" >"$log" 2>&1
  rc=$?
  rm -rf "$corpus"
  if [ $rc -ne 0 ] || grep -qE "runtime error:|ERROR: (Address|Leak|UndefinedBehavior)Sanitizer|deadly signal" "$log"; then
    echo "$name: FAILED (exit $rc)"; tail -n 40 "$log"; status=1
  else
    echo "$name: $(grep -E '^stat::number_of_executed_units' "$log" | awk '{print $2}') runs, no findings"
  fi
done
if [ $found -eq 0 ]; then echo "no fuzz targets were built"; exit 1; fi
exit $status
