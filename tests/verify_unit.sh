#!/bin/sh
# systemd-analyze verify on a unit file, with its installed program path
# pointed at the built program (verify wants the program to exist).
#   verify_unit.sh UNIT INSTALLED_PROGRAM BUILT_PROGRAM [UNIT...]
# The further units (a timer of UNIT) are verified beside it, as they are.
# Exit 77 (skipped) where systemd-analyze cannot run here.
set -eu
unit=$1 installed=$2 built=$3
shift 3
command -v systemd-analyze >/dev/null || { echo "skipped: no systemd-analyze"; exit 77; }
dir=$(mktemp -d)
trap 'rm -rf "$dir"' EXIT
sed "s|$installed|$built|g" "$unit" >"$dir/$(basename "$unit")"
# A trivial unit tells whether verify works in this environment at all.
printf '[Service]\nType=oneshot\nExecStart=/bin/true\n' >"$dir/probe-korvsnmp.service"
if ! systemd-analyze verify "$dir/probe-korvsnmp.service" >/dev/null 2>&1; then
    echo "skipped: systemd-analyze verify does not run in this environment"
    exit 77
fi
# The man page is checked by its own test; it is not installed here.
others=
for other in "$@"; do
    cp "$other" "$dir/"
    others="$others $dir/$(basename "$other")"
done
# shellcheck disable=SC2086
out=$(systemd-analyze verify --man=no "$dir/$(basename "$unit")" $others 2>&1) || { echo "$out"; exit 1; }
# verify reports some problems only as messages.
if [ -n "$out" ]; then
    echo "$out"
    exit 1
fi
echo "verified $(basename "$unit")"
