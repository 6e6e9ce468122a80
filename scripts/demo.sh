#!/usr/bin/env bash
# Builds the product DLL and the optimised native build, then runs the demo
# through the test host.
set -euo pipefail
cd "$(dirname "$0")/.."
bash scripts/setup.sh
cmake --preset windows-x86 >/dev/null
cmake --build --preset windows-x86 -j "$(nproc)"
cmake --preset native-plain >/dev/null
cmake --build --preset native-plain -j "$(nproc)"
echo "product DLL: build/windows-x86/sorvel.dll"
build/native-plain/sorvel-demo examples/sorted-words.txt
