#!/usr/bin/env bash
# Installs what the build and the tests need on Debian 12; does nothing when all is present.
set -euo pipefail
PACKAGES=(cmake make g++ ccache libboost-dev libgtest-dev libgmock-dev libbenchmark-dev
          clang libclang-rt-14-dev g++-mingw-w64-x86-64 wine64 wine python3 python3-pyvisa
          python3-pyvisa-py libtirpc-dev rpcsvc-proto rpcbind pkg-config libyaml-cpp-dev python3-pytest
          dpkg-dev file lintian pkgconf)
missing=()
for p in "${PACKAGES[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
if [ ${#missing[@]} -gt 0 ]; then
  SUDO=""; [ "$(id -u)" -eq 0 ] || SUDO=sudo
  echo "Installing: ${missing[*]}"
  $SUDO apt-get update -qq
  DEBIAN_FRONTEND=noninteractive $SUDO apt-get install -y -qq "${missing[@]}" >/dev/null
fi
