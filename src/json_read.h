// Reading collector records without letting the JSON library throw.
//
// The fill-in functions share one rule for the records of a section:
// - an element is an object, or null (a record without members);
// - its "device" is a string, or null, or absent: null and absent name no
//   device and read as the empty text, as the JSON library reads them;
// - a counter reads as Json::Value::asUInt reads it.
// Input outside the rule (an element of another type, a "device" that is a
// number, boolean, array or object, a counter that asUInt cannot read) fails
// the call with false and one message naming the element and the member, and
// leaves the output untouched. The network section alone skips an element
// whose "device" is no string, as its records require.
#ifndef KORVSNMP_JSON_READ_H
#define KORVSNMP_JSON_READ_H

#include <string>

#include <json/value.h>

namespace korvread {

// A record as the collector sends it: an object, or null (a record without
// members).
inline bool IsRecord(const Json::Value &value) { return value.isObject() || value.isNull(); }

// Reads the device name of `record` (IsRecord holds) into `device`: the
// string, or the empty text where "device" is null or absent. False, `device`
// untouched, where "device" is anything else.
inline bool ReadDeviceName(const Json::Value &record, std::string &device)
{
    static constexpr char kDevice[] = "device";
    const Json::Value *member =
        record.isObject() ? record.find(kDevice, kDevice + sizeof kDevice - 1) : nullptr;
    if (member == nullptr || member->isNull()) {
        device.clear();
        return true;
    }
    if (!member->isString())
        return false;
    device = member->asString();
    return true;
}

// Reads `value` exactly as Json::Value::asUInt does (null and false read as
// 0, true as 1, a fraction is cut). False, `out` untouched, where asUInt would
// throw: a negative number, one beyond 32 bits, a string, an array, an object.
inline bool ReadUInt32(const Json::Value &value, unsigned int &out)
{
    try {
        out = value.asUInt();
        return true;
    } catch (const Json::LogicError &) {
        return false;
    }
}

}  // namespace korvread

#endif
