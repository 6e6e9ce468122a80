#!/usr/bin/env bash
# Builds all five targets and runs every test that can run here:
# native (sanitizers), i386 (qemu), windows-x64 (wine), the product DLL's
# static checks, the valgrind run of the optimised build, and the
# differential fuzzer (clang, libFuzzer) over its corpus and for about a minute.
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
  stage "build $1" 900 bash -c "cmake --preset $1 >/dev/null && cmake --build --preset $1 -j $jobs"
}

build windows-x86   # the product DLL, checked statically by the native tests
build native
stage "test native" 900 ctest --preset native
build i386
stage "test i386" 1200 ctest --preset i386
build windows-x64
stage "test windows-x64" 1200 ctest --preset windows-x64
build native-plain
stage "test native-plain" 1200 ctest --preset native-plain
build fuzz
stage "test fuzz (corpus, then about 60 s of fuzzing)" 600 ctest --preset fuzz
