#!/usr/bin/env bash
# Builds all five targets and runs every test that can run here:
# native (sanitizers), i386 (qemu), windows-x64 (wine), the product DLL's
# static checks, and the valgrind run of the optimised build.
set -euo pipefail
cd "$(dirname "$0")/.."
bash scripts/setup.sh
jobs=$(nproc)

stage() {  # stage NAME SECONDS COMMAND...
  local name=$1 budget=$2; shift 2
  echo "=== $name (budget ${budget}s)"
  local start=$SECONDS
  timeout "$budget" "$@"
  echo "=== $name done in $((SECONDS - start))s"
}

build() {  # build PRESET
  cmake --preset "$1" >/dev/null
  cmake --build --preset "$1" -j "$jobs"
}

stage "build windows-x86 (product DLL)" 900 build windows-x86
stage "build native" 900 build native
stage "test native" 900 ctest --preset native
stage "build i386" 900 build i386
stage "test i386" 1200 ctest --preset i386
stage "build windows-x64" 900 build windows-x64
stage "test windows-x64" 1200 ctest --preset windows-x64
stage "build native-plain" 900 build native-plain
stage "test native-plain" 1200 ctest --preset native-plain
