// One sample of the library's result, as the OID -> value list that the
// AgentX side answers from.
//
// BuildSnapshot turns a result of SNMPParseReplyData (of any shape) into the
// objects of KORVSNMP-MIB, as the statistics catalogue describes them,
// sorted by OID.
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
#include "row_indexes.h"

namespace korvagentx {

using Oid = std::vector<uint32_t>;

enum class ValueType {
    Gauge32,
    Counter32,
    Unsigned32,
    Counter64,
    Integer,
    Text,
    TimeStamp,      // TimeTicks on the wire: a sysUpTime, in hundredths of a second
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

// Answered through its layout for answering (encoded_snapshot.h).
struct Snapshot {
    std::vector<Entry> entries;  // ascending OID order, no duplicates
    std::chrono::steady_clock::time_point taken{};
};

// Whether `oid` names an instance of an object that KORVSNMP-MIB defines
// (a scalar's .0, or a column of a table with any index), whatever a
// snapshot holds: a get of it that finds nothing is noSuchInstance rather
// than noSuchObject.
bool IsInstanceOfKnownObject(const Oid &oid);

// What the result cannot tell of the "network" rows, as the exporter learns it too.
using korvexposition::NetworkKinds;

// What one sample leaves to the next: the tables' row indexes (which the
// caller may keep in an IndexFile), and for each row and each group of
// scalars that has counters, the counters last seen and the discontinuity
// time.
struct SampleMemory {
    struct Counters {
        std::map<uint32_t, uint64_t> last;  // by column (or scalar) number
        uint32_t discontinuity = 0;
    };
    TableIndexes indexes;
    std::map<std::pair<uint32_t, uint32_t>, Counters> rows;  // (group, row index; 0 for a group)
    size_t badCounters = 0;                                  // in the last sample, to log a change once
};

// The snapshot of `result`, taken at `taken` when the master agent's
// sysUpTime was `upTime`, with the sampling interval in seconds.
//
// A section that is missing or of the wrong shape gives no objects (an empty
// table). A cell whose member is missing or of the wrong type gives no
// object: a name must be a string (made valid UTF-8 of at most 255 bytes,
// every invalid byte a U+FFFD); a rate, share or size a number from 0 to
// 2^64 - 1, clamped to 4294967295 in a 32-bit object; a counter an integer
// from 0 to 2^64 - 1 as JSON writes it (a negative, fractional, textual or
// wider value is logged, one line for a sample whose count of such values
// differs from the previous sample's).
//
// Derived counters: the total groups' counters are the sums of their
// table's rows, and the interface total row's the sums of the rows of kind
// interface, each present when every such row has that counter, all modulo
// 2^64 as Counter64 wraps; aggregation rows have no counters. A row's (or a
// group's) discontinuity time is `upTime` of the sample in which it first
// had counters or in which one of them was lower than the last value seen;
// a row missing from a sample starts anew. It is served with the counters.
Snapshot BuildSnapshot(const Json::Value &result, const NetworkKinds &kinds, SampleMemory &memory,
                       uint32_t intervalSeconds, uint32_t upTime,
                       std::chrono::steady_clock::time_point taken);

}  // namespace korvagentx

#endif
