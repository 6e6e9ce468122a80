#!/usr/bin/env bash
# Installs the Debian packages the builds and tests need, when missing.
# 32-bit wine comes from the i386 architecture, added here; wine is installed
# without the packages it merely recommends.
set -euo pipefail
packages=(cmake ninja-build g++ gcc g++-multilib qemu-user
          g++-mingw-w64-x86-64-posix g++-mingw-w64-i686-posix binutils-mingw-w64-i686
          libgtest-dev libbenchmark-dev valgrind clang libclang-rt-14-dev graphviz)
wine=(wine wine64 wine32:i386)
missing() {
  for p in "$@"; do
    dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || echo "$p"
  done
}
mapfile -t missing_packages < <(missing "${packages[@]}")
mapfile -t missing_wine < <(missing "${wine[@]}")
if [ ${#missing_packages[@]} -gt 0 ] || [ ${#missing_wine[@]} -gt 0 ]; then
  echo "setup: installing ${missing_packages[*]} ${missing_wine[*]}"
  export DEBIAN_FRONTEND=noninteractive
  if ! dpkg --print-foreign-architectures | grep -qx i386; then
    dpkg --add-architecture i386
  fi
  apt-get update -qq
  if [ ${#missing_packages[@]} -gt 0 ]; then
    apt-get install -y -qq "${missing_packages[@]}" >/dev/null
  fi
  if [ ${#missing_wine[@]} -gt 0 ]; then
    apt-get install -y -qq --no-install-recommends "${missing_wine[@]}" >/dev/null
  fi
fi
