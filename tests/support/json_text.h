// JSON in tests: parse a literal, and compare values by their compact text,
// since Json::Value's == tells an unsigned 9 from a signed 9.
#ifndef KORVTEST_JSON_TEXT_H
#define KORVTEST_JSON_TEXT_H

#include <string>

#include <gtest/gtest.h>
#include <json/reader.h>

#include "protocol/collector_protocol.h"

namespace korvtest {

inline Json::Value ParseJson(const std::string &text)
{
    Json::Value value;
    EXPECT_TRUE(Json::Reader().parse(text, value)) << text;
    return value;
}

// One line, object members in key order, numbers as written.
inline std::string JsonText(const Json::Value &value) { return korvproto::CompactJson(value); }

// The compact text of a JSON literal, for comparison with JsonText.
inline std::string Canonical(const std::string &text) { return JsonText(ParseJson(text)); }

}  // namespace korvtest

#endif
