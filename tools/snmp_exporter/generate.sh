#!/bin/sh
# generator.yml from the statistics catalogue, and snmp.yml from it and
# KORVSNMP-MIB with Debian's prometheus-snmp-generator.
#
#   generate.sh WRITER MIBS DIR           writes both into DIR
#   generate.sh --check WRITER MIBS DIR   fails when those in DIR are not current
#
# WRITER is the built write_generator_config, MIBS the project's mibs/.
set -eu
check=
if [ "$1" = --check ]; then
    check=1
    shift
fi
writer=$1 mibs=$2 dir=$3
generator=/usr/bin/prometheus-snmp-generator
if [ ! -x "$generator" ]; then
    echo "prometheus-snmp-generator is not installed (Debian: prometheus-snmp-exporter)"
    exit 77
fi
work=$(mktemp -d /tmp/korvsnmp-snmp-exporter.XXXXXX)
trap 'rm -rf "$work"' EXIT

"$writer" >"$work/generator.yml"
# The generator reads generator.yml in its working directory; net-snmp finds
# the MIBs in MIBDIRS: KORVSNMP-MIB, then the SMI's own modules.
(cd "$work" && MIBDIRS="$mibs:$mibs/base:/usr/share/snmp/mibs/ietf:/usr/share/mibs/ietf" \
    "$generator" --fail-on-parse-errors generate --output-path=snmp.yml >generate.log 2>&1) ||
    { cat "$work/generate.log"; exit 1; }

if [ -z "$check" ]; then
    cp "$work/generator.yml" "$work/snmp.yml" "$dir/"
    exit 0
fi
stale=
for file in generator.yml snmp.yml; do
    if ! cmp -s "$work/$file" "$dir/$file"; then
        diff -u "$dir/$file" "$work/$file" | head -40
        stale="$stale $file"
    fi
done
if [ -n "$stale" ]; then
    echo "FAIL: the shipped$stale in $dir are not what the catalogue and KORVSNMP-MIB give now;"
    echo "regenerate them with: cmake --build build --target snmp_exporter_config"
    exit 1
fi
echo "generator.yml and snmp.yml are current"
