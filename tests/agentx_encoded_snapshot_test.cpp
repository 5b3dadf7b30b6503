// The snapshot's layout for answering: exact and next lookups at every edge
// (before, between, inside the shared prefix, past the last), the ASN types
// and texts handed to net-snmp.
#include "encoded_snapshot.h"  // net-snmp's configuration before its headers

#include <net-snmp/library/asn1.h>

#include <gtest/gtest.h>

#include <algorithm>

#include "mib_layout.h"

namespace {

using namespace korvagentx;

// korvObjects (arc.1) followed by `tail`.
Oid Under(std::initializer_list<uint32_t> tail)
{
    Oid name(std::begin(kKorvsnmpArc), std::end(kKorvsnmpArc));
    name.push_back(kObjects);
    name.insert(name.end(), tail);
    return name;
}

Snapshot Sorted(std::vector<Entry> entries)
{
    Snapshot snapshot;
    snapshot.entries = std::move(entries);
    std::sort(snapshot.entries.begin(), snapshot.entries.end(),
              [](const Entry &a, const Entry &b) { return a.oid < b.oid; });
    return snapshot;
}

// The name of a found object ("" for none), below korvObjects: "6.1.2.10".
std::string Named(const EncodedSnapshot &snapshot, const EncodedObject *object)
{
    if (object == nullptr)
        return "";
    std::string text;
    for (uint32_t i = std::size(kKorvsnmpArc) + 1; i < object->nameLength; ++i)
        text += (text.empty() ? "" : ".") + std::to_string(snapshot.Name(*object)[i]);
    return text;
}

TEST(EncodedSnapshot, ExactAndNextLookupsAtEveryEdge)
{
    const EncodedSnapshot snapshot(Sorted({{Under({1, 1, 0}), {ValueType::Unsigned32, 7, ""}},
                                           {Under({1, 2, 0}), {ValueType::SnapshotAge, 0, ""}},
                                           {Under({6, 1, 2, 1}), {ValueType::Text, 0, "sda"}},
                                           {Under({6, 1, 2, 10}), {ValueType::Text, 0, "sdb"}},
                                           {Under({6, 1, 3, 1}), {ValueType::Text, 0, "Disk 1"}}}));
    const Oid arc(std::begin(kKorvsnmpArc), std::end(kKorvsnmpArc));
    const std::tuple<Oid, std::string, std::string> cases[] = {
        // asked, exact, next
        {{1, 3}, "", "1.1.0"},
        {{0}, "", "1.1.0"},
        {arc, "", "1.1.0"},
        {Under({}), "", "1.1.0"},
        {Under({1}), "", "1.1.0"},
        {Under({1, 1, 0}), "1.1.0", "1.2.0"},
        {Under({1, 1, 0, 0}), "", "1.2.0"},
        {Under({1, 2}), "", "1.2.0"},
        {Under({2}), "", "6.1.2.1"},
        {Under({6, 1, 2, 1}), "6.1.2.1", "6.1.2.10"},
        {Under({6, 1, 2, 2}), "", "6.1.2.10"},
        {Under({6, 1, 2, 4294967295}), "", "6.1.3.1"},
        {Under({6, 1, 3, 1}), "6.1.3.1", ""},
        {Under({6, 1, 3, 1, 0}), "", ""},
        {Under({7}), "", ""},
        {{1, 3, 6, 1, 4}, "", ""},
        {{2}, "", ""},
    };
    for (const auto &[asked, exact, next] : cases) {
        const std::vector<oid> name(asked.begin(), asked.end());
        EXPECT_EQ(Named(snapshot, snapshot.Find(name.data(), name.size())), exact) << ::testing::PrintToString(asked);
        EXPECT_EQ(Named(snapshot, snapshot.FindNext(name.data(), name.size())), next) << ::testing::PrintToString(asked);
    }
}

TEST(EncodedSnapshot, EmptyAndSingleSnapshotsFindNothingBeyondThemselves)
{
    const EncodedSnapshot empty(Snapshot{});
    const std::vector<oid> anything = {1, 3, 6};
    EXPECT_EQ(empty.Find(anything.data(), anything.size()), nullptr);
    EXPECT_EQ(empty.FindNext(anything.data(), anything.size()), nullptr);
    EXPECT_EQ(empty.FindNext(nullptr, 0), nullptr);

    // One object: the prefix that all names share is the whole name.
    const EncodedSnapshot single(Sorted({{Under({3, 1, 0}), {ValueType::Gauge32, 1, ""}}}));
    const Oid own = Under({3, 1, 0});
    const std::vector<oid> name(own.begin(), own.end());
    EXPECT_EQ(Named(single, single.Find(name.data(), name.size())), "3.1.0");
    EXPECT_EQ(single.FindNext(name.data(), name.size()), nullptr);
    EXPECT_EQ(Named(single, single.FindNext(name.data(), name.size() - 1)), "3.1.0");
    EXPECT_EQ(Named(single, single.FindNext(nullptr, 0)), "3.1.0");
}

TEST(EncodedSnapshot, ValuesCarryTheirAsnTypesNumbersAndTexts)
{
    const EncodedSnapshot snapshot(Sorted({{Under({1, 1, 0}), {ValueType::Gauge32, 4294967295, ""}},
                                           {Under({1, 2, 0}), {ValueType::Counter32, 5, ""}},
                                           {Under({1, 3, 0}), {ValueType::Unsigned32, 6, ""}},
                                           {Under({1, 4, 0}), {ValueType::Counter64, 1ull << 40, ""}},
                                           {Under({1, 5, 0}), {ValueType::Integer, 3, ""}},
                                           {Under({1, 6, 0}), {ValueType::Text, 0, std::string("a\0b", 3)}},
                                           {Under({1, 7, 0}), {ValueType::Text, 0, ""}},
                                           {Under({1, 8, 0}), {ValueType::SnapshotAge, 0, ""}},
                                           {Under({1, 9, 0}), {ValueType::FailedSamples, 0, ""}}}));
    const std::tuple<u_char, uint64_t, std::string> expected[] = {
        {ASN_GAUGE, 4294967295, ""}, {ASN_COUNTER, 5, ""},  {ASN_UNSIGNED, 6, ""},
        {ASN_COUNTER64, 1ull << 40, ""}, {ASN_INTEGER, 3, ""}, {ASN_OCTET_STR, 0, std::string("a\0b", 3)},
        {ASN_OCTET_STR, 0, ""}, {ASN_UNSIGNED, 0, ""}, {ASN_COUNTER, 0, ""}};
    ASSERT_EQ(snapshot.Objects().size(), std::size(expected));
    for (size_t i = 0; i < std::size(expected); ++i) {
        const EncodedObject &object = snapshot.Objects()[i];
        const auto &[type, number, text] = expected[i];
        EXPECT_EQ(object.type, type) << i;
        EXPECT_EQ(object.number, number) << i;
        EXPECT_EQ(std::string(snapshot.Text(object), object.textLength), text) << i;
    }
}

}  // namespace
