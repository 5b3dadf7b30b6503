// A snapshot laid out once for answering: every object's name in net-snmp's
// sub-identifiers, side by side in one array, its ASN type decided and its
// number clamped, its text in one arena. A lookup is a binary search over
// that layout: it neither copies nor allocates.
#ifndef KORVAGENTX_ENCODED_SNAPSHOT_H
#define KORVAGENTX_ENCODED_SNAPSHOT_H

#include <net-snmp/net-snmp-config.h>
#include <net-snmp/types.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "snapshot.h"

namespace korvagentx {

struct EncodedObject {
    uint32_t nameAt = 0;  // first sub-identifier in the name array
    uint32_t nameLength = 0;
    uint32_t textAt = 0;  // first byte in the text arena (ASN_OCTET_STR)
    uint32_t textLength = 0;
    uint64_t number = 0;  // the value of the numeric types
    u_char type = 0;      // ASN_GAUGE, ASN_COUNTER, ASN_UNSIGNED, ASN_COUNTER64, ASN_TIMETICKS,
                          // ASN_INTEGER or ASN_OCTET_STR
    ValueType kind = ValueType::Gauge32;  // SnapshotAge and FailedSamples are answered when asked
};

class EncodedSnapshot {
public:
    // Lays out `snapshot`'s entries (ascending and unique, as BuildSnapshot
    // gives them); the snapshot is not kept.
    explicit EncodedSnapshot(const Snapshot &snapshot);

    // The object named `name` (`length` sub-identifiers), or nullptr.
    const EncodedObject *Find(const oid *name, size_t length) const;
    // The first object after `name` in OID order, or nullptr past the last.
    const EncodedObject *FindNext(const oid *name, size_t length) const;

    const oid *Name(const EncodedObject &object) const { return names_.data() + object.nameAt; }
    const char *Text(const EncodedObject &object) const { return texts_.data() + object.textAt; }
    const std::vector<EncodedObject> &Objects() const { return objects_; }
    std::chrono::steady_clock::time_point Taken() const { return taken_; }

private:
    // Negative, zero or positive as `object`'s name sorts before, equal to
    // or after `name`, both known to begin with the common prefix.
    int Compare(const EncodedObject &object, const oid *name, size_t length) const;
    // Where `name` falls against the prefix that every name shares:
    // negative before all names, positive after all, zero when it begins
    // with the prefix.
    int AgainstPrefix(const oid *name, size_t length) const;

    std::vector<oid> names_;
    size_t prefixLength_ = 0;  // sub-identifiers that every name begins with
    std::string texts_;
    std::vector<EncodedObject> objects_;
    std::chrono::steady_clock::time_point taken_;
};

}  // namespace korvagentx

#endif
