// korvsnmp-agentx's snapshot: the library's result as KORVSNMP-MIB objects,
// its counters, totals and discontinuity times from sample to sample, the
// row indexes and the file that keeps them, and the command line.
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "agentx_options.h"
#include "catalogue/utf8_text.h"
#include "json_text.h"
#include "mib_layout.h"
#include "snapshot.h"
#include "syslog_capture.h"

namespace {

using namespace korvagentx;
using ::testing::ElementsAre;
using ::testing::ElementsAreArray;
using ::testing::IsEmpty;
using korvtest::Logged;
using korvtest::LoggedMessages;

// An OID below korvObjects, as text: "6.1.3.2" is korvDiskDisplayName.2.
std::string Below(const Oid &oid)
{
    std::string text;
    for (size_t i = std::size(kKorvsnmpArc) + 1; i < oid.size(); ++i)
        text += "." + std::to_string(oid[i]);
    return text.erase(0, 1);
}

// The OID of `below` korvObjects.
Oid Objects(const std::vector<uint32_t> &below)
{
    Oid oid(std::begin(kKorvsnmpArc), std::end(kKorvsnmpArc));
    oid.push_back(kObjects);
    oid.insert(oid.end(), below.begin(), below.end());
    return oid;
}

// A snapshot of `result`, "below = value" per entry whose text starts with one of `only` (all when
// empty); texts quoted, numbers marked by their type on the wire: Gauge32 and Unsigned32 (one tag)
// bare, Counter32 "c", Counter64 "L", INTEGER "i", TimeTicks "t".
std::vector<std::string> Lines(const std::string &result, SampleMemory &memory, uint32_t upTime = 0,
                               const NetworkKinds &kinds = {}, const std::vector<std::string> &only = {})
{
    using T = ValueType;
    const Snapshot snapshot = BuildSnapshot(korvtest::ParseJson(result), kinds, memory, 5, upTime, {});
    std::vector<std::string> lines;
    for (const auto &[oid, v] : snapshot.entries) {
        const T t = v.type;
        const char *tag = t == T::Counter64 ? "L" : t == T::Integer ? "i" : t == T::Counter32 ? "c"
            : t == T::TimeStamp ? "t" : "";
        const std::string line = Below(oid) + " = " + (t == T::Text ? '"' + v.text + '"' : t == T::SnapshotAge ? "age"
            : t == T::FailedSamples ? "failed" : std::to_string(v.number) + tag);
        const bool wanted = only.empty() || std::any_of(only.begin(), only.end(), [&](const std::string &prefix) {
            return line.rfind(prefix, 0) == 0; });
        if (wanted)
            lines.push_back(line);
    }
    return lines;
}

std::vector<std::string> FirstLines(const std::string &result, const NetworkKinds &kinds = {})
{
    SampleMemory memory;
    return Lines(result, memory, 0, kinds);
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
        "10.1.2.1 = \"u-1\"", "10.1.3.1 = \"first\"", "10.1.5.1 = 2"};        // no counters: none served
    EXPECT_THAT(FirstLines(R"({"cpu": {"user": 12, "idle": 88, "extra": 1}, "nfs": {"calls": 3},
        "memory": {"memory_size": 4096, "total_real": 5000000000}, "time": 1795000000, "disk": {"disk": [
          {"device": "sdb", "display_name": "Disk 2", "type": "ebox", "read_byte": 7}, {"device": "sda",
          "display_name": "Disk 1", "type": "unheard-of"}], "total": {"device": "total", "utilization": 3,
          "read_byte": 8589934592}},
        "network": [{"device": "total", "rx": 30, "tx": 40}, {"device": "eth0", "rx": 10},
          {"device": "bond0", "rx": 20}, {"device": "ppp01", "tx": 1}],
        "space": {"volume": [{"device": "dm-0", "display_name": "Volume 1", "write_byte": 9}],
          "total": {"device": "total", "write_access": 6}}, "lun": [{"uuid": "u-1", "lun_name": "first",
          "read_access": 2}]})", {{"bond0"}, "ppp0"}), ElementsAreArray(expected));
}

TEST(AgentxSnapshot, MissingMisshapenOrUnnamedGiveNoObjectsForThemAndNeverThrow)
{
    std::vector<std::string> expected = {"1.2.0 = age", "1.3.0 = failed", "1.4.0 = 5"};  // the agent's own
    for (const char *result : {"null", "[]", "\"text\"", "7",
        R"({"cpu": [1], "memory": "x", "nfs": null, "disk": [], "network": {}, "space": 5, "lun": {"uuid": "u"}, "time": -1})",
        R"({"disk": {"disk": {}, "total": []}, "network": [1, null, [2]], "space": {"volume": "v", "total": 3}, "lun": [1, "x"], "time": "now"})",
        R"({"cpu": {"user": -3, "idle": 1.5, "system": "9", "nice": true, "irq": {}}})"})
        EXPECT_THAT(FirstLines(result), ElementsAreArray(expected)) << result;
    // rows without a name keep their other cells; long names are cut
    const std::string longName(300, 'v');
    expected.insert(expected.end(), {"7.1.3.1 = 2i", "7.1.3.2 = 2i", "7.1.4.1 = 1", "7.1.4.2 = 2",
                                     "9.1.3.1 = \"" + longName.substr(0, 255) + "\""});
    EXPECT_THAT(FirstLines(R"({"network": [{"device": 5, "rx": 1}, {"rx": 2}], )"
                           R"("space": {"volume": [{"display_name": ")" + longName + R"("}]}})"),
                ElementsAreArray(expected));
}

TEST(AgentxSnapshot, CountersAreCounter64CellsWithTheirDiscontinuityTime)
{
    SampleMemory memory;
    EXPECT_THAT(Lines(R"({"cpu": {"user": 1, "user_ticks_total": 18446744073709551615, "steal_ticks_total": 0},
        "nfs": {"calls_total": 4294967296}, "disk": {"disk": [{"device": "sda", "read_byte_total": 5,
        "busy_ms_total": 6}]}, "lun": [{"uuid": "u", "command_total": 7, "write_mbyte_total": 8}],
        "space": {"volume": [{"device": "dm-0", "write_access_total": 9}]}})", memory, 4200, {},
                      {"2.", "4.", "5.", "6.1.1", "10.", "8.", "9.1.1"}),
                ElementsAre("2.1.0 = 1", "2.9.0 = 18446744073709551615L", "2.16.0 = 0L", "2.17.0 = 4200t",
                            "4.4.0 = 4294967296L", "4.7.0 = 4200t",
                            "5.7.0 = 5L", "5.10.0 = 6L", "5.11.0 = 4200t",  // the disks' sums
                            "6.1.11.1 = 5L", "6.1.14.1 = 6L", "6.1.15.1 = 4200t",
                            "8.8.0 = 9L", "8.11.0 = 4200t", "9.1.11.1 = 9L", "9.1.14.1 = 4200t",
                            "10.1.2.1 = \"u\"", "10.1.9.1 = 7L", "10.1.11.1 = 8L", "10.1.12.1 = 4200t"));
}

TEST(AgentxSnapshot, ACounterThatIsNoUnsigned64BitIntegerGivesNoCellAndOneLogLineWhenTheirNumberChanges)
{
    const std::string bad[] = {"-1", "1.5", "5.0", "\"5\"", "18446744073709551616", "true", "null", "{}", "[1]"};
    for (const std::string &value : bad) {
        SampleMemory memory;
        korvtest::ClearLog();
        EXPECT_THAT(Lines(R"({"disk": {"disk": [{"device": "sda", "read_byte_total": )" + value +
                          R"(, "write_byte_total": 3}]}})", memory, 1, {}, {"6.1.1"}),
                    ElementsAre("6.1.13.1 = 3L", "6.1.15.1 = 1t")) << value;
        EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_WARNING, "snapshot",
            "Counter values that are not integers from 0 to 2^64 - 1 are left out: 1 in this sample, the first "
            "korvDiskReadByteTotal.1")))
            << value;
    }
    SampleMemory memory;
    const std::string twoBad = R"({"network": [{"device": "eth0", "rx_byte_total": -1, "tx_drop_total": "x"}]})";
    korvtest::ClearLog();
    Lines(twoBad, memory);
    Lines(twoBad, memory);  // the same number again: not logged again
    Lines(R"({"network": [{"device": "eth0", "rx_byte_total": -1}]})", memory);
    Lines(R"({"network": [{"device": "eth0", "rx_byte_total": 1}]})", memory);
    EXPECT_THAT(LoggedMessages(), ElementsAre(
        Logged(LOG_WARNING, "snapshot", "Counter values that are not integers from 0 to 2^64 - 1 are left out: "
                                        "2 in this sample, the first korvIfRxByteTotal.1"),
        Logged(LOG_WARNING, "snapshot", "Counter values that are not integers from 0 to 2^64 - 1 are left out: "
                                        "1 in this sample, the first korvIfRxByteTotal.1")));
}

TEST(AgentxSnapshot, TotalsAreTheRowsSumsModulo2To64WhereEveryRowHasTheCounter)
{
    SampleMemory memory;
    EXPECT_THAT(Lines(R"({"disk": {"disk": [{"device": "sda", "read_byte_total": 18446744073709551615,
        "write_byte_total": 4}, {"device": "sdb", "read_byte_total": 3}], "total": {"device": "total",
        "read_byte": 10, "read_byte_total": 777}}})", memory, 0, {}, {"5."}),
                ElementsAre("5.3.0 = 10L", "5.7.0 = 2L", "5.11.0 = 0t"));  // wrapped; sdb lacks write_byte_total
    // The interface total: the rows of kind interface; an aggregation has no counters, PPPoE its own.
    const NetworkKinds kinds{{"bond0"}, "ppp0"};
    EXPECT_THAT(Lines(R"({"network": [{"device": "total", "rx": 9, "rx_byte_total": 1000},
        {"device": "eth0", "rx_byte_total": 10, "tx_packet_total": 1}, {"device": "eth1", "rx_byte_total": 20},
        {"device": "bond0", "rx_byte_total": 30}, {"device": "ppp0", "rx_byte_total": 40}]})",
                      memory, 0, kinds, {"7.1.6.", "7.1.11.", "7.1.14."}),
                ElementsAre("7.1.6.1 = 30L", "7.1.6.2 = 10L", "7.1.6.3 = 20L", "7.1.6.5 = 40L", "7.1.11.2 = 1L",
                            "7.1.14.1 = 0t", "7.1.14.2 = 0t", "7.1.14.3 = 0t", "7.1.14.5 = 0t"));
    EXPECT_THAT(Lines(R"({"disk": {"disk": [], "total": {"device": "total"}}})", memory, 0, {}, {"5."}), IsEmpty());
}

TEST(AgentxSnapshot, TheDiscontinuityTimeMovesWhenARowAppearsOrACounterGoesBack)
{
    SampleMemory memory;
    struct Step {
        uint32_t upTime;
        std::string disks;  // the "disk" rows
        std::vector<std::string> expected;
    };
    const Step steps[] = {
        {100, R"({"device": "sda", "read_byte_total": 10}, {"device": "sdb", "read_byte_total": 5})",
         {"5.7.0 = 15L", "5.11.0 = 100t", "6.1.15.1 = 100t", "6.1.15.2 = 100t"}},
        {200, R"({"device": "sda", "read_byte_total": 4294967306}, {"device": "sdb", "read_byte_total": 5})",
         {"5.7.0 = 4294967311L", "5.11.0 = 100t", "6.1.15.1 = 100t", "6.1.15.2 = 100t"}},  // past 2^32
        {300, R"({"device": "sda", "read_byte_total": 4294967306}, {"device": "sdb", "read_byte_total": 4})",
         {"5.7.0 = 4294967310L", "5.11.0 = 300t", "6.1.15.1 = 100t", "6.1.15.2 = 300t"}},  // sdb back by one
        {400, R"({"device": "sda", "read_byte_total": 4294967306}, {"device": "sdb", "read_byte_total": "?"})",
         {"6.1.15.1 = 100t"}},  // no sdb counter: no total, sdb without counters
        {500, R"({"device": "sda", "read_byte_total": 4294967306}, {"device": "sdb", "read_byte_total": 3})",
         {"5.7.0 = 4294967309L", "5.11.0 = 500t", "6.1.15.1 = 100t", "6.1.15.2 = 500t"}},  // lower than the last seen
        {600, R"({"device": "sda", "read_byte_total": 4294967306})",
         {"5.7.0 = 4294967306L", "5.11.0 = 600t", "6.1.15.1 = 100t"}},  // sdb gone: the sum goes back
        {700, R"({"device": "sdb", "read_byte_total": 3}, {"device": "sda", "read_byte_total": 4294967306})",
         {"5.7.0 = 4294967309L", "5.11.0 = 600t", "6.1.15.1 = 100t", "6.1.15.2 = 700t"}}};  // sdb back: anew
    for (const Step &step : steps)
        EXPECT_THAT(Lines(R"({"disk": {"disk": [)" + step.disks + "]}}", memory, step.upTime, {},
                          {"5.7.", "5.11.", "6.1.15."}),
                    ElementsAreArray(step.expected)) << step.upTime;
}

TEST(AgentxSnapshot, NamesBecomeValidUtf8OfAtMost255Bytes)
{
    std::string accents;
    for (int i = 0; i < 200; ++i)
        accents += "\xC3\xA9";  // é
    const std::pair<std::string, std::string> cases[] = {  // name, served
        {accents, accents.substr(0, 254)},                 // cut after a whole character
        {"a\xFF" "b\xC3", "a\xEF\xBF\xBD" "b\xEF\xBF\xBD"},  // invalid bytes become U+FFFD
        {std::string(254, 'x') + "\xC3\xA9", std::string(254, 'x')}};
    for (const auto &[name, served] : cases) {
        Json::Value result;
        result["lun"][0]["uuid"] = "u";
        result["lun"][0]["lun_name"] = name;
        SampleMemory memory;
        const Snapshot snapshot = BuildSnapshot(result, {}, memory, 5, 0, {});
        const Oid lunName = Objects({10, 1, 3, 1});  // korvLunName.1
        const auto entry = std::find_if(snapshot.entries.begin(), snapshot.entries.end(),
                                        [&](const Entry &each) { return each.oid == lunName; });
        ASSERT_NE(entry, snapshot.entries.end());
        EXPECT_EQ(entry->value.text, served);
        EXPECT_LE(entry->value.text.size(), 255u);
        EXPECT_EQ(korvcatalogue::ValidUtf8(entry->value.text), entry->value.text);
    }
}

TEST(AgentxSnapshot, InstancesOfKnownObjectsTellNoSuchInstanceFromNoSuchObject)
{
    const std::pair<Oid, bool> cases[] = {  // below korvObjects
        {{1, 4, 0}, true}, {{1, 5, 0}, false}, {{1, 1}, false}, {{1, 1, 0, 0}, false}, {{6, 1, 9, 77}, true},
        {{6, 1, 1, 1}, false}, {{6, 1, 15, 1}, true}, {{6, 1, 16, 1}, false}, {{10, 1, 12, 1}, true},
        {{10, 1, 13, 1}, false}, {{11, 1, 0}, false}, {{2, 17, 0}, true}, {{2, 18, 0}, false},
        {{5, 11, 0}, true}, {{5, 12, 0}, false}, {{7, 1, 14, 4}, true}, {{7, 2, 14, 4}, false}};
    for (const auto &[below, known] : cases)
        EXPECT_EQ(IsInstanceOfKnownObject(Objects(below)), known) << Below(Objects(below));
}

TEST(AgentxRowIndexes, ADeviceKeepsItsIndexWhileItIsRememberedAndNoOtherGetsIt)
{
    const std::pair<std::vector<std::string>, std::vector<uint32_t>> steps[] = {  // devices, their indexes
        {{"sda", "sdb"}, {1, 2}}, {{"sdb", "sdc", "sda"}, {2, 3, 1}},  // order follows the result; indexes stay
        {{"sdc"}, {3}}, {{"sda", "sdd"}, {1, 4}},                    // sda back: its index; sdd a new one
        {{}, {}}, {{"sdc", "sdc"}, {3, 5}}, {{"sdc"}, {3}}};         // a device twice: two rows
    RowIndexes indexes;
    for (const auto &[devices, expected] : steps)
        EXPECT_EQ(indexes.Assign(devices), expected);
}

TEST(AgentxRowIndexes, TheAbsentSeenLongestAgoAreForgottenBeyondTheBound)
{
    RowIndexes indexes;
    EXPECT_EQ(indexes.Assign({"old1", "old2"}), (std::vector<uint32_t>{1, 2}));
    std::vector<std::string> many;
    for (size_t i = 0; i < RowIndexes::kRemembered; ++i)
        many.push_back("dev" + std::to_string(i));
    indexes.TakeChanged();
    indexes.Assign(many);  // indexes 3 to 4098
    EXPECT_TRUE(indexes.TakeChanged());
    EXPECT_EQ(indexes.Assign({"new"}), std::vector<uint32_t>{4099});  // 4098 absent: old1, old2 forgotten
    EXPECT_EQ(indexes.Rows().size(), RowIndexes::kRemembered + 1);
    EXPECT_EQ(indexes.Assign({"dev0", "old1"}), (std::vector<uint32_t>{3, 4100}));
}

TEST(AgentxRowIndexes, NumbersWrapAfterTheLastAndSkipThoseHeld)
{
    RowIndexes indexes;
    ASSERT_TRUE(indexes.Restore({{"a\x1f" "0", 1}, {"b\x1f" "0", 4294967295u}, {"c\x1f" "0", 3}}, 4294967294u));
    EXPECT_EQ(indexes.Assign({"d", "e", "f", "a"}), (std::vector<uint32_t>{4294967294u, 2, 4, 1}));
    EXPECT_EQ(indexes.Next(), 5u);
    EXPECT_FALSE(indexes.Restore({{"a\x1f" "0", 1}, {"b\x1f" "0", 1}}, 2));  // one index twice
    EXPECT_THAT(indexes.Rows(), IsEmpty());
}

TEST(AgentxRowIndexes, TheFileTextKeepsAnyBytesAndRefusesWhatItDoesNotWrite)
{
    TableIndexes written;
    written.disk.Assign({"sda", "sdb"});
    written.interface.Assign({"2:eth 0%", std::string("\n\xff\x1f", 3)});
    written.lun.Assign({"u"});
    written.lun.Assign({});
    const std::string text = IndexText(written);
    EXPECT_EQ(text, "korvsnmp row indexes 1\ndisk next 3\ndisk 1 sda%1F0\ndisk 2 sdb%1F0\n"
                    "interface next 3\ninterface 2 %0A%FF%1F%1F0\ninterface 1 2:eth%200%25%1F0\n"
                    "volume next 1\nlun next 2\nlun 1 u%1F0\n");
    TableIndexes read;
    std::string whyNot;
    ASSERT_TRUE(ParseIndexText(text, read, whyNot)) << whyNot;
    EXPECT_EQ(IndexText(read), text);
    EXPECT_EQ(read.interface.Assign({std::string("\n\xff\x1f", 3), "2:eth 0%", "2:eth1"}),
              (std::vector<uint32_t>{2, 1, 3}));
    const std::pair<std::string, std::string> bad[] = {  // text after the header, why not
        {"disk next 3\ndisk 0 a%1F0\n", "line 3 is not a row"}, {"disk next 3\ndisk 01 a\n", "line 3 is not a row"},
        {"disk next 3\ndisk 4294967296 a\n", "line 3 is not a row"}, {"disk next 3\ndisk 1 a%G0\n", "line 3 is not a row"},
        {"disk next 3\ndisk 1 a%4\n", "line 3 is not a row"}, {"disk next 3\ndisk 1 a b\n", "line 3 is not a row"},
        {"disk next 3\ndisk  1 a\n", "line 3 is not a row"}, {"tape next 3\n", "line 2 is not a row"},
        {"disk next 3\ndisk next 4\n", "line 3 is not a row"}, {"disk next 0\n", "line 2 is not a row"},
        {"disk next 3\ndisk 1 a\ndisk 2 a\n", "the disk rows repeat a key or an index, or lack a next"},
        {"disk next 3\ndisk 1 a\ndisk 1 b\n", "the disk rows repeat a key or an index, or lack a next"},
        {"disk 1 a\n", "the disk rows repeat a key or an index, or lack a next"}};
    for (const auto &[rows, why] : bad) {
        EXPECT_FALSE(ParseIndexText("korvsnmp row indexes 1\n" + rows, read, whyNot)) << rows;
        EXPECT_EQ(whyNot, why) << rows;
        EXPECT_THAT(read.disk.Rows(), IsEmpty());
    }
    EXPECT_FALSE(ParseIndexText("korvsnmp row indexes 2\n", read, whyNot));
    EXPECT_EQ(whyNot, "no header");
}

class AgentxIndexFile : public ::testing::Test {
protected:
    void SetUp() override
    {
        char pattern[] = "/tmp/korvsnmp-indexes.XXXXXX";
        ASSERT_NE(mkdtemp(pattern), nullptr);
        directory_ = pattern;
        korvtest::ClearLog();
    }
    void TearDown() override { std::filesystem::remove_all(directory_); }

    std::string directory_;
};

TEST_F(AgentxIndexFile, SavedIndexesComeBackAndACorruptFileIsLoggedOnceAndReplaced)
{
    const std::string path = directory_ + "/state/" + kIndexFileName;  // the directory made on the first save
    TableIndexes indexes;
    EXPECT_FALSE(IndexFile(path).Load(indexes));  // none yet: silent
    IndexFile file(path);
    indexes.volume.Assign({"dm-0", "dm-1"});
    ASSERT_TRUE(file.Save(indexes));
    const auto written = std::filesystem::last_write_time(path);
    indexes.volume.Assign({"dm-1", "dm-0"});
    ASSERT_TRUE(file.Save(indexes));  // nothing changed: not written
    EXPECT_EQ(std::filesystem::last_write_time(path), written);
    EXPECT_FALSE(std::filesystem::exists(path + ".new"));

    TableIndexes restarted;
    ASSERT_TRUE(IndexFile(path).Load(restarted));
    EXPECT_EQ(restarted.volume.Assign({"dm-2", "dm-1"}), (std::vector<uint32_t>{3, 2}));
    EXPECT_THAT(LoggedMessages(), IsEmpty());

    std::ofstream(path) << "korvsnmp row indexes 1\ndisk next 1\ninterface next 1\nvolume next 3\nvolume 1 x\n"
                           "volume 1 y\nlun next 1\n";
    IndexFile corrupt(path);
    ASSERT_FALSE(corrupt.Load(restarted));
    EXPECT_THAT(restarted.volume.Rows(), IsEmpty());
    EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_WARNING, "row_indexes", "Cannot use the row indexes in " +
        path + " (the volume rows repeat a key or an index, or lack a next); numbering the rows anew")));
    ASSERT_TRUE(corrupt.Save(restarted));  // replaced even without a change
    EXPECT_TRUE(IndexFile(path).Load(restarted));
}

TEST_F(AgentxIndexFile, AFailingWriteIsLoggedOnceUntilOneSucceeds)
{
    const std::string blocked = directory_ + "/blocked";
    std::ofstream(blocked) << "a file where the directory should be";
    IndexFile file(blocked + "/" + kIndexFileName);
    TableIndexes indexes;
    indexes.disk.Assign({"sda"});
    EXPECT_FALSE(file.Save(indexes));
    EXPECT_FALSE(file.Save(indexes));  // still to be written, and still failing
    std::filesystem::remove(blocked);
    EXPECT_TRUE(file.Save(indexes));
    EXPECT_THAT(LoggedMessages(), ElementsAre(
        Logged(LOG_ERR, "row_indexes", "Cannot write the row indexes to " + blocked + "/row-indexes: Not a directory"),
        Logged(LOG_NOTICE, "row_indexes", "The row indexes are written to " + blocked + "/row-indexes again")));
    TableIndexes read;
    ASSERT_TRUE(IndexFile(blocked + "/" + kIndexFileName).Load(read));
    EXPECT_EQ(read.disk.Assign({"sda"}), std::vector<uint32_t>{1});
}

TEST(AgentxOptions, CommandLines)
{
    const std::pair<std::vector<std::string>, std::string> cases[] = {  // arguments, error
        {{"--interval", "86400", "--agentx-socket", "/run/x", "--ping-interval", "1"}, ""},
        {{"--state-dir", "/var/lib/x", "--persistent-dir", "/var/lib/y"}, ""},
        {{"--interval", "0"}, "--interval wants whole seconds from 1 to 86400, not \"0\""},
        {{"--ping-interval", "1.5"}, "--ping-interval wants whole seconds from 1 to 86400, not \"1.5\""},
        {{"--interval", "99999999999999999999"},
         "--interval wants whole seconds from 1 to 86400, not \"99999999999999999999\""},
        {{"--state-dir", ""}, "--state-dir needs a non-empty value"},
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
    Options options;
    std::string error;
    ASSERT_TRUE(ParseOptions({"--persistent-dir", "/var/lib/y"}, options, error));
    EXPECT_EQ(options.stateDir, "/var/lib/y");
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

// The module's snmpd.conf tokens are read by the command line's own rules.
TEST(AgentxOptions, ModuleTokens)
{
    uint32_t seconds = 7;
    std::string error;
    EXPECT_FALSE(ParseSeconds(kIntervalToken, "0", seconds, error));
    EXPECT_EQ(error, "korvsnmpInterval wants whole seconds from 1 to 86400, not \"0\"");
    EXPECT_EQ(seconds, 7u);
    EXPECT_TRUE(ParseSeconds(kIntervalToken, "86400", seconds, error));
    EXPECT_EQ(seconds, 86400u);

    std::string directory = "/kept";
    EXPECT_FALSE(ParsePath(kStateDirToken, "", directory, error));
    EXPECT_EQ(error, "korvsnmpStateDir needs a non-empty value");
    EXPECT_EQ(directory, "/kept");
    EXPECT_TRUE(ParsePath(kStateDirToken, "/var/lib/snmp/korvsnmp", directory, error));
    EXPECT_EQ(directory, "/var/lib/snmp/korvsnmp");
}

}  // namespace
