#!/usr/bin/env bash
# Line coverage of src/ reached by the fuzzer's corpus replay alone, with
# clang's source-based coverage. Not part of the test command.
#   bash scripts/coverage.sh            # the summary table
#   bash scripts/coverage.sh --show     # also every line, annotated
set -euo pipefail
cd "$(dirname "$0")/.."
if ! command -v llvm-profdata-14 >/dev/null || ! command -v llvm-cov-14 >/dev/null || ! command -v clang++ >/dev/null; then
  echo "coverage: installing clang and llvm-14"
  export DEBIAN_FRONTEND=noninteractive
  apt-get update -qq
  apt-get install -y -qq clang llvm-14 >/dev/null
fi
build=build/coverage
flags="-fprofile-instr-generate -fcoverage-mapping"
cmake -S . -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=Debug -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ \
  -DCMAKE_CXX_FLAGS="-O0 $flags" -DCMAKE_EXE_LINKER_FLAGS="$flags" >/dev/null
cmake --build "$build" --target fuzz_replay -j "$(nproc)" >/dev/null
rm -f "$build"/replay-*.profraw
LLVM_PROFILE_FILE="$build/replay-%p.profraw" "$build/fuzz_replay" fuzz/corpus
llvm-profdata-14 merge -sparse "$build"/replay-*.profraw -o "$build/replay.profdata"
# The Windows file read is compiled out of this Linux build, so its lines
# count neither way.
sources=$(ls src/*/*.cpp src/*/*.hpp)
llvm-cov-14 report "$build/fuzz_replay" -instr-profile="$build/replay.profdata" $sources
if [ "${1:-}" = "--show" ]; then
  llvm-cov-14 show "$build/fuzz_replay" -instr-profile="$build/replay.profdata" $sources
fi
