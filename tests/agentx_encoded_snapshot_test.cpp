// The snapshot's layout for answering: exact and next lookups at every edge
// (before, between, inside the shared prefix, past the last), the ASN types
// and texts handed to net-snmp, and a sampled row's objects with the types
// of their MIB syntax.
#include "encoded_snapshot.h"  // net-snmp's configuration before its headers

#include <net-snmp/library/asn1.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <map>

#include <json/value.h>

#include "catalogue/statistics_catalogue.h"
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
                                           {Under({1, 9, 0}), {ValueType::FailedSamples, 0, ""}},
                                           {Under({1, 9, 1}), {ValueType::Counter64, UINT64_MAX, ""}},
                                           {Under({1, 9, 2}), {ValueType::TimeStamp, 4294967295, ""}},
                                           {Under({1, 9, 3}), {ValueType::Text, 0, "\xef\xbf\xbd\xc3\xa9"}}}));
    const std::tuple<u_char, uint64_t, std::string> expected[] = {
        {ASN_GAUGE, 4294967295, ""}, {ASN_COUNTER, 5, ""},  {ASN_UNSIGNED, 6, ""},
        {ASN_COUNTER64, 1ull << 40, ""}, {ASN_INTEGER, 3, ""}, {ASN_OCTET_STR, 0, std::string("a\0b", 3)},
        {ASN_OCTET_STR, 0, ""}, {ASN_UNSIGNED, 0, ""}, {ASN_COUNTER, 0, ""},
        {ASN_COUNTER64, UINT64_MAX, ""}, {ASN_TIMETICKS, 4294967295, ""},
        {ASN_OCTET_STR, 0, "\xef\xbf\xbd\xc3\xa9"}};
    ASSERT_EQ(snapshot.Objects().size(), std::size(expected));
    for (size_t i = 0; i < std::size(expected); ++i) {
        const EncodedObject &object = snapshot.Objects()[i];
        const auto &[type, number, text] = expected[i];
        EXPECT_EQ(object.type, type) << i;
        EXPECT_EQ(object.number, number) << i;
        EXPECT_EQ(std::string(snapshot.Text(object), object.textLength), text) << i;
    }
}

// Each SYNTAX of KORVSNMP-MIB and the ASN type that carries it on the wire.
const std::map<korvcatalogue::Syntax, u_char> kWireType = {
    {korvcatalogue::Syntax::SnmpAdminString, ASN_OCTET_STR},
    {korvcatalogue::Syntax::Integer, ASN_INTEGER},
    {korvcatalogue::Syntax::Unsigned32, ASN_UNSIGNED},
    {korvcatalogue::Syntax::Gauge32, ASN_GAUGE},
    {korvcatalogue::Syntax::Counter32, ASN_COUNTER},
    {korvcatalogue::Syntax::CounterBasedGauge64, ASN_COUNTER64},
    {korvcatalogue::Syntax::Counter64, ASN_COUNTER64},
    {korvcatalogue::Syntax::TimeStamp, ASN_TIMETICKS},
};

// A disk row with every member the catalogue names, and the disk total: each
// of their objects is found with the wire type of its syntax, the
// discontinuity times with the sample's sysUpTime.
TEST(EncodedSnapshot, ASampledRowAndItsTotalCarryTheTypesOfTheirSyntax)
{
    using korvcatalogue::Section;
    constexpr uint32_t kUpTime = 1234;
    Json::Value result;
    Json::Value &row = result["disk"]["disk"][0];
    for (const korvcatalogue::Statistic *statistic : korvcatalogue::StatisticsOf(Section::Disk))
        if (!statistic->member.empty())
            row[statistic->member] = Json::UInt64(1) << 40;
    row["device"] = "sda";
    row["display_name"] = "Disk \xC3\xA9";
    row["type"] = "internal";
    for (const korvcatalogue::Statistic *statistic : korvcatalogue::StatisticsOf(Section::DiskTotal))
        if (!statistic->member.empty() && statistic->kind != korvcatalogue::Kind::Counter)
            result["disk"]["total"][statistic->member] = 5;
    SampleMemory memory;
    const EncodedSnapshot snapshot(BuildSnapshot(result, {}, memory, 5, kUpTime, {}));

    std::map<u_char, size_t> seen;
    for (const Section section : {Section::Disk, Section::DiskTotal})
        for (const korvcatalogue::Statistic *statistic : korvcatalogue::StatisticsOf(section)) {
            if (statistic->syntax == korvcatalogue::Syntax::None || statistic->kind == korvcatalogue::Kind::Index)
                continue;
            const uint32_t group = korvcatalogue::SnmpGroupOf(section);
            const Oid own = section == Section::Disk ? Under({group, 1, statistic->snmpNumber, 1})
                                                     : Under({group, statistic->snmpNumber, 0});
            const std::vector<oid> name(own.begin(), own.end());
            const EncodedObject *object = snapshot.Find(name.data(), name.size());
            ASSERT_NE(object, nullptr) << statistic->snmpObject;
            EXPECT_EQ(object->type, kWireType.at(statistic->syntax)) << statistic->snmpObject;
            if (statistic->kind == korvcatalogue::Kind::Discontinuity) {
                EXPECT_EQ(object->number, kUpTime) << statistic->snmpObject;
            }
            if (statistic->syntax == korvcatalogue::Syntax::Counter64) {
                EXPECT_EQ(object->number, 1ull << 40) << statistic->snmpObject;
            }
            ++seen[object->type];
        }
    EXPECT_EQ(seen[ASN_TIMETICKS], 2u);
    EXPECT_GT(seen[ASN_COUNTER64], 0u);
    EXPECT_GT(seen[ASN_OCTET_STR], 0u);
    const std::vector<oid> displayName = [&] {
        const uint32_t column = korvcatalogue::Find(Section::Disk, "display_name")->snmpNumber;
        const Oid own = Under({korvcatalogue::SnmpGroupOf(Section::Disk), 1, column, 1});
        return std::vector<oid>(own.begin(), own.end());
    }();
    const EncodedObject *text = snapshot.Find(displayName.data(), displayName.size());
    ASSERT_NE(text, nullptr);
    EXPECT_EQ(std::string(snapshot.Text(*text), text->textLength), "Disk \xC3\xA9");
}

}  // namespace
