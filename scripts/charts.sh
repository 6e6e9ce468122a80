#!/usr/bin/env bash
# Draws SVG charts from Google Benchmark JSON output.
#
# usage: scripts/charts.sh RESULTS.json [OUTDIR [FILE.svg=REGEX[=TITLE] ...]]
#
# RESULTS.json comes from the benchmark binary of the native-plain build:
#   build/native-plain/sorvel_bench --benchmark_filter='^BM_(Scale|Chain)_|^BM_Load(Plain|Balanced)(Sorted|SortedChain)?/' \
#     --benchmark_min_time=0.05 --benchmark_out=bench.json --benchmark_out_format=json
# (--benchmark_format=json > bench.json works as well).
#
# OUTDIR defaults to docs/charts. Without chart arguments it draws:
#   scaling-random.svg  ^BM_Scale_   time per operation against size, random input
#   scaling-chains.svg  ^BM_Chain_   the same for chains (sorted input)
#   loading.svg         ^BM_Load(Plain|Balanced)(Sorted|SortedChain)?/
#                       plain against balanced load, per line, random and sorted files
# Each FILE.svg=REGEX[=TITLE] argument draws one chart instead, from the
# benchmarks whose names match the Python regular expression REGEX. New
# families need no code: every name FAMILY/X[/MORE] is one point, x = its first
# argument X, one line per FAMILY[/MORE]; y = CPU time per item (per iteration
# when the benchmark counts no items), both axes logarithmic. For example
#   scripts/charts.sh bench.json docs/charts 'sides.svg=^BM_Side_=Sorted against random adds'
#
# Needs python3 and gnuplot; gnuplot (gnuplot-nox) is installed with apt-get
# when missing, so the test setup does not carry it.
set -euo pipefail
if [ $# -lt 1 ] || [ ! -r "$1" ]; then
  sed -n '2,/^set -e/p' "$0" | sed '$d; s/^# \{0,1\}//' >&2
  exit 2
fi
if ! command -v gnuplot >/dev/null; then
  echo "charts: installing gnuplot-nox"
  export DEBIAN_FRONTEND=noninteractive
  apt-get update -qq
  apt-get install -y -qq gnuplot-nox >/dev/null
fi
results=$1
outdir=${2:-docs/charts}
mkdir -p "$outdir"
exec python3 "$(dirname "$0")/charts.py" "$results" "$outdir" "${@:3}"
