#!/usr/bin/env bash
# Builds the packages into build/packages/:
#   - the Debian packages lbvisa-runtime, lbpmx-passport, pmxcontrol2-sim, python3-pmxsim and lbvisa-dev, with
#     CPack from the release build (configured here with the prefix /usr), checked with lintian
#     (any error fails);
#   - LbPmxVisa-<version>-win64.zip, with CPack from the Windows cross build (mingw).
# "deb" or "zip" as the argument builds only that kind. Installs what is missing first.
set -euo pipefail
cd "$(dirname "$0")/.."
what=${1:-all}
case "$what" in all|deb|zip) ;; *) echo "usage: $0 [all|deb|zip]" >&2; exit 2 ;; esac
bash scripts/setup.sh
launcher=(); command -v ccache >/dev/null && launcher=(-DCMAKE_C_COMPILER_LAUNCHER=ccache -DCMAKE_CXX_COMPILER_LAUNCHER=ccache)
out=$PWD/build/packages
mkdir -p "$out"

# cpack_into <build folder> <generator> <pattern>: packages and moves the results to $out.
cpack_into() {
  local dir=$1 generator=$2 pattern=$3
  rm -f "$dir"/$pattern
  (cd "$dir" && cpack -G "$generator" >cpack.log 2>&1) || { cat "$dir/cpack.log"; return 1; }
  rm -f "$out"/$pattern
  mv "$dir"/$pattern "$out"/
}

if [ "$what" != zip ]; then
  echo "== Debian packages (release build)"
  # A Debian package installs below /usr: libraries in lib/<multiarch>, no search paths.
  cmake --preset release "${launcher[@]}" -DCMAKE_INSTALL_PREFIX=/usr >/dev/null
  cmake --build --preset release -j2 >/dev/null
  cpack_into build/release DEB '*.deb'
  # lintian: warnings are shown, errors fail.
  rc=0; lintian --fail-on error "$out"/*.deb >build/release/lintian.log 2>&1 || rc=$?
  grep -v "running with root privileges" build/release/lintian.log || true
  [ $rc -eq 0 ] || { echo "lintian found errors"; exit 1; }
fi

if [ "$what" != deb ]; then
  echo "== Windows ZIP (mingw build)"
  cmake --preset mingw "${launcher[@]}" >/dev/null
  cmake --build --preset mingw -j2 >/dev/null
  cpack_into build/mingw ZIP '*.zip'
fi

ls -1 "$out"
