// Reading collector records without letting the JSON library throw.
//
// The fill-in functions share one rule for input of the wrong type: an
// element that is neither an object nor null, a "device" that is not a
// string where a record must name one, or a counter that the JSON library
// cannot read as an unsigned 32-bit number fails the call with false and a
// message naming the element and the member, and leaves the output untouched.
#ifndef KORVSNMP_JSON_READ_H
#define KORVSNMP_JSON_READ_H

#include <json/value.h>

namespace korvsnmp {

// A record as the collector sends it: an object, or null (a record without
// members).
inline bool IsRecord(const Json::Value &value) { return value.isObject() || value.isNull(); }

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

}  // namespace korvsnmp

#endif
