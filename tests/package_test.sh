#!/bin/sh
# Builds the Debian packages of a build tree with CPack, checks their
# contents, dependencies and lintian, unpacks them into a throwaway root and
# runs the unpacked korvsnmp-stat.
# Usage: package_test.sh <build dir>
set -eu
build=$(cd "$1" && pwd)
work=$(mktemp -d /tmp/korvsnmp-packages-XXXXXX)
trap 'rm -rf "$work"' EXIT
fail() { echo "FAIL: $*"; exit 1; }

(cd "$build" && cpack -G DEB -B "$work/out" >"$work/cpack.log" 2>&1) ||
    { cat "$work/cpack.log"; fail "cpack -G DEB"; }
version=$(dpkg-deb -f "$work"/out/libkorvsnmp1_*.deb Version)
deb() { echo "$work"/out/"$1"_"$version"_*.deb; }

# Every install rule belongs to a package.
cmake --install "$build" --component Unspecified --prefix "$work/unspecified" >/dev/null
[ -z "$(find "$work/unspecified" -type f 2>/dev/null)" ] ||
    fail "install rules without a COMPONENT: $(find "$work/unspecified" -type f)"

# contents: <package> <path> present (+) or absent (-)
while read -r package sign path; do
    dpkg-deb -c "$(deb "$package")" | awk '{print $6}' | grep -qxF ".$path" && found=+ || found=-
    [ "$found" = "$sign" ] || fail "$package $([ "$sign" = + ] && echo lacks || echo holds) $path"
done <<'LIST'
libkorvsnmp1 + /usr/lib/libkorvsnmp.so.1
libkorvsnmp1 + /usr/lib/libkorvplatform.so.1
libkorvsnmp1 - /usr/lib/libkorvsnmp.so
libkorvsnmp1 + /usr/share/doc/libkorvsnmp1/copyright
libkorvsnmp-dev + /usr/lib/libkorvsnmp.so
libkorvsnmp-dev + /usr/include/korvsnmp/korvsnmp.h
libkorvsnmp-dev + /usr/include/korvplatform/korv_platform.h
libkorvsnmp-dev - /usr/include/korvplatform/standin/korv_standin.h
libkorvsnmp-dev + /usr/lib/pkgconfig/korvsnmp.pc
libkorvsnmp-dev + /usr/lib/cmake/korvsnmp/korvsnmpConfig.cmake
libkorvsnmp-dev - /usr/lib/libkorvsnmp.so.1
korvsnmp-tools + /usr/bin/korvsnmp-stat
korvsnmp-tools + /usr/sbin/korvsnmpcd
korvsnmp-tools + /usr/share/man/man8/korvsnmpcd.8.gz
korvsnmp-tools + /usr/lib/systemd/system/korvsnmpcd.service
korvsnmp-tools + /usr/lib/systemd/system/korvsnmp-textfile.service
korvsnmp-tools + /usr/lib/systemd/system/korvsnmp-textfile.timer
korvsnmp-tools + /usr/share/man/man1/korvsnmp-stat.1.gz
korvsnmp-tools + /usr/lib/korvsnmp/korvsnmp-snmpd.so
korvsnmp-tools + /usr/sbin/korvsnmp-exporter
korvsnmp-tools + /usr/share/man/man8/korvsnmp-exporter.8.gz
korvsnmp-tools + /usr/lib/systemd/system/korvsnmp-exporter.service
korvsnmp-tools + /usr/share/korvsnmp/prometheus/korvsnmp.rules.yml
korvsnmp-tools + /usr/share/korvsnmp/snmp_exporter/snmp.yml
korvsnmp-tools + /usr/share/korvsnmp/snmp_exporter/generator.yml
korvsnmp-tools - /usr/lib/libkorvsnmp.so.1
LIST

# dependencies: on each other at the exact version, on jsoncpp from dpkg-shlibdeps
needs() { deps=$(dpkg-deb -f "$(deb "$1")" Depends); echo "$deps" | grep -q "$2" || fail "$1: $deps"; }
needs libkorvsnmp-dev "libkorvsnmp1 (= $version)"
needs korvsnmp-tools "libkorvsnmp1 (= $version)"
needs libkorvsnmp1 libjsoncpp25
needs korvsnmp-tools libjsoncpp25
needs korvsnmp-tools libprometheus-cpp-pull
needs libkorvsnmp-dev libjsoncpp-dev

# lintian: no error and no warning, but for these, with their reasons:
#   initial-upload-closes-no-bugs: the packages go to no Debian archive.
# lintian leaves its mldbm-elf-* databases in TMPDIR: keep them in $work.
mkdir -p "$work/tmp"
TMPDIR="$work/tmp" lintian --fail-on error,warning --suppress-tags initial-upload-closes-no-bugs \
    "$work"/out/*.deb >"$work/lintian.log" 2>&1 || { cat "$work/lintian.log"; fail "lintian"; }

# The unpacked programs run from the throwaway root, with its libraries.
for package in libkorvsnmp1 korvsnmp-tools; do dpkg -x "$(deb $package)" "$work/root"; done
stat="$work/root/usr/bin/korvsnmp-stat"
readelf -d "$stat" | grep -q 'R.*PATH' && fail "the packaged korvsnmp-stat has an RPATH"
module="$work/root/usr/lib/korvsnmp/korvsnmp-snmpd.so"
readelf -d "$module" | grep -q 'R.*PATH' && fail "the packaged snmpd module has an RPATH"
nm -D --defined-only "$module" | awk '$2 == "T" {print $3}' | sort | tr '\n' ' ' |
    grep -qx 'deinit_korvsnmp init_korvsnmp ' || fail "the snmpd module exports more than its entry points"
out=$(LD_LIBRARY_PATH="$work/root/usr/lib" "$stat" --version)
[ "$out" = "korvsnmp-stat ${version%-*}" ] || fail "--version said: $out"
LD_LIBRARY_PATH="$work/root/usr/lib" "$stat" --help | head -1 | grep -q '^Usage: korvsnmp-stat' ||
    fail "--help"
LD_LIBRARY_PATH="$work/root/usr/lib" ldd "$stat" | grep libkorvsnmp.so.1 | grep -q "$work/root" ||
    fail "korvsnmp-stat does not use the unpacked library"
zcat "$work/root/usr/share/man/man1/korvsnmp-stat.1.gz" | mandoc -T lint -W warning ||
    fail "the packaged man page"
echo "packages: $(cd "$work/out" && ls ./*.deb | tr '\n' ' ')"
