// korvsnmp-agentx's snapshot: the library's result as KORVSNMP-MIB objects,
// the row indexes kept between samples, and its command line.
#include <cstdio>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "json_text.h"
#include "mib_layout.h"
#include "agentx_options.h"
#include "snapshot.h"

namespace {

using namespace korvagentx;

// An OID below korvObjects, as text: "6.1.3.2" is korvDiskDisplayName.2.
std::string Below(const Oid &oid)
{
    std::string text;
    for (size_t i = std::size(kKorvsnmpArc) + 1; i < oid.size(); ++i)
        text += "." + std::to_string(oid[i]);
    return text.erase(0, 1);
}

// A first snapshot of `result`, "below = value" per entry; texts quoted, numbers marked by their type
// on the wire: Gauge32 and Unsigned32 (one tag) bare, Counter32 "c", Counter64 "L", INTEGER "i".
std::vector<std::string> FirstLines(const std::string &result, const NetworkKinds &kinds = {})
{
    using T = ValueType;
    TableIndexes indexes;
    const Snapshot snapshot = BuildSnapshot(korvtest::ParseJson(result), kinds, indexes, 5, {});
    std::vector<std::string> lines;
    for (const auto &[oid, v] : snapshot.entries) {
        const T t = v.type;
        const char *tag = t == T::Counter64 ? "L" : t == T::Integer ? "i" : t == T::Counter32 ? "c" : "";
        lines.push_back(Below(oid) + " = " + (t == T::Text ? '"' + v.text + '"' : t == T::SnapshotAge ? "age"
            : t == T::FailedSamples ? "failed" : std::to_string(v.number) + tag));
    }
    return lines;
}

TEST(AgentxSnapshot, EveryKindOfObjectInOidOrderWithTypesAndClamping)
{
    const std::vector<std::string> expected = {
        "1.1.0 = 1795000000", "1.2.0 = age", "1.3.0 = failed", "1.4.0 = 5",
        "2.1.0 = 12", "2.4.0 = 88",                                           // cpu: "extra" has no object
        "3.1.0 = 4096", "3.2.0 = 4294967295", "4.1.0 = 3",                    // memory clamped to 32 bits; nfs
        "5.1.0 = 3", "5.3.0 = 8589934592L",                                   // disk total: 64-bit
        "6.1.2.1 = \"sdb\"", "6.1.2.2 = \"sda\"", "6.1.3.1 = \"Disk 2\"", "6.1.3.2 = \"Disk 1\"",  // result order
        "6.1.4.1 = 2i", "6.1.4.2 = 5i", "6.1.7.1 = 7",                        // ebox, other
        "7.1.2.1 = \"total\"", "7.1.2.2 = \"eth0\"", "7.1.2.3 = \"bond0\"", "7.1.2.4 = \"ppp01\"",
        "7.1.3.1 = 1i", "7.1.3.2 = 2i", "7.1.3.3 = 3i", "7.1.3.4 = 4i",       // total, interface, aggregation, pppoe
        "7.1.4.1 = 30", "7.1.4.2 = 10", "7.1.4.3 = 20", "7.1.5.1 = 40", "7.1.5.4 = 1",
        "8.4.0 = 6L", "9.1.2.1 = \"dm-0\"", "9.1.3.1 = \"Volume 1\"", "9.1.8.1 = 9",  // volumes
        "10.1.2.1 = \"u-1\"", "10.1.3.1 = \"first\"", "10.1.5.1 = 2"};
    EXPECT_THAT(FirstLines(R"({"cpu": {"user": 12, "idle": 88, "extra": 1}, "nfs": {"calls": 3},
        "memory": {"memory_size": 4096, "total_real": 5000000000}, "time": 1795000000, "disk": {"disk": [
          {"device": "sdb", "display_name": "Disk 2", "type": "ebox", "read_byte": 7}, {"device": "sda",
          "display_name": "Disk 1", "type": "unheard-of"}], "total": {"device": "total", "utilization": 3,
          "read_byte": 8589934592}},
        "network": [{"device": "total", "rx": 30, "tx": 40}, {"device": "eth0", "rx": 10},
          {"device": "bond0", "rx": 20}, {"device": "ppp01", "tx": 1}],
        "space": {"volume": [{"device": "dm-0", "display_name": "Volume 1", "write_byte": 9}],
          "total": {"device": "total", "write_access": 6}}, "lun": [{"uuid": "u-1", "lun_name": "first",
          "read_access": 2}]})", {{"bond0"}, "ppp0"}), ::testing::ElementsAreArray(expected));
}

TEST(AgentxSnapshot, MissingMisshapenOrUnnamedGiveNoObjectsForThemAndNeverThrow)
{
    std::vector<std::string> expected = {"1.2.0 = age", "1.3.0 = failed", "1.4.0 = 5"};  // the agent's own
    for (const char *result : {"null", "[]", "\"text\"", "7",
        R"({"cpu": [1], "memory": "x", "nfs": null, "disk": [], "network": {}, "space": 5, "lun": {"uuid": "u"}, "time": -1})",
        R"({"disk": {"disk": {}, "total": []}, "network": [1, null, [2]], "space": {"volume": "v", "total": 3}, "lun": [1, "x"], "time": "now"})",
        R"({"cpu": {"user": -3, "idle": 1.5, "system": "9", "nice": true, "irq": {}}})"})
        EXPECT_THAT(FirstLines(result), ::testing::ElementsAreArray(expected)) << result;
    // rows without a name keep their other cells; long names are cut
    const std::string longName(300, 'v');
    expected.insert(expected.end(), {"7.1.3.1 = 2i", "7.1.3.2 = 2i", "7.1.4.1 = 1", "7.1.4.2 = 2",
                                     "9.1.3.1 = \"" + longName.substr(0, 255) + "\""});
    EXPECT_THAT(FirstLines(R"({"network": [{"device": 5, "rx": 1}, {"rx": 2}], )"
                           R"("space": {"volume": [{"display_name": ")" + longName + R"("}]}})"),
                ::testing::ElementsAreArray(expected));
}

TEST(AgentxSnapshot, ADeviceKeepsItsIndexWhileItIsPresentAndNeverGetsAnOldOneBack)
{
    const std::pair<std::vector<std::string>, std::vector<uint32_t>> steps[] = {  // devices, their indexes
        {{"sda", "sdb"}, {1, 2}}, {{"sdb", "sdc", "sda"}, {2, 3, 1}},  // order follows the result; indexes stay
        {{"sdc"}, {3}}, {{"sda", "sdc"}, {4, 3}},                    // sda and sdb gone; sda back: a new index
        {{}, {}}, {{"sdc#1", "sdc#2"}, {5, 6}}};  // no section: an empty table; a device twice: two rows
    RowIndexes indexes;
    for (const auto &[devices, expected] : steps)
        EXPECT_EQ(indexes.Assign(devices), expected);
}

TEST(AgentxSnapshot, InstancesOfKnownObjectsTellNoSuchInstanceFromNoSuchObject)
{
    const std::pair<Oid, bool> cases[] = {  // below korvObjects
        {{1, 4, 0}, true}, {{1, 5, 0}, false}, {{1, 1}, false}, {{1, 1, 0, 0}, false}, {{6, 1, 9, 77}, true},
        {{6, 1, 1, 1}, false}, {{6, 1, 10, 1}, false}, {{10, 1, 8, 1}, true}, {{11, 1, 0}, false}};
    for (const auto &[below, known] : cases) {
        Oid oid(std::begin(kKorvsnmpArc), std::end(kKorvsnmpArc));
        oid.push_back(kObjects);
        oid.insert(oid.end(), below.begin(), below.end());
        EXPECT_EQ(IsInstanceOfKnownObject(oid), known) << Below(oid);
    }
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
        {{"--version"}, ""},
        {{"-V"}, ""}};
    for (const auto &[arguments, expected] : cases) {
        Options options;
        std::string error;
        EXPECT_EQ(ParseOptions(arguments, options, error), expected.empty());
        EXPECT_EQ(error, expected);
    }
}

// Like korvsnmp-stat and korvsnmpcd: the name, the version, status 0.
TEST(AgentxProgram, VersionAnswersLikeTheOtherPrograms)
{
    FILE *program = popen(KORVSNMP_AGENTX_PATH " --version 2>&1", "r");
    ASSERT_NE(program, nullptr);
    char line[256] = {};
    const bool read = std::fgets(line, sizeof line, program) != nullptr;
    const int status = pclose(program);
    EXPECT_TRUE(read);
    EXPECT_EQ(std::string(line), std::string("korvsnmp-agentx ") + KORVSNMP_PROJECT_VERSION + "\n");
    EXPECT_EQ(status, 0);
}

}  // namespace
