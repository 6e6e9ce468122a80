#!/usr/bin/env bash
# Builds all six targets and runs every test that can run here: native
# (sanitizers), i386 (natively, or under qemu-i386 where the kernel does not
# run 32-bit x86 code), windows-x64 (wine64), windows-x86 (the product DLL,
# stripped, and every test against it under 32-bit wine; its static checks run
# with the native tests), the valgrind run of the optimised build, and the
# differential fuzzer (clang, libFuzzer) over its corpus and for about a
# minute. Then it makes the release archive and checks it.
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

build windows-x86   # the product DLL and its tests; the native tests check the DLL statically
if sh scripts/probe-i386.sh >/dev/null; then
  stage "test windows-x86 (32-bit wine)" 1200 ctest --preset windows-x86
else
  echo "=== SKIPPED test windows-x86: this machine does not run 32-bit x86 code (scripts/probe-i386.sh), so 32-bit wine cannot run the DLL here; its static checks still run"
fi
tested=$(sha256sum build/windows-x86/sorvel.dll | cut -d' ' -f1)
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
stage "release archive" 300 bash scripts/package.sh "$tested"
