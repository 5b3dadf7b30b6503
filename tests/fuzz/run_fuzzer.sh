#!/bin/sh
# Fuzzes the collector reply road (TARGET reply, the default), the SNMP
# snapshot and row index file (snapshot) or the OpenMetrics text and tables
# from a result (exposition) with libFuzzer for SECONDS (default 600) in a
# clang build (build-fuzz/), then merges what it found into the target's
# committed corpus, keeping only inputs that add coverage.
# Usage: tests/fuzz/run_fuzzer.sh [SECONDS] [reply|snapshot|exposition]
set -eu
cd "$(dirname "$0")/../.."
seconds=${1:-600}
target=${2:-reply}
case $target in
    reply) corpus=tests/fuzz/corpus ;;
    snapshot) corpus=tests/fuzz/snapshot_corpus ;;
    exposition) corpus=tests/fuzz/exposition_corpus ;;
    *) echo "run_fuzzer.sh: unknown target \"$target\"" >&2; exit 2 ;;
esac
if [ "$(id -u)" -eq 0 ]; then as_root=; else as_root=sudo; fi
$as_root env DEBIAN_FRONTEND=noninteractive apt-get install -y -qq --no-install-recommends \
    clang libclang-rt-dev cmake make libjsoncpp-dev libgtest-dev libgmock-dev prometheus-cpp-dev >/dev/null

CC=clang CXX=clang++ cmake -S . -B build-fuzz -DKORVSNMP_FUZZ=ON -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
cmake --build build-fuzz -j "$(nproc)" --target "${target}_fuzzer"
found=build-fuzz/fuzz-found-$target
mkdir -p "$found"
build-fuzz/tests/fuzz/"${target}_fuzzer" -max_total_time="$seconds" -max_len=4096 -timeout=10 \
    -rss_limit_mb=4096 "$found" "$corpus"
build-fuzz/tests/fuzz/"${target}_fuzzer" -merge=1 "$corpus" "$found"
echo "corpus: $(ls "$corpus" | wc -l) inputs"
