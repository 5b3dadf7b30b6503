// Taking a value over from the collector's reply: a copy when the caller
// keeps the reply (a const one), the value itself when the caller has handed
// the reply over. The units that assemble the result are written once, as
// templates over the reply's constness, and use this where they take over.
#ifndef KORVSNMP_JSON_TAKE_H
#define KORVSNMP_JSON_TAKE_H

#include <type_traits>
#include <utility>

#include <json/value.h>

namespace korvsnmp {

// `Source` is const Json::Value (copied) or Json::Value (moved from; it is
// left null).
template <typename Source>
Json::Value Take(Source &value)
{
    static_assert(std::is_same_v<std::remove_const_t<Source>, Json::Value>);
    if constexpr (std::is_const_v<Source>)
        return value;
    else
        return std::move(value);
}

}  // namespace korvsnmp

#endif
