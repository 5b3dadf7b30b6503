#!/bin/sh
# Shows this machine's statistics with korvsnmp-stat: installs what is
# missing (Debian), builds what changed, starts the reference collector
# korvsnmpcd unless something already listens on /tmp/korvsnmpcd.sock, waits
# for its second sample, and says which process it is and how to stop it.
# Extra arguments go to korvsnmp-stat (default: --format table). Its own
# lines ("==> ...") go to standard error, so that the output pipes clean.
#
#   ./run_stat.sh [--simulate] [KORVSNMP-STAT ARGUMENTS]
#
# --simulate shows a large appliance instead (examples/large-appliance.*):
# a private collector simulates it on the collector's fixed path (loads that
# differ per device and move from sample to sample), korvsnmp-stat reads its
# description, and the collector is stopped afterwards. It needs the path
# free. Its volumes need root: their block-device nodes are made in a
# private directory, and korvsnmp-stat runs in a private mount namespace
# whose /sys/dev/block has the links that name them (unshare -m).
#
# The environment may set KORVSNMP_BUILD (a built tree to use as it is,
# instead of building build/), KORVSNMPCD_PIDFILE (where a collector started
# here writes its process id, default build/korvsnmpcd.pid) and
# KORVSNMPCD_INTERVAL (the sampling interval of a collector started here, in
# seconds, default 1).
set -eu
cd "$(dirname "$0")"

socket=/tmp/korvsnmpcd.sock
build=${KORVSNMP_BUILD:-build}
interval=${KORVSNMPCD_INTERVAL:-1}
pidfile=${KORVSNMPCD_PIDFILE:-$build/korvsnmpcd.pid}
stat=$build/tools/stat/korvsnmp-stat
collector=$build/tools/korvsnmpcd/korvsnmpcd
packages="ca-certificates cmake make g++ pkg-config libjsoncpp-dev libgtest-dev libgmock-dev libbenchmark-dev
    libsnmp-dev prometheus-cpp-dev libncurses-dev"

say() {
    echo "==> $*" >&2
}

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
    say "installing$missing"
    $as_root apt-get update -qq >&2
    # shellcheck disable=SC2086
    $as_root env DEBIAN_FRONTEND=noninteractive apt-get install -y -qq --no-install-recommends \
        $missing >/dev/null
fi

if [ -z "${KORVSNMP_BUILD:-}" ]; then
    # CMake configures again by itself when its files changed.
    [ -f "$build/CMakeCache.txt" ] || cmake -S . -B "$build" -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
    cmake --build "$build" -j "$(nproc 2>/dev/null || echo 2)" --target korvsnmp-stat korvsnmpcd >/dev/null
fi

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

# The time of the collector's latest sample, as korvsnmp-stat reports it
# (the environment of the caller, KORVPLATFORM_HOST included).
sample_time() {
    "$@" --resource memory --compact 2>/dev/null | sed -n 's/.*"time":\([0-9]*\).*/\1/p'
}

# Waits until the collector's sample time moves past the first one seen, so
# that its rates cover a whole interval (its first sample has none): at most
# 10 s. The arguments run korvsnmp-stat.
wait_for_second_sample() {
    first=
    tries=0
    while [ $tries -lt 100 ]; do
        now=$(sample_time "$@")
        if [ -z "$first" ]; then
            first=$now
        elif [ -n "$now" ] && [ "$now" != "$first" ]; then
            return 0
        fi
        tries=$((tries + 1))
        sleep 0.1
    done
    say "the collector gave no second sample within 10 s; its first has no rates"
}

# Makes, in directory $1, block-device nodes for the devices in $2
# ("KERNEL-NAME NODE-PATH" lines), the /sys/dev/block links that name them
# ($1/sys-dev-block) and a copy of host description $3 that names the nodes
# ($1/host.json), and tries the private mount namespace that shows them.
# False, with what failed on stderr, when it cannot (not root, a container
# that forbids mounts).
make_volume_devices() {
    dir=$1 devices=$2 host=$3
    mkdir -p "$dir/nodes" "$dir/sys-dev-block"
    : >"$dir/paths.sed"
    minor=0
    while read -r name path; do
        # A major number for local use: the kernel has no such device, and no
        # one opens these nodes; they only resolve to their kernel names.
        mknod "$dir/nodes/$name" b 240 "$minor" || return 1
        ln -s "../devices/virtual/block/$name" "$dir/sys-dev-block/240:$minor" || return 1
        echo "s|\"$path\"|\"$dir/nodes/$name\"|g" >>"$dir/paths.sed"
        minor=$((minor + 1))
    done <"$devices"
    sed -f "$dir/paths.sed" "$host" >"$dir/host.json" || return 1
    # shellcheck disable=SC2016
    unshare -m sh -c 'mount --bind "$0" /sys/dev/block' "$dir/sys-dev-block"  # allowed here?
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
    scratch=$(mktemp -d /tmp/korvsnmp-simulate.XXXXXX)
    pid=
    trap 'if [ -n "$pid" ]; then kill "$pid" 2>/dev/null || true; fi; rm -rf "$scratch"' EXIT
    trap 'exit 130' INT TERM
    $collector --daemon --socket "$socket" --simulate "$reply" --interval "$interval" \
        --pidfile "$scratch/korvsnmpcd.pid"
    pid=$(cat "$scratch/korvsnmpcd.pid")
    say "simulated appliance: korvsnmpcd (process $pid) simulates $reply"
    volumes=
    if [ "$(id -u)" -eq 0 ] && command -v unshare >/dev/null &&
        make_volume_devices "$scratch" examples/large-appliance.devices "$host" 2>"$scratch/why"; then
        volumes=1
        host=$scratch/host.json
    else
        say "no volumes shown: their device nodes and /sys/dev/block links need root and unshare" \
            "($(cat "$scratch/why" 2>/dev/null || echo "not root"))"
    fi
    wait_for_second_sample env KORVPLATFORM_HOST="$host" "$stat"
    say "KORVPLATFORM_HOST=$host korvsnmp-stat $*"
    status=0
    if [ -n "$volumes" ]; then
        # shellcheck disable=SC2016
        KORVPLATFORM_HOST=$host unshare -m sh -c 'mount --bind "$0" /sys/dev/block && exec "$@"' \
            "$scratch/sys-dev-block" "$stat" "$@" || status=$?
    else
        KORVPLATFORM_HOST=$host "$stat" "$@" || status=$?
    fi
    exit $status
fi

if pid=$(our_collector "$pidfile"); then
    say "collector korvsnmpcd runs as process $pid; stop it with  kill $pid"
elif listening; then
    say "a collector not started by run_stat.sh answers on $socket"
else
    $collector --daemon --socket "$socket" --interval "$interval" --pidfile "$pidfile"
    pid=$(cat "$pidfile")
    say "started korvsnmpcd as process $pid; stop it with  kill $pid"
    wait_for_second_sample "$stat"
fi
say "korvsnmp-stat $*"
exec "$stat" "$@"
