#!/bin/sh
# Shows this machine's statistics as SNMP objects: installs net-snmp and the
# build tools where missing, builds, starts the reference collector korvsnmpcd
# (unless a collector already answers on /tmp/korvsnmpcd.sock), starts Debian's
# snmpd on udp:127.0.0.1:1161 with a private configuration, starts the AgentX
# subagent korvsnmp-agentx under it, and walks KORVSNMP-MIB with names.
# Everything is left running; the last lines say how to stop it by process id.
set -eu
cd "$(dirname "$0")"
top=$(pwd)
port=1161

packages="ca-certificates cmake make g++ pkg-config libjsoncpp-dev libgtest-dev libgmock-dev
          libbenchmark-dev snmpd snmp smitools libsmi2-common libsnmp-dev libncurses-dev"
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

cmake -S . -B build -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
cmake --build build -j "$(nproc 2>/dev/null || echo 2)" --target korvsnmp-stat korvsnmpcd korvsnmp-agentx >/dev/null

dir=$(mktemp -d /tmp/korvsnmp-snmp.XXXXXX)
pids=
names=
waitfor() {  # waitfor WHAT COMMAND...: polls COMMAND for up to 20 s
    what=$1
    shift
    tries=0
    until "$@" >/dev/null 2>&1; do
        tries=$((tries + 1))
        if [ $tries -ge 200 ]; then
            echo "run_snmp.sh: $what did not come up; see $dir" >&2
            [ -z "$pids" ] || echo "stop what was started with: kill$pids; rm -rf $dir" >&2
            exit 1
        fi
        sleep 0.1
    done
}

stat=build/tools/stat/korvsnmp-stat
if ! $stat --resource memory --compact >/dev/null 2>&1; then
    echo "==> starting the reference collector korvsnmpcd"
    setsid build/tools/korvsnmpcd/korvsnmpcd >"$dir/korvsnmpcd.log" 2>&1 &
    pids="$pids $!"
    names="korvsnmpcd, "
    waitfor korvsnmpcd $stat --resource memory --compact
    sleep 2.2  # two samples, so that the first rates cover a whole interval
fi

echo "==> starting snmpd on udp:127.0.0.1:$port (configuration in $dir)"
cat >"$dir/snmpd.conf" <<CONF
agentaddress udp:127.0.0.1:$port
master agentx
agentXSocket $dir/agentx.sock
view korvview included .1.3.6.1.3.7947
rocommunity public 127.0.0.1 -V korvview
CONF
SNMP_PERSISTENT_DIR="$dir/snmpd-state" setsid /usr/sbin/snmpd -f -C -c "$dir/snmpd.conf" -M '' -m '' \
    -Lf "$dir/snmpd.log" &
pids="$pids $!"
waitfor snmpd test -S "$dir/agentx.sock"

echo "==> starting korvsnmp-agentx"
setsid build/tools/agentx/korvsnmp-agentx --agentx-socket "$dir/agentx.sock" \
    --persistent-dir "$dir/agentx-state" >"$dir/korvsnmp-agentx.log" 2>&1 &
pids="$pids $!"

mibs="/usr/share/snmp/mibs/ietf:/usr/share/mibs/ietf:$top/mibs/base:$top/mibs"
client="-v2c -c public -M $mibs -m KORVSNMP-MIB 127.0.0.1:$port"
# shellcheck disable=SC2086
waitfor korvsnmp-agentx sh -c "snmpget -Oqv $client korvSampleTime.0 | grep -q '^[0-9]'"

echo "==> snmpwalk $client korvsnmpMIB"
# shellcheck disable=SC2086
snmpwalk $client korvsnmpMIB
echo
echo "Walk again with:"
echo "  snmpwalk $client korvsnmpMIB"
echo "Stop what this script started (${names}snmpd, korvsnmp-agentx) with:"
echo "  kill$pids; rm -rf $dir"
