#!/bin/sh
# Checks the shared object's identity and exports: its SONAME, that it needs
# the platform library, that it exports the client API, and that it defines
# no platform operation.
# Usage: library_exports.sh <libkorvsnmp.so> <platform header directory>
set -eu
library=$1
platform=$2
status=0
fail() { echo "FAIL: $*"; status=1; }

dynamic=$(readelf -d "$library")
echo "$dynamic" | grep -q 'Library soname: \[libkorvsnmp\.so\.1\]' || fail "SONAME is not libkorvsnmp.so.1"
echo "$dynamic" | grep -q 'Shared library: \[libkorvplatform\.so\.1\]' || fail "NEEDED lacks libkorvplatform.so.1"

exported=$(nm -D --defined-only --demangle "$library")
for symbol in 'SocketInit()' \
    'Transmitor::Transmitor(' 'Transmitor::~Transmitor()' 'Transmitor::SetHostName(' \
    'Transmitor::Transmit(' 'Transmitor::GetDataStr(' 'Transmitor::GetDataJson(' \
    'Transmitor::TransmitData(' 'Transmitor::ReceiveData()' \
    'Transmitor::EnterHistoryMode(' 'Transmitor::Reload()' \
    'KORVSNMP::FillInCurrentMemory(' 'KORVSNMP::FillInCurrentLunIO(' \
    'KORVSNMP::FillInCurrentSpaceIO(' 'KORVSNMP::FillInCurrentDiskIO(' \
    'KORVSNMP::FillInCurrentNetwork(' 'SNMPParseReplyData(Json::Value const&, Json::Value const&' \
    'SNMPParseReplyData(Json::Value const&, Json::Value&&'; do
    echo "$exported" | grep -qF " $symbol" || fail "does not export $symbol"
done

# Every operation that the platform headers declare must come from elsewhere.
operations=$(grep -ohE '\b(KLIB[A-Za-z]+|KORV[A-Z][A-Za-z]+|DiskInfoEnum(Free)?|SupportEBox)\(' \
    "$platform"/korv_*.h | tr -d '(' | sort -u)
for operation in $operations APIRunner::Exec WebAPIUtil::JsonArrayHasString; do
    echo "$exported" | grep -qE "[ :]$operation(\(|$)" && fail "defines platform operation $operation"
done

# Nothing but the library's own API: the units' helpers stay hidden.
unexpected=$(echo "$exported" | awk '{ $1 = ""; $2 = ""; print }' | sed 's/^ *//' |
    grep -vE '^(SocketInit|Transmitor::|SNMPParseReplyData|KORVSNMP::|_init$|_fini$)' || true)
[ -z "$unexpected" ] || fail "exports more than its API: $unexpected"

[ $status -eq 0 ] && echo "libkorvsnmp exports its API and no platform operation"
exit $status
