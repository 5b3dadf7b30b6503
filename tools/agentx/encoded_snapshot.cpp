// A snapshot laid out once for answering.
#include "encoded_snapshot.h"

#include <net-snmp/library/asn1.h>

#include <algorithm>

namespace korvagentx {

namespace {

u_char AsnType(ValueType type)
{
    switch (type) {
    case ValueType::Gauge32:
        return ASN_GAUGE;
    case ValueType::Counter32:
    case ValueType::FailedSamples:
        return ASN_COUNTER;
    case ValueType::Unsigned32:
    case ValueType::SnapshotAge:
        return ASN_UNSIGNED;
    case ValueType::Counter64:
        return ASN_COUNTER64;
    case ValueType::TimeStamp:
        return ASN_TIMETICKS;
    case ValueType::Integer:
        return ASN_INTEGER;
    case ValueType::Text:
        return ASN_OCTET_STR;
    }
    return ASN_NULL;
}

}  // namespace

EncodedSnapshot::EncodedSnapshot(const Snapshot &snapshot) : taken_(snapshot.taken)
{
    size_t nameSize = 0;
    size_t textSize = 0;
    for (const Entry &entry : snapshot.entries) {
        nameSize += entry.oid.size();
        textSize += entry.value.text.size();
    }
    names_.reserve(nameSize);
    texts_.reserve(textSize);
    objects_.reserve(snapshot.entries.size());
    for (const Entry &entry : snapshot.entries) {
        EncodedObject object;
        object.nameAt = static_cast<uint32_t>(names_.size());
        object.nameLength = static_cast<uint32_t>(entry.oid.size());
        names_.insert(names_.end(), entry.oid.begin(), entry.oid.end());
        object.textAt = static_cast<uint32_t>(texts_.size());
        object.textLength = static_cast<uint32_t>(entry.value.text.size());
        texts_ += entry.value.text;
        object.number = entry.value.number;
        object.type = AsnType(entry.value.type);
        object.kind = entry.value.type;
        objects_.push_back(object);
    }
    if (!objects_.empty()) {
        prefixLength_ = objects_.front().nameLength;
        for (const EncodedObject &object : objects_) {
            const oid *name = Name(object);
            const oid *first = Name(objects_.front());
            size_t same = 0;
            while (same < std::min<size_t>(prefixLength_, object.nameLength) && name[same] == first[same])
                ++same;
            prefixLength_ = same;
        }
    }
}

int EncodedSnapshot::AgainstPrefix(const oid *name, size_t length) const
{
    const oid *prefix = names_.data();
    for (size_t i = 0; i < prefixLength_; ++i) {
        if (i == length)
            return -1;
        if (name[i] != prefix[i])
            return name[i] < prefix[i] ? -1 : 1;
    }
    return 0;
}

int EncodedSnapshot::Compare(const EncodedObject &object, const oid *name, size_t length) const
{
    const oid *own = Name(object);
    const size_t common = std::min<size_t>(object.nameLength, length);
    for (size_t i = prefixLength_; i < common; ++i)
        if (own[i] != name[i])
            return own[i] < name[i] ? -1 : 1;
    return object.nameLength < length ? -1 : object.nameLength > length ? 1 : 0;
}

const EncodedObject *EncodedSnapshot::Find(const oid *name, size_t length) const
{
    if (objects_.empty() || AgainstPrefix(name, length) != 0)
        return nullptr;
    auto found = std::lower_bound(objects_.begin(), objects_.end(), 0,
                                  [&](const EncodedObject &object, int) {
                                      return Compare(object, name, length) < 0;
                                  });
    return found != objects_.end() && Compare(*found, name, length) == 0 ? &*found : nullptr;
}

const EncodedObject *EncodedSnapshot::FindNext(const oid *name, size_t length) const
{
    if (objects_.empty())
        return nullptr;
    if (const int side = AgainstPrefix(name, length); side != 0)
        return side < 0 ? &objects_.front() : nullptr;
    auto found = std::upper_bound(objects_.begin(), objects_.end(), 0,
                                  [&](int, const EncodedObject &object) {
                                      return Compare(object, name, length) > 0;
                                  });
    return found != objects_.end() ? &*found : nullptr;
}

}  // namespace korvagentx
