// One sample of the library's result, as the OID -> value list that the
// AgentX side answers from.
//
// BuildSnapshot turns a result of SNMPParseReplyData (of any shape) into the
// objects of KORVSNMP-MIB, sorted by OID. A section that is missing or of the
// wrong shape gives no objects (an empty table); a member that is missing or
// not a non-negative number (counters) or not a string (names) gives no
// object for that cell. Rates wider than 32 bits are clamped to 4294967295;
// texts are cut to a DisplayString's 255 bytes.
#ifndef KORVAGENTX_SNAPSHOT_H
#define KORVAGENTX_SNAPSHOT_H

#include <chrono>
#include <cstdint>
#include <map>
#include <set>
#include <string>
#include <vector>

#include <json/value.h>

#include "exposition/network_kinds.h"

namespace korvagentx {

using Oid = std::vector<uint32_t>;

enum class ValueType {
    Gauge32,
    Counter32,
    Unsigned32,
    Counter64,
    Integer,
    Text,
    SnapshotAge,    // answered from the clock: seconds since `Snapshot::taken`
    FailedSamples,  // answered from the sampler's count of failed samples
};

struct Value {
    ValueType type = ValueType::Gauge32;
    uint64_t number = 0;
    std::string text{};
};

struct Entry {
    Oid oid;
    Value value;
};

struct Snapshot {
    std::vector<Entry> entries;  // ascending OID order, no duplicates
    std::chrono::steady_clock::time_point taken{};

    // The entry at `oid`, or nullptr.
    const Entry *Find(const Oid &oid) const;
    // The first entry after `oid` in OID order, or nullptr past the end.
    const Entry *FindNext(const Oid &oid) const;
};

// Whether `oid` names an instance of an object that KORVSNMP-MIB defines
// (a scalar's .0, or a column of a table with any index), whatever a
// snapshot holds: a get of it that finds nothing is noSuchInstance rather
// than noSuchObject.
bool IsInstanceOfKnownObject(const Oid &oid);

// What the result cannot tell of the "network" rows, as the exporter learns it too.
using korvexposition::NetworkKinds;

// One table's row indexes. A key present in the previous Assign keeps its
// index; a new key gets the next unused one (from 1 up, never reused); keys
// missing from this Assign are forgotten.
class RowIndexes {
public:
    std::vector<uint32_t> Assign(const std::vector<std::string> &keys);

private:
    std::map<std::string, uint32_t> indexes_;
    uint32_t next_ = 1;
};

struct TableIndexes {
    RowIndexes disk, interface, volume, lun;
};

// The snapshot of `result`, taken at `taken`, with the sampling interval in
// seconds. `indexes` carries the row indexes from one sample to the next.
Snapshot BuildSnapshot(const Json::Value &result, const NetworkKinds &kinds,
                       TableIndexes &indexes, uint32_t intervalSeconds,
                       std::chrono::steady_clock::time_point taken);

}  // namespace korvagentx

#endif
