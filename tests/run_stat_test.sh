#!/bin/sh
# What a newcomer meets with run_stat.sh, in a private mount namespace whose
# /tmp is a fresh tmpfs, so that a collector already on /tmp/korvsnmpcd.sock
# is neither seen nor disturbed:
#  - --simulate shows the large appliance's 64 volumes by name;
#  - two of its samples differ in their rates, and its interfaces differ
#    from each other;
#  - run_stat.sh --format json pipes clean JSON (its own lines on stderr);
#  - nothing is left behind: no process, no file in /tmp.
#   run_stat_test.sh SOURCE-DIRECTORY BUILD-DIRECTORY
# Exit 77 (skipped) without root or unshare, or with either directory in /tmp.
set -eu
top=$1 build=$2
if [ "${3:-}" != --inside ]; then
    [ "$(id -u)" -eq 0 ] || { echo "skipped: needs root"; exit 77; }
    command -v unshare >/dev/null || { echo "skipped: needs unshare"; exit 77; }
    case "$top/ $build/" in
    /tmp/* | */\ /tmp/*) echo "skipped: the tree is in /tmp, which the test replaces"; exit 77 ;;
    esac
    exec unshare -m sh -c 'mount -t tmpfs korvsnmp-test /tmp && exec "$@"' sh "$0" "$top" "$build" --inside
fi

fail() {
    echo "FAIL: $*"
    exit 1
}
export KORVSNMP_BUILD="$build" KORVSNMPCD_INTERVAL=0.1 KORVSNMPCD_PIDFILE=/tmp/run_stat_test.pid
out=$(mktemp -d /tmp/run_stat_test.XXXXXX)

"$top/run_stat.sh" --simulate --format table >"$out/table" 2>"$out/table.err" ||
    fail "run_stat.sh --simulate: $(cat "$out/table.err")"
volumes=$(sed -n '/^Volume$/,/^$/p' "$out/table" | awk 'NR > 2 && $2 ~ /^volume[0-9]+$/ { print $2 }' | sort -u | wc -l)
[ "$volumes" -eq 64 ] || fail "$volumes volumes named, not 64: $(cat "$out/table" "$out/table.err")"
grep -q '^==> simulated appliance' "$out/table.err" || fail "no ==> line on stderr: $(cat "$out/table.err")"
! grep -q '^==>' "$out/table" || fail "==> lines on stdout"

# Two samples half a second apart, at 0.1 s a sample.
"$top/run_stat.sh" --simulate --compact --watch 0.5 --watch-count 2 >"$out/two" 2>"$out/two.err" ||
    fail "run_stat.sh --simulate --watch: $(cat "$out/two.err")"
python3 - "$out/two" <<'PY' || fail "the samples do not move"
import json, sys
first, second = [json.loads(line) for line in open(sys.argv[1])]
rx = lambda sample: {record["device"]: record["rx"] for record in sample["network"]}
assert rx(first) != rx(second), "the same rates in both samples"
interfaces = {rate for device, rate in rx(second).items() if device.startswith("eth")}
assert len(interfaces) > 20, "interfaces share their rates: %s" % sorted(interfaces)
PY

# The machine's own statistics, through a collector that run_stat.sh starts.
"$top/run_stat.sh" --format json 2>"$out/json.err" | python3 -m json.tool >"$out/json" ||
    fail "run_stat.sh --format json is no JSON: $(cat "$out/json.err")"
pid=$(cat "$KORVSNMPCD_PIDFILE")
kill "$pid"
while kill -0 "$pid" 2>/dev/null; do sleep 0.05; done  # our own collector, ending
rm -rf "$out"
left=$(ls -A /tmp)
[ -z "$left" ] || fail "left in /tmp: $left"
echo "run_stat.sh: 64 volumes, moving rates, clean JSON"
