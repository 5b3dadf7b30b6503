#!/bin/sh
# run_snmp.sh as the README has it, in a private mount namespace whose /tmp
# is a fresh tmpfs (a collector already on /tmp/korvsnmpcd.sock is neither
# seen nor disturbed), on a port of its own:
#  - it walks KORVSNMP-MIB;
#  - a second run beside it fails with snmpd's own reason and leaves nothing;
#  - the stop line that it prints, run as printed, leaves no process and no file.
#   run_snmp_test.sh SOURCE-DIRECTORY BUILD-DIRECTORY PORT
# Exit 77 (skipped) without root, unshare or snmpd, or with either directory in /tmp.
set -eu
top=$1 build=$2 port=$3
if [ "${4:-}" != --inside ]; then
    [ "$(id -u)" -eq 0 ] || { echo "skipped: needs root"; exit 77; }
    command -v unshare >/dev/null || { echo "skipped: needs unshare"; exit 77; }
    [ -x /usr/sbin/snmpd ] && command -v snmpwalk >/dev/null || { echo "skipped: needs snmpd and snmp"; exit 77; }
    case "$top/ $build/" in
    /tmp/* | */\ /tmp/*) echo "skipped: the tree is in /tmp, which the test replaces"; exit 77 ;;
    esac
    exec unshare -m sh -c 'mount -t tmpfs korvsnmp-test /tmp && exec "$@"' sh "$0" "$top" "$build" "$port" --inside
fi

fail() {
    echo "FAIL: $*"
    exit 1
}
export KORVSNMP_BUILD="$build" KORVSNMP_SNMP_PORT="$port"
out=$(mktemp -d /tmp/run_snmp_test.XXXXXX)

"$top/run_snmp.sh" >"$out/first" 2>&1 || fail "run_snmp.sh: $(cat "$out/first")"
grep -q '^KORVSNMP-MIB::korvSampleTime.0 = ' "$out/first" || fail "no walk: $(cat "$out/first")"
stop=$(tail -1 "$out/first")
pids=$(echo "$stop" | sed -n 's/^ *kill\([0-9 ]*\);.*/\1/p')
[ -n "$pids" ] || fail "no stop line: $stop"

# The port is taken: snmpd says so, and the second run stops what it started.
if timeout 60 "$top/run_snmp.sh" >"$out/second" 2>&1; then
    fail "a second run_snmp.sh on a busy port succeeded"
fi
grep -q "^run_snmp.sh: snmpd ended at once: " "$out/second" || fail "not reported: $(cat "$out/second")"
grep -q "Error opening specified endpoint \"udp:127.0.0.1:$port\"" "$out/second" ||
    fail "not snmpd's reason: $(cat "$out/second")"
second=$(sed -n 's/^==> starting snmpd .*configuration in \(.*\))$/\1/p' "$out/second")
[ -n "$second" ] && [ ! -e "$second" ] || fail "the second run left [$second]"

sh -c "$stop"
for pid in $pids; do
    [ ! -d "/proc/$pid" ] || fail "process $pid still runs after: $stop"
done
rm -rf "$out"
left=$(ls -A /tmp)
[ -z "$left" ] || fail "left in /tmp after the stop line: $left"
echo "run_snmp.sh: walked, refused beside itself with snmpd's reason, stopped without a trace"
