#!/usr/bin/env bash
# Builds the product DLL and the optimised native build, then runs the demo
# script through sorvel-host and renders its trees as a picture.
set -euo pipefail
cd "$(dirname "$0")/.."
bash scripts/setup.sh
cmake --preset windows-x86 >/dev/null
cmake --build --preset windows-x86 --target sorvel -j "$(nproc)"
cmake --preset native-plain >/dev/null
cmake --build --preset native-plain -j "$(nproc)"
echo "product DLL: build/windows-x86/sorvel.dll"
build/native-plain/sorvel-host --instances 3 --use-indices 1 --seed 1 --dot build/demo.dot examples/demo.script
dot -Tpng build/demo.dot -o build/demo.png
echo "picture of the plain and the balanced load: build/demo.png"
