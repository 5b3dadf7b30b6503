// korvsnmp-agentx's snapshot: the library's result as KORVSNMP-MIB objects,
// the row indexes kept between samples, and its command line.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "json_text.h"
#include "mib_layout.h"
#include "agentx_options.h"
#include "snapshot.h"

namespace {

using korvagentx::BuildSnapshot;
using korvagentx::NetworkKinds;
using korvagentx::Oid;
using korvagentx::Snapshot;
using korvagentx::TableIndexes;
using korvagentx::ValueType;
using korvtest::ParseJson;

// An OID below korvObjects, as text: "6.1.3.2" is korvDiskDisplayName.2.
std::string Below(const Oid &oid)
{
    const size_t skip = std::size(korvagentx::kKorvsnmpArc) + 1;
    std::string text;
    for (size_t i = skip; i < oid.size(); ++i)
        text += (i == skip ? "" : ".") + std::to_string(oid[i]);
    return text;
}

Oid Full(std::initializer_list<uint32_t> below)
{
    Oid oid(std::begin(korvagentx::kKorvsnmpArc), std::end(korvagentx::kKorvsnmpArc));
    oid.push_back(korvagentx::kObjects);
    oid.insert(oid.end(), below);
    return oid;
}

// "below = value" per entry; texts quoted, Counter64 marked.
std::vector<std::string> Lines(const Snapshot &snapshot)
{
    std::vector<std::string> lines;
    for (const korvagentx::Entry &entry : snapshot.entries) {
        std::string value;
        const ValueType type = entry.value.type;
        value = type == ValueType::Text            ? '"' + entry.value.text + '"'
                : type == ValueType::SnapshotAge   ? "age"
                : type == ValueType::FailedSamples ? "failed"
                : std::to_string(entry.value.number) + (type == ValueType::Counter64 ? "L" : "");
        lines.push_back(Below(entry.oid) + " = " + value);
    }
    return lines;
}

Snapshot Build(const std::string &result, TableIndexes &indexes, const NetworkKinds &kinds = {})
{
    return BuildSnapshot(ParseJson(result), kinds, indexes, 5, std::chrono::steady_clock::now());
}

const std::vector<std::string> kAgentScalarsWithoutTime = {"1.2.0 = age", "1.3.0 = failed",
                                                           "1.4.0 = 5"};

TEST(AgentxSnapshot, EveryKindOfObjectInOidOrderWithTypesAndClamping)
{
    TableIndexes indexes;
    NetworkKinds kinds{{"bond0"}, "ppp0"};
    Snapshot snapshot = Build(R"({
        "cpu": {"user": 12, "idle": 88, "extra": 1},
        "memory": {"memory_size": 4096, "total_real": 5000000000},
        "nfs": {"calls": 3},
        "disk": {"disk": [{"device": "sdb", "display_name": "Disk 2", "type": "ebox", "read_byte": 7},
                          {"device": "sda", "display_name": "Disk 1", "type": "unheard-of"}],
                 "total": {"device": "total", "utilization": 3, "read_byte": 8589934592}},
        "network": [{"device": "total", "rx": 30, "tx": 40}, {"device": "eth0", "rx": 10},
                    {"device": "bond0", "rx": 20}, {"device": "ppp01", "tx": 1}],
        "space": {"volume": [{"device": "dm-0", "display_name": "Volume 1", "write_byte": 9}],
                  "total": {"device": "total", "write_access": 6}},
        "lun": [{"uuid": "u-1", "lun_name": "first", "read_access": 2}],
        "time": 1795000000})",
                              indexes, kinds);

    std::vector<std::string> expected = {"1.1.0 = 1795000000"};
    expected.insert(expected.end(), kAgentScalarsWithoutTime.begin(), kAgentScalarsWithoutTime.end());
    expected.insert(expected.end(), {
        "2.1.0 = 12", "2.4.0 = 88",                    // cpu: user, idle; "extra" has no object
        "3.1.0 = 4096", "3.2.0 = 4294967295",          // memory: clamped to 32 bits
        "4.1.0 = 3",                                   // nfs calls
        "5.1.0 = 3", "5.3.0 = 8589934592L",            // disk total: 64-bit
        "6.1.2.1 = \"sdb\"", "6.1.2.2 = \"sda\"",      // disk rows in result order
        "6.1.3.1 = \"Disk 2\"", "6.1.3.2 = \"Disk 1\"",
        "6.1.4.1 = 2", "6.1.4.2 = 5",                  // ebox, other
        "6.1.7.1 = 7",
        "7.1.2.1 = \"total\"", "7.1.2.2 = \"eth0\"", "7.1.2.3 = \"bond0\"", "7.1.2.4 = \"ppp01\"",
        "7.1.3.1 = 1", "7.1.3.2 = 2", "7.1.3.3 = 3", "7.1.3.4 = 4",  // total, interface, aggregation, pppoe
        "7.1.4.1 = 30", "7.1.4.2 = 10", "7.1.4.3 = 20",
        "7.1.5.1 = 40", "7.1.5.4 = 1",
        "8.4.0 = 6L",                                  // volume total
        "9.1.2.1 = \"dm-0\"", "9.1.3.1 = \"Volume 1\"", "9.1.8.1 = 9",
        "10.1.2.1 = \"u-1\"", "10.1.3.1 = \"first\"", "10.1.5.1 = 2",
    });
    EXPECT_THAT(Lines(snapshot), ::testing::ElementsAreArray(expected));
    EXPECT_EQ(snapshot.Find(Full({3, 2, 0}))->value.type, ValueType::Gauge32);
    EXPECT_EQ(snapshot.Find(Full({6, 1, 4, 1}))->value.type, ValueType::Integer);
}

TEST(AgentxSnapshot, MissingOrMisshapenSectionsGiveNoObjectsAndNeverThrow)
{
    const char *const results[] = {
        "null", "[]", "\"text\"", "7",
        R"({"cpu": [1], "memory": "x", "nfs": null, "disk": [], "network": {}, "space": 5,
            "lun": {"uuid": "u"}, "time": -1})",
        R"({"disk": {"disk": {}, "total": []}, "network": [1, null, [2]],
            "space": {"volume": "v", "total": 3}, "lun": [1, "x"], "time": "now"})",
        R"({"cpu": {"user": -3, "idle": 1.5, "system": "9", "nice": true, "irq": {}}})",
    };
    for (const char *result : results) {
        TableIndexes indexes;
        EXPECT_THAT(Lines(Build(result, indexes)), ::testing::ElementsAreArray(kAgentScalarsWithoutTime))
            << result;
    }
}

TEST(AgentxSnapshot, RowsWithoutANameKeepTheirOtherCellsAndLongNamesAreCut)
{
    TableIndexes indexes;
    const std::string name(300, 'v');
    Snapshot snapshot = Build(R"({"network": [{"device": 5, "rx": 1}, {"rx": 2}],
                                  "space": {"volume": [{"display_name": ")" + name + R"("}]}})",
                              indexes);
    std::vector<std::string> expected = kAgentScalarsWithoutTime;
    expected.insert(expected.end(), {"7.1.3.1 = 2", "7.1.3.2 = 2", "7.1.4.1 = 1", "7.1.4.2 = 2",
                                     "9.1.3.1 = \"" + name.substr(0, 255) + "\""});
    EXPECT_THAT(Lines(snapshot), ::testing::ElementsAreArray(expected));
}

struct IndexStep {
    std::vector<std::string> disks;
    std::vector<uint32_t> indexes;
};

TEST(AgentxSnapshot, ADeviceKeepsItsIndexWhileItIsPresentAndNeverGetsAnOldOneBack)
{
    const IndexStep steps[] = {
        {{"sda", "sdb"}, {1, 2}},
        {{"sdb", "sdc", "sda"}, {2, 3, 1}},   // order follows the result; indexes stay
        {{"sdc"}, {3}},                        // sda and sdb gone
        {{"sda", "sdc"}, {4, 3}},              // sda back: a new index
        {{}, {}},                              // a missing section empties the table
        {{"sdc#1", "sdc#2"}, {5, 6}},          // a device twice: two keys, two rows
    };
    korvagentx::RowIndexes indexes;
    for (const IndexStep &step : steps)
        EXPECT_EQ(indexes.Assign(step.disks), step.indexes);
}

TEST(AgentxSnapshot, FindAndFindNextAtTheEdges)
{
    TableIndexes indexes;
    Snapshot snapshot = Build(R"({"lun": [{"uuid": "u-1", "lun_name": "first"}]})", indexes);
    const Oid arc(std::begin(korvagentx::kKorvsnmpArc), std::end(korvagentx::kKorvsnmpArc));
    const Oid last = Full({10, 1, 3, 1});

    EXPECT_EQ(snapshot.FindNext(arc)->oid, Full({1, 2, 0}));        // before the first: the first
    EXPECT_EQ(snapshot.FindNext(Full({1, 2, 0}))->oid, Full({1, 3, 0}));
    EXPECT_EQ(snapshot.FindNext(Full({10, 1, 2}))->oid, Full({10, 1, 2, 1}));
    EXPECT_EQ(snapshot.FindNext(last), nullptr);                    // past the end
    EXPECT_EQ(snapshot.FindNext(Full({10, 1, 3, 1, 0})), nullptr);
    EXPECT_EQ(snapshot.Find(Full({10, 1, 2})), nullptr);            // a column, not an instance
    EXPECT_EQ(snapshot.Find(Full({10, 1, 2, 2})), nullptr);         // a missing row
    EXPECT_EQ(snapshot.Find(last)->value.text, "first");
}

TEST(AgentxSnapshot, InstancesOfKnownObjectsTellNoSuchInstanceFromNoSuchObject)
{
    const std::pair<Oid, bool> cases[] = {
        {Full({1, 4, 0}), true},      {Full({1, 5, 0}), false},     {Full({1, 1}), false},
        {Full({1, 1, 0, 0}), false},  {Full({6, 1, 9, 77}), true},  {Full({6, 1, 1, 1}), false},
        {Full({6, 1, 10, 1}), false}, {Full({10, 1, 8, 1}), true},  {Full({11, 1, 0}), false},
    };
    for (const auto &[oid, known] : cases)
        EXPECT_EQ(korvagentx::IsInstanceOfKnownObject(oid), known) << Below(oid);
}

TEST(AgentxOptions, CommandLines)
{
    const std::pair<std::vector<std::string>, std::string> cases[] = {  // arguments, error
        {{"--interval", "86400", "--agentx-socket", "/run/x", "--ping-interval", "1"}, ""},
        {{"--interval", "0"}, "--interval wants whole seconds from 1 to 86400, not \"0\""},
        {{"--ping-interval", "1.5"}, "--ping-interval wants whole seconds from 1 to 86400, not \"1.5\""},
        {{"--interval", "99999999999999999999"},
         "--interval wants whole seconds from 1 to 86400, not \"99999999999999999999\""},
        {{"--persistent-dir", ""}, "--persistent-dir needs a non-empty value"},
        {{"--agentx-socket"}, "--agentx-socket needs a value"},
        {{"--verbose"}, "unknown argument \"--verbose\""},
    };
    for (const auto &[arguments, expected] : cases) {
        korvagentx::Options options;
        std::string error;
        EXPECT_EQ(korvagentx::ParseOptions(arguments, options, error), expected.empty());
        EXPECT_EQ(error, expected);
    }
}

}  // namespace
