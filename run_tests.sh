#!/bin/sh
# Installs what korvsnmp needs on Debian, builds it, and runs every test
# twice: in a normal build (build/) and in an AddressSanitizer +
# UndefinedBehaviorSanitizer build (build-sanitize/). Run as root, or with
# sudo available.
set -eu
cd "$(dirname "$0")"

if [ "$(id -u)" -eq 0 ]; then as_root=; else as_root=sudo; fi
$as_root apt-get update -qq
$as_root env DEBIAN_FRONTEND=noninteractive apt-get install -y -qq --no-install-recommends \
    ca-certificates cmake make g++ binutils pkg-config libjsoncpp-dev libgtest-dev libgmock-dev \
    libbenchmark-dev python3-prometheus-client mandoc man-db dpkg-dev file lintian \
    snmpd snmp smitools libsmi2-common libsnmp-dev prometheus-cpp-dev prometheus systemd libncurses-dev tmux prometheus-snmp-exporter >/dev/null

jobs=$(nproc 2>/dev/null || echo 2)

run() {
    dir=$1
    shift
    echo "==> $dir: configure, build, test"
    cmake -S . -B "$dir" -DCMAKE_BUILD_TYPE=RelWithDebInfo -DKORVSNMP_WERROR=ON "$@" >/dev/null
    cmake --build "$dir" -j "$jobs"
    (cd "$dir" && ctest --output-on-failure -j "$jobs")
}

run build
export ASAN_OPTIONS=detect_leaks=1:abort_on_error=1
export UBSAN_OPTIONS=halt_on_error=1:print_stacktrace=1
run build-sanitize -DKORVSNMP_SANITIZE=ON
echo "==> all tests passed in both builds"
