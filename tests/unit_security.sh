#!/bin/sh
# The installed systemd units rate at most MAX on systemd-analyze's exposure
# scale (0 safest, 10 most exposed), judged offline on the unit files.
#   unit_security.sh BUILD_DIR MAX
# Installs the build's tools into a temporary prefix and judges every unit
# installed there. Exit 77 (skipped) where systemd-analyze is missing.
set -eu
build=$1 max=$2
command -v systemd-analyze >/dev/null || { echo "skipped: no systemd-analyze"; exit 77; }
prefix=$(mktemp -d /tmp/korvsnmp-units-XXXXXX)
trap 'rm -rf "$prefix"' EXIT
cmake --install "$build" --component tools --prefix "$prefix" >/dev/null
units=$(find "$prefix" -name '*.service' | sort)
[ -n "$units" ] || { echo "FAIL: no unit installed"; exit 1; }
# --threshold counts tenths.
tenths=$(awk -v max="$max" 'BEGIN { printf "%d", max * 10 + 0.5 }')
status=0
for unit in $units; do
    # Its last line: "→ Overall exposure level for NAME: 2.3 OK ...".
    out=$(systemd-analyze security --offline=true --threshold="$tenths" "$unit" 2>&1) || status=1
    echo "$out" | tail -n 1
done
[ "$status" -eq 0 ] || echo "FAIL: a unit rates above $max (see the lines above)"
exit "$status"
