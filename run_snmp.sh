#!/bin/sh
# Shows this machine's statistics as SNMP objects: installs net-snmp and the
# build tools where missing, builds, starts the reference collector korvsnmpcd
# (unless a collector already answers on /tmp/korvsnmpcd.sock), starts Debian's
# snmpd on udp:127.0.0.1:1161 with a private configuration, starts the AgentX
# subagent korvsnmp-agentx under it, and walks KORVSNMP-MIB with names.
# With --module, snmpd loads korvsnmp-snmpd.so (dlmod) in place of the subagent.
# Everything is left running; the last lines say how to stop it by process id.
# A program that ends at once (snmpd on a busy port) is reported with its own
# reason, and what was started is stopped again.
#
# The environment may set KORVSNMP_BUILD (a built tree to use as it is,
# instead of building build/) and KORVSNMP_SNMP_PORT (instead of 1161).
set -eu
module=
case "${1-}" in
    --module) module=yes ;;
    "") ;;
    *) echo "usage: run_snmp.sh [--module]" >&2; exit 2 ;;
esac
cd "$(dirname "$0")"
top=$(pwd)
port=${KORVSNMP_SNMP_PORT:-1161}
build=${KORVSNMP_BUILD:-build}

packages="ca-certificates cmake make g++ pkg-config libjsoncpp-dev libgtest-dev libgmock-dev
          libbenchmark-dev snmpd snmp smitools libsmi2-common libsnmp-dev prometheus-cpp-dev libncurses-dev"
missing=
for package in $packages; do
    dpkg-query -W -f '${Status}' "$package" 2>/dev/null | grep -q 'ok installed' || missing="$missing $package"
done
if [ -n "$missing" ]; then
    if [ "$(id -u)" -eq 0 ]; then as_root=; else as_root=sudo; fi
    echo "==> installing$missing"
    $as_root apt-get update -qq
    # shellcheck disable=SC2086
    $as_root env DEBIAN_FRONTEND=noninteractive apt-get install -y -qq --no-install-recommends $missing >/dev/null
fi

if [ -z "${KORVSNMP_BUILD:-}" ]; then
    cmake -S . -B "$build" -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
    cmake --build "$build" -j "$(nproc 2>/dev/null || echo 2)" --target korvsnmp-stat korvsnmpcd \
        korvsnmp-agentx korvsnmp-snmpd >/dev/null
fi

dir=$(mktemp -d /tmp/korvsnmp-snmp.XXXXXX)
pids=
names=
# What stops the processes in $pids and removes $dir, once they have ended
# (snmpd writes its state as it ends).
stop_command() {
    echo "kill$pids; for p in$pids; do while kill -0 \$p 2>/dev/null; do sleep 0.1; done; done; rm -rf $dir"
}
# Stops what was started (children of this shell: wait reaps them), removes
# $dir and fails with $*.
give_up() {
    echo "run_snmp.sh: $*" >&2
    # shellcheck disable=SC2086
    [ -z "$pids" ] || kill $pids 2>/dev/null || true
    wait
    rm -rf "$dir"
    exit 1
}
# Whether process $1 runs (a child that ended stays a zombie until reaped).
running() {
    [ -r "/proc/$1/stat" ] && ! grep -q '^[0-9]* (.*) Z' "/proc/$1/stat" 2>/dev/null
}
# waitfor WHAT PID LOG COMMAND...: polls COMMAND for up to 20 s while process
# PID (which writes LOG) runs; gives up at once with LOG when it ends.
waitfor() {
    what=$1 pid=$2 log=$3
    shift 3
    tries=0
    until "$@" >/dev/null 2>&1; do
        running "$pid" || give_up "$what ended at once: $(cat "$log" 2>/dev/null)"
        tries=$((tries + 1))
        [ $tries -lt 200 ] || give_up "$what did not come up within 20 s: $(cat "$log" 2>/dev/null)"
        sleep 0.1
    done
}

stat=$build/tools/stat/korvsnmp-stat
# The collector's sample time (empty when none answers).
sample_time() {
    $stat --resource memory --compact 2>/dev/null | sed -n 's/.*"time":\([0-9]*\).*/\1/p'
}
# Whether the collector answers with a sample other than that of time $1.
answers_after() {
    now=$(sample_time)
    [ -n "$now" ] && [ "$now" != "$1" ]
}
if [ -z "$(sample_time)" ]; then
    echo "==> starting the reference collector korvsnmpcd"
    setsid "$build/tools/korvsnmpcd/korvsnmpcd" >"$dir/korvsnmpcd.log" 2>&1 &
    collector=$!
    pids="$pids $collector"
    names="korvsnmpcd, "
    waitfor korvsnmpcd $collector "$dir/korvsnmpcd.log" answers_after none
    # Its second sample, so that the first rates cover a whole interval.
    waitfor korvsnmpcd $collector "$dir/korvsnmpcd.log" answers_after "$(sample_time)"
fi

echo "==> starting snmpd on udp:127.0.0.1:$port (configuration in $dir)"
cat >"$dir/snmpd.conf" <<CONF
agentaddress udp:127.0.0.1:$port
view korvview included .1.3.6.1.3.7947
rocommunity public 127.0.0.1 -V korvview
CONF
if [ -n "$module" ]; then
    printf 'dlmod korvsnmp %s\nkorvsnmpStateDir %s\n' "$top/$build/tools/agentx/korvsnmp-snmpd.so" \
        "$dir/module-state" >>"$dir/snmpd.conf"
    subagent=
else
    printf 'master agentx\nagentXSocket %s\n' "$dir/agentx.sock" >>"$dir/snmpd.conf"
    subagent=", korvsnmp-agentx"
fi
SNMP_PERSISTENT_DIR="$dir/snmpd-state" setsid /usr/sbin/snmpd -f -C -c "$dir/snmpd.conf" -M '' -m '' \
    -Lf "$dir/snmpd.log" &
snmpd=$!
pids="$pids $snmpd"
# What answers korvsnmpMIB: snmpd itself with the module, else the subagent.
served="snmpd $snmpd $dir/snmpd.log"

if [ -z "$module" ]; then
    waitfor snmpd $snmpd "$dir/snmpd.log" test -S "$dir/agentx.sock"
    echo "==> starting korvsnmp-agentx"
    setsid "$build/tools/agentx/korvsnmp-agentx" --agentx-socket "$dir/agentx.sock" \
        --state-dir "$dir/agentx-state" >"$dir/korvsnmp-agentx.log" 2>&1 &
    agentx=$!
    pids="$pids $agentx"
    served="korvsnmp-agentx $agentx $dir/korvsnmp-agentx.log"
fi

mibs="/usr/share/snmp/mibs/ietf:/usr/share/mibs/ietf:$top/mibs/base:$top/mibs"
client="-v2c -c public -M $mibs -m KORVSNMP-MIB 127.0.0.1:$port"
# shellcheck disable=SC2086
waitfor $served sh -c "snmpget -Oqv $client korvSampleTime.0 | grep -q '^[0-9]'"

echo "==> snmpwalk $client korvsnmpMIB"
# shellcheck disable=SC2086
snmpwalk $client korvsnmpMIB
echo
echo "Walk again with:"
echo "  snmpwalk $client korvsnmpMIB"
echo "Stop what this script started (${names}snmpd$subagent) with:"
echo "  $(stop_command)"
