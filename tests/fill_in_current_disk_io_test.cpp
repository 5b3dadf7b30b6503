// Disk records: naming from the host's disks, expansion units and external
// devices, the records kept and their total, and bad input. Failing platform
// calls and allocations are covered by the fault sweep.
#include <syslog.h>

#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "allocation_failure.h"
#include "json_text.h"
#include "korv_standin.h"
#include "korvsnmp/fill_in_current_disk_io.h"
#include "platform_test.h"
#include "syslog_capture.h"

namespace {

using korvstandin::Host, korvstandin::Op;
using korvtest::Canonical, korvtest::JsonText, korvtest::Logged, korvtest::LoggedMessages, korvtest::ParseJson;
using ::testing::ElementsAre, ::testing::IsEmpty;

constexpr char kUnit[] = "fill_in_current_disk_io";

// The names that the disk section gives `devices`, each as
// "device=display_name/type".
std::vector<std::string> Names(const std::vector<std::string> &devices)
{
    Json::Value diskIO(Json::arrayValue), out;
    for (const std::string &d : devices) diskIO.append(Json::Value(Json::objectValue))["device"] = d;
    EXPECT_TRUE(KORVSNMP::FillInCurrentDiskIO(diskIO, out));
    std::vector<std::string> names;
    for (const Json::Value &d : out["disk"])
        names.push_back(d["device"].asString() + "=" + d["display_name"].asString() + "/" +
                        d["type"].asString());
    return names;
}

void AddUnit(unsigned int number, std::vector<std::string> paths, std::optional<std::string> model,
             bool powered = true)
{
    Host().supportsEBox = true;
    Host().expansionUnits.push_back({number, std::move(paths), std::move(model), powered});
}

using DiskIOTest = korvtest::PlatformTest;

TEST_F(DiskIOTest, ExpansionUnitDiskNamesItsFirstPoweredListingUnit)
{
    const struct { std::optional<std::string> model; bool powered; const char *name; } cases[] = {
        {"Korvel-X5", true, "sdc=Disk 3 (X5-2)/ebox"}, {"X5", true, "sdc=Disk 3 (X5-2)/ebox"},
        {"Korvel-X5", false, "sdc=Disk 3 (Expansion Unit)/ebox"},
        {std::nullopt, true, "sdc=Disk 3 (Expansion Unit)/ebox"},
        // Cut to 31 characters before the prefix is dropped.
        {"Korvel-ABCDEFGHIJKLMNOPQRSTUVWXYZ", true, "sdc=Disk 3 (ABCDEFGHIJKLMNOPQRSTUVWX)/ebox"}};
    for (const auto &c : cases) {
        korvtest::FreshPlatform(); SCOPED_TRACE(c.name);
        Host().disks = {{3, DISK_CONTAINER_EBOX, 0, "/dev/sdc"}};
        AddUnit(2, {"/dev/sdc"}, c.model, c.powered);
        EXPECT_THAT(Names({"sdc"}), ElementsAre(c.name));
    }
    korvtest::FreshPlatform();
    Host().disks = {{3, DISK_CONTAINER_EBOX, 0, "/dev/sdc"}};
    AddUnit(1, {"/dev/sdc"}, "Korvel-Off", false);
    AddUnit(2, {"sdc", "/dev/sdc"}, "First");
    AddUnit(3, {"/dev/sdc"}, "Second");
    EXPECT_THAT(Names({"sdc"}), ElementsAre("sdc=Disk 3 (First-2)/ebox"));
}

TEST_F(DiskIOTest, InternalAndSsdCacheNamesAndDeviceKeys)
{
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"},   {2, DISK_CONTAINER_INTERNAL, 0, "md2"},
                    {12, DISK_CONTAINER_SSD_CACHE, 1, "/dev/s1"},  {12, DISK_CONTAINER_SSD_CACHE, 0, "/dev/s2"},
                    {12, DISK_CONTAINER_SSD_CACHE, -1, "/dev/s3"}, {100, DISK_CONTAINER_SSD_CACHE, 100, "/dev/s4"},
                    {100, DISK_CONTAINER_SSD_CACHE, 1000, "/dev/s5"},
                    {7, DISK_CONTAINER_INTERNAL, 0, "/dev/gone", true}};
    EXPECT_THAT(Names({"sda", "/dev/sda", "md2", "s1", "s2", "s3", "s4", "s5", "gone"}),
                ElementsAre("sda=Disk 1/internal", "md2=Disk 2/internal", "s1=SSD Cache 1-12/internal",
                            "s2=SSD Cache 12/internal", "s3=SSD Cache 2/internal",
                            "s4=SSD Cache 100-100/internal", "s5=SSD Cache 1000-10/internal"));
    EXPECT_THAT(LoggedMessages(), IsEmpty());
}

TEST_F(DiskIOTest, BadContainersAndTextsReadAnewForEveryDisk)
{
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"}, {1, 3, 0, "/dev/sda"}, {4, 4, 0, "/dev/sdd"}};
    EXPECT_THAT(Names({"sda", "sdd"}), IsEmpty());
    EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, "bad container: 3")));
    EXPECT_EQ(korvstandin::CallCount(Op::KLIBCSzHashAlloc), 2);
    EXPECT_EQ(korvstandin::CallCount(Op::KLIBCFileGetSectionValue), 6);
    EXPECT_EQ(korvstandin::CallCount(Op::KLIBCSzHashFree), 2);
}

TEST_F(DiskIOTest, MissingTextsReadAsEmpty)
{
    Host().files.clear();
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"}, {3, DISK_CONTAINER_EBOX, 0, "/dev/sdc"}};
    EXPECT_THAT(Names({"sda", "sdc"}), ElementsAre("sda= 1/internal", "sdc= 3 ()/ebox"));
    const auto m = [](std::string key) {
        return Logged(LOG_ERR, kUnit, "Fail to get text [volume:" + key + "]"); };
    EXPECT_THAT(LoggedMessages(), ElementsAre(m("volume_disk"), m("volume_expansion"), m("dedicated_ssd_cache"),
                                              m("volume_disk"), m("volume_expansion"), m("dedicated_ssd_cache")));
}

TEST_F(DiskIOTest, UnitsWithoutWrapperAreNotSearched)
{
    Host().disks = {{3, DISK_CONTAINER_EBOX, 0, "/dev/sdc"}};
    AddUnit(1, {}, "X5");
    AddUnit(2, {"/dev/sdc"}, "X5");
    AddUnit(3, {"/dev/sdc"}, "X5");
    korvtest::NothrowAllocationFailure secondWrapper(2);
    EXPECT_THAT(Names({"sdc"}), ElementsAre("sdc=Disk 3 (Expansion Unit)/ebox"));
    EXPECT_EQ(korvstandin::CallCount(Op::KORVEBoxIsPoweron), 1);
}

TEST_F(DiskIOTest, LaterSourceWinsAndFailedQueriesKeepEarlierNames)
{
    korvstandin::SetJournal(true);
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"}, {2, DISK_CONTAINER_INTERNAL, 0, "/dev/sdb"},
                    {3, DISK_CONTAINER_INTERNAL, 0, "/dev/sdc"}};
    Host().usb.devices = {{"sda", "USB A"}, {"sdb", "USB B"}, {"sdc", "USB C", true}, {"sdu", ""}};
    Host().esata.devices = {{"sdb", "eSATA B"}};
    EXPECT_THAT(Names({"sdc", "sdb", "sda", "sdu"}),
                ElementsAre("sdc=Disk 3/internal", "sdb=eSATA B/eSATA", "sda=USB A/usb"));
    std::vector<std::string> external;
    for (const std::string &call : korvstandin::Journal())
        if (call.rfind("KORV", 0) == 0) external.push_back(call);
    EXPECT_THAT(external, ElementsAre("KORVUSBDevEnum(2, (null), 0)", "KORVUSBDevEnum(2, buffer, 48)",
                                      "KORVExtStgPartsVolInfoGet(sda, 1)", "KORVExtStgPartsVolInfoGet(sdb, 1)",
                                      "KORVExtStgPartsVolInfoGet(sdc, 1)", "KORVExtStgPartsVolInfoGet(sdu, 1)",
                                      "KORVUSBDevEnum(16, (null), 0)", "KORVUSBDevEnum(16, buffer, 12)",
                                      "KORVExtStgPartsVolInfoGet(sdb, 0)"));
    EXPECT_THAT(LoggedMessages(), IsEmpty());
}

TEST_F(DiskIOTest, QuillboxNamesOnlyExternalDevicesAndAFailedListEndsTheCall)
{
    Host().quillbox = true;
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"}};
    Host().esata.devices = {{"sde", "eSATA Disk"}};
    EXPECT_THAT(Names({"sda", "sde"}), ElementsAre("sde=eSATA Disk/eSATA"));
    EXPECT_EQ(korvstandin::CallCount(Op::DiskInfoEnum), 0);

    // A negative size from the platform is a failed list: nothing more is asked.
    korvtest::ClearLog();
    Host().usb.neededClaim = -1;
    const int listCalls = korvstandin::CallCount(Op::KORVUSBDevEnum);
    Json::Value out;
    EXPECT_FALSE(KORVSNMP::FillInCurrentDiskIO(ParseJson(R"([{"device": "sde"}])"), out));
    EXPECT_TRUE(out.isNull());
    const char *const failedList = "Failed to KORVExternalDevEnum EXTERNAL_USB_DEVICE";
    EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, failedList)));
    EXPECT_EQ(korvstandin::CallCount(Op::KORVUSBDevEnum), listCalls + 1);
}

TEST_F(DiskIOTest, RecordsKeptInOrderWithTheirTotal)
{
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"}, {2, DISK_CONTAINER_INTERNAL, 0, "/dev/sdb"}};
    Json::Value out = ParseJson(R"({"other": true})");
    ASSERT_TRUE(KORVSNMP::FillInCurrentDiskIO(ParseJson(R"([null, {"utilization": 50},
        {"device": "sdb", "utilization": 3, "read_access": 1, "read_byte": 4000000000, "write_access": 2,
         "write_byte": 5, "display_name": "old", "queue": "kept"},
        {"device": "sda", "utilization": 4, "read_access": 1, "write_access": 2, "write_byte": 5},
        {"device": "sdz"}, {"device": "sdb", "read_byte": 4000000000}])"), out));
    EXPECT_EQ(JsonText(out), Canonical(R"({"other": true, "disk": [{"device": "sdb", "utilization": 3,
        "read_access": 1, "read_byte": 4000000000, "write_access": 2, "write_byte": 5, "display_name": "Disk 2",
        "queue": "kept", "type": "internal"}, {"device": "sda", "utilization": 4, "read_access": 1,
        "read_byte": null, "write_access": 2, "write_byte": 5, "display_name": "Disk 1", "type": "internal"},
        {"device": "sdb", "utilization": null, "read_access": null, "read_byte": 4000000000, "write_access": null,
        "write_byte": null, "display_name": "Disk 2", "type": "internal"}], "total": {"device": "total",
        "utilization": 2, "read_access": 2, "read_byte": 8000000000, "write_access": 4, "write_byte": 10}})"));

    // The mean rounds down; no records give a zero total.
    ASSERT_TRUE(KORVSNMP::FillInCurrentDiskIO(
        ParseJson(R"([{"device": "sda", "utilization": 3}, {"device": "sdb", "utilization": 4}])"), out));
    EXPECT_EQ(out["total"]["utilization"].asUInt64(), 3u);
    ASSERT_TRUE(KORVSNMP::FillInCurrentDiskIO(Json::Value(Json::arrayValue), out));
    EXPECT_EQ(JsonText(out["total"]), Canonical(R"({"device": "total", "utilization": 0, "read_access": 0,
        "read_byte": 0, "write_access": 0, "write_byte": 0})"));
    EXPECT_EQ(out["disk"], Json::Value(Json::arrayValue));
}

TEST_F(DiskIOTest, BadInputFailsWithOutputUntouched)
{
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"}};
    const auto number = [](const char *member) {
        return std::string(R"(DiskIO device [sda]: ")") + member + R"(" is not an unsigned 32-bit number)";
    };
    const struct { const char *diskIO; std::string message; } cases[] = {  // an empty message: nothing logged
        {R"({"device": "sda"})", ""}, {R"("sda")", ""}, {"null", ""},
        {"[null, 1]", "DiskIO element 1 is not an object"},
        {R"([{"device": "sda"}, {"device": 7}])", R"(DiskIO element 1: "device" is not a string)"},
        {R"([{"device": "sda"}, {"device": "sda", "write_byte": -1}])", number("write_byte")},
        {R"([{"device": "sda"}, {"device": "sda", "read_access": 4294967296}])", number("read_access")},
        {R"([{"device": "sda"}, {"device": "sda", "utilization": "5"}])", number("utilization")}};
    for (const auto &c : cases) {
        korvtest::ClearLog(); SCOPED_TRACE(c.diskIO);
        Json::Value out = ParseJson(R"({"keep": 1})");
        EXPECT_FALSE(KORVSNMP::FillInCurrentDiskIO(ParseJson(c.diskIO), out));
        EXPECT_EQ(JsonText(out), Canonical(R"({"keep": 1})"));
        if (c.message.empty()) EXPECT_THAT(LoggedMessages(), IsEmpty());
        else EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, c.message)));
    }
}

}  // namespace
