#!/bin/sh
# Shows this machine's statistics with korvsnmp-stat: installs what is
# missing (Debian), builds what changed, starts the reference collector
# korvsnmpcd unless something already listens on /tmp/korvsnmpcd.sock, and
# says which process it is and how to stop it. Extra arguments go to
# korvsnmp-stat (default: --format table).
#
#   ./run_stat.sh [--simulate] [KORVSNMP-STAT ARGUMENTS]
#
# --simulate shows a large appliance instead (examples/large-appliance.*):
# a private collector replays its recorded reply on the collector's fixed
# path, korvsnmp-stat reads its description, and the collector is stopped
# afterwards. It needs the path free.
set -eu
cd "$(dirname "$0")"

socket=/tmp/korvsnmpcd.sock
pidfile=$PWD/build/korvsnmpcd.pid
stat=build/tools/stat/korvsnmp-stat
collector=build/tools/korvsnmpcd/korvsnmpcd
packages="ca-certificates cmake make g++ pkg-config libjsoncpp-dev libgtest-dev libgmock-dev libbenchmark-dev
    libsnmp-dev libncurses-dev"

simulate=
if [ "${1:-}" = --simulate ]; then
    simulate=1
    shift
fi
[ $# -gt 0 ] || set -- --format table

missing=
for package in $packages; do
    dpkg-query -W -f='${Status}\n' "$package" 2>/dev/null | grep -q '^install ok installed$' ||
        missing="$missing $package"
done
if [ -n "$missing" ]; then
    if [ "$(id -u)" -eq 0 ]; then as_root=; else as_root=sudo; fi
    echo "==> installing$missing"
    $as_root apt-get update -qq
    # shellcheck disable=SC2086
    $as_root env DEBIAN_FRONTEND=noninteractive apt-get install -y -qq --no-install-recommends \
        $missing >/dev/null
fi

# CMake configures again by itself when its files changed.
[ -f build/CMakeCache.txt ] || cmake -S . -B build -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
cmake --build build -j "$(nproc 2>/dev/null || echo 2)" --target korvsnmp-stat korvsnmpcd >/dev/null

# The process id in $1 if that process is a korvsnmpcd that still runs.
our_collector() {
    [ -f "$1" ] || return 1
    pid=$(cat "$1")
    [ -n "$pid" ] && [ "$(cat "/proc/$pid/comm" 2>/dev/null)" = korvsnmpcd ] || return 1
    echo "$pid"
}

# Whether anything accepts connections on the socket path (korvsnmpcd's own
# check at start is a connect, so it never starts beside a listener).
listening() {
    $collector --socket "$socket" --probe 2>/dev/null
}

if [ -n "$simulate" ]; then
    host=examples/large-appliance.host.json
    reply=examples/large-appliance.reply.json
    if listening; then
        echo "Something already listens on $socket; the simulation needs that path free." >&2
        if pid=$(our_collector "$pidfile"); then
            echo "It is the collector started by run_stat.sh: stop it with  kill $pid" >&2
        fi
        exit 1
    fi
    simulated_pid=$PWD/build/korvsnmpcd-simulate.pid
    $collector --daemon --socket "$socket" --replay "$reply" --pidfile "$simulated_pid"
    pid=$(cat "$simulated_pid")
    trap 'kill "$pid" 2>/dev/null || true' EXIT
    echo "==> simulated appliance: korvsnmpcd (process $pid) replays $reply"
    echo "==> KORVPLATFORM_HOST=$host korvsnmp-stat $*"
    KORVPLATFORM_HOST=$host $stat "$@"
    exit
fi

if pid=$(our_collector "$pidfile"); then
    echo "==> collector korvsnmpcd runs as process $pid; stop it with  kill $pid"
elif listening; then
    echo "==> a collector not started by run_stat.sh answers on $socket"
else
    $collector --daemon --socket "$socket" --pidfile "$pidfile"
    pid=$(cat "$pidfile")
    echo "==> started korvsnmpcd as process $pid; stop it with  kill $pid"
    sleep 2.2  # two samples, so that the rates cover a whole interval
fi
echo "==> korvsnmp-stat $*"
exec $stat "$@"
