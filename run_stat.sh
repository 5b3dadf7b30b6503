#!/bin/sh
# Installs what korvsnmp needs on Debian, builds it, starts the reference
# collector korvsnmpcd (unless a collector already answers on
# /tmp/korvsnmpcd.sock) and prints this machine's statistics with
# korvsnmp-stat. The collector is left running; stop it with
#   pkill -x korvsnmpcd
# Extra arguments go to korvsnmp-stat (default: --format table).
set -eu
cd "$(dirname "$0")"

if [ "$(id -u)" -eq 0 ]; then as_root=; else as_root=sudo; fi
$as_root apt-get update -qq
$as_root env DEBIAN_FRONTEND=noninteractive apt-get install -y -qq --no-install-recommends \
    ca-certificates cmake make g++ pkg-config libjsoncpp-dev libgtest-dev libgmock-dev \
    libbenchmark-dev >/dev/null

cmake -S . -B build -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
cmake --build build -j "$(nproc 2>/dev/null || echo 2)" --target korvsnmp-stat korvsnmpcd >/dev/null

stat=build/tools/stat/korvsnmp-stat
if ! $stat --resource memory --compact >/dev/null 2>&1; then
    echo "==> starting the reference collector korvsnmpcd"
    build/tools/korvsnmpcd/korvsnmpcd --daemon
    sleep 2.2  # two samples, so that the rates cover a whole interval
fi
[ $# -gt 0 ] || set -- --format table
echo "==> korvsnmp-stat $*"
exec $stat "$@"
