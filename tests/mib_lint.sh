#!/bin/sh
# KORVSNMP-MIB passes smilint at level 3 without an error or a warning. The
# SMI's own modules come from the host's IETF MIBs where it has them, else
# from mibs/base.
set -eu
mibs=$1
SMIPATH=/usr/share/snmp/mibs/ietf:/usr/share/mibs/ietf:$mibs/base
export SMIPATH
report=$(smilint -l 3 "$mibs/KORVSNMP-MIB.txt" 2>&1) || { echo "$report"; exit 1; }
if [ -n "$report" ]; then
    echo "$report"
    exit 1
fi
# The check itself works: a module with a fault is reported.
faulty=$(mktemp /tmp/korvsnmp-mib-lint.XXXXXX)
trap 'rm -f "$faulty"' EXIT
sed 's/UNITS       "percent"/UNITS       percent/' "$mibs/KORVSNMP-MIB.txt" >"$faulty"
if [ -z "$(smilint -l 3 "$faulty" 2>&1)" ]; then
    echo "smilint found nothing wrong in a broken module"
    exit 1
fi
echo "KORVSNMP-MIB: smilint -l 3 clean"
