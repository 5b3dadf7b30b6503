// Disk records: naming from the host's disks, expansion units and external
// devices, the records kept and their total, and release on every path.
#include <syslog.h>

#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "korv_standin.h"
#include "platform_test.h"
#include "korvsnmp/fill_in_current_disk_io.h"
#include "allocation_failure.h"
#include "syslog_capture.h"

namespace {

using korvstandin::Fault;
using korvstandin::Host;
using korvstandin::Op;
using korvtest::Logged;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr char kUnit[] = "fill_in_current_disk_io";

// The names that the disk section gives `devices`, each as
// "device=display_name/type".
std::vector<std::string> Names(const std::vector<std::string> &devices)
{
    Json::Value diskIO(Json::arrayValue);
    for (const std::string &device : devices)
        diskIO.append(Json::Value(Json::objectValue))["device"] = device;
    Json::Value out;
    EXPECT_TRUE(KORVSNMP::FillInCurrentDiskIO(diskIO, out));
    std::vector<std::string> names;
    for (const Json::Value &disk : out["disk"])
        names.push_back(disk["device"].asString() + "=" + disk["display_name"].asString() + "/" +
                        disk["type"].asString());
    return names;
}

void AddUnit(unsigned int number, std::vector<std::string> paths, std::optional<std::string> model,
             bool powered = true)
{
    Host().supportsEBox = true;
    Host().expansionUnits.push_back({number, std::move(paths), std::move(model), powered});
}

class DiskFixture : public korvtest::PlatformTest {
protected:

};

using DiskInternalNames = DiskFixture;
using DiskExternalNames = DiskFixture;
using DiskIORecords = DiskFixture;

struct UnitCase {
    std::optional<std::string> model;
    bool powered;
    const char *name;
};

class DiskUnitNames : public korvtest::PlatformTestWithParam<UnitCase> {};

TEST_P(DiskUnitNames, ExpansionUnitDiskNamesItsPoweredUnit)
{
    Host().disks = {{3, DISK_CONTAINER_EBOX, 0, "/dev/sdc"}};
    AddUnit(2, {"/dev/sdc"}, GetParam().model, GetParam().powered);
    EXPECT_THAT(Names({"sdc"}), ElementsAre(GetParam().name));
}

INSTANTIATE_TEST_SUITE_P(
    Units, DiskUnitNames,
    ::testing::Values(UnitCase{"Korvel-X5", true, "sdc=Disk 3 (X5-2)/ebox"},
                      UnitCase{"X5", true, "sdc=Disk 3 (X5-2)/ebox"},
                      UnitCase{"Korvel-X5", false, "sdc=Disk 3 (Expansion Unit)/ebox"},
                      UnitCase{std::nullopt, true, "sdc=Disk 3 (Expansion Unit)/ebox"},
                      // Cut to 31 characters before the prefix is dropped.
                      UnitCase{"Korvel-ABCDEFGHIJKLMNOPQRSTUVWXYZ", true,
                               "sdc=Disk 3 (ABCDEFGHIJKLMNOPQRSTUVWX)/ebox"}));

TEST_F(DiskInternalNames, FirstPoweredUnitListingTheDiskWins)
{
    Host().disks = {{3, DISK_CONTAINER_EBOX, 0, "/dev/sdc"}};
    AddUnit(1, {"/dev/sdc"}, "Korvel-Off", false);
    AddUnit(2, {"sdc", "/dev/sdc"}, "First");
    AddUnit(3, {"/dev/sdc"}, "Second");
    EXPECT_THAT(Names({"sdc"}), ElementsAre("sdc=Disk 3 (First-2)/ebox"));
}

TEST_F(DiskInternalNames, InternalAndSsdCacheNamesAndDeviceKeys)
{
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"},
                    {2, DISK_CONTAINER_INTERNAL, 0, "md2"},
                    {12, DISK_CONTAINER_SSD_CACHE, 1, "/dev/s1"},
                    {12, DISK_CONTAINER_SSD_CACHE, 0, "/dev/s2"},
                    {12, DISK_CONTAINER_SSD_CACHE, -1, "/dev/s3"},
                    {100, DISK_CONTAINER_SSD_CACHE, 100, "/dev/s4"},
                    {100, DISK_CONTAINER_SSD_CACHE, 1000, "/dev/s5"},
                    {7, DISK_CONTAINER_INTERNAL, 0, "/dev/gone", true}};
    EXPECT_THAT(Names({"sda", "/dev/sda", "md2", "s1", "s2", "s3", "s4", "s5", "gone"}),
                ElementsAre("sda=Disk 1/internal", "md2=Disk 2/internal",
                            "s1=SSD Cache 1-12/internal", "s2=SSD Cache 12/internal",
                            "s3=SSD Cache 2/internal", "s4=SSD Cache 100-100/internal",
                            "s5=SSD Cache 1000-10/internal"));
    EXPECT_THAT(korvtest::LoggedMessages(), IsEmpty());
}

TEST_F(DiskInternalNames, BadContainersAndTextsReadAnewForEveryDisk)
{
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"},
                    {1, 3, 0, "/dev/sda"},
                    {4, 4, 0, "/dev/sdd"}};
    EXPECT_THAT(Names({"sda", "sdd"}), IsEmpty());
    EXPECT_THAT(korvtest::LoggedMessages(),
                ElementsAre(Logged(LOG_ERR, kUnit, "bad container: 3")));

    EXPECT_EQ(korvstandin::CallCount(Op::KLIBCSzHashAlloc), 2);
    EXPECT_EQ(korvstandin::CallCount(Op::KLIBCFileGetSectionValue), 6);
    EXPECT_EQ(korvstandin::CallCount(Op::KLIBCSzHashFree), 2);
}

TEST_F(DiskInternalNames, MissingTextsReadAsEmpty)
{
    Host().files.clear();
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"},
                    {3, DISK_CONTAINER_EBOX, 0, "/dev/sdc"}};
    EXPECT_THAT(Names({"sda", "sdc"}), ElementsAre("sda= 1/internal", "sdc= 3 ()/ebox"));
    const auto missing = [](const char *key) {
        return Logged(LOG_ERR, kUnit, std::string("Fail to get text [volume:") + key + "]");
    };
    EXPECT_THAT(korvtest::LoggedMessages(),
                ElementsAre(missing("volume_disk"), missing("volume_expansion"),
                            missing("dedicated_ssd_cache"), missing("volume_disk"),
                            missing("volume_expansion"), missing("dedicated_ssd_cache")));

}

TEST_F(DiskInternalNames, UnitsWithoutWrapperAreNotSearched)
{
    Host().disks = {{3, DISK_CONTAINER_EBOX, 0, "/dev/sdc"}};
    AddUnit(1, {}, "X5");
    AddUnit(2, {"/dev/sdc"}, "X5");
    AddUnit(3, {"/dev/sdc"}, "X5");
    korvtest::NothrowAllocationFailure secondWrapper(2);
    EXPECT_THAT(Names({"sdc"}), ElementsAre("sdc=Disk 3 (Expansion Unit)/ebox"));
    EXPECT_THAT(korvtest::LoggedMessages(),
                ElementsAre(Logged(LOG_ERR, kUnit, "Failed to allocate ebox wrapper")));
    EXPECT_EQ(korvstandin::CallCount(Op::KORVEBoxIsPoweron), 1);
}

TEST_F(DiskExternalNames, LaterSourceWinsAndFailedQueriesKeepEarlierNames)
{
    korvstandin::SetJournal(true);
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"},
                    {2, DISK_CONTAINER_INTERNAL, 0, "/dev/sdb"},
                    {3, DISK_CONTAINER_INTERNAL, 0, "/dev/sdc"}};
    Host().usb.devices = {{"sda", "USB A"}, {"sdb", "USB B"}, {"sdc", "USB C", true},
                          {"sdu", ""}};
    Host().esata.devices = {{"sdb", "eSATA B"}};
    EXPECT_THAT(Names({"sdc", "sdb", "sda", "sdu"}),
                ElementsAre("sdc=Disk 3/internal", "sdb=eSATA B/eSATA", "sda=USB A/usb"));
    std::vector<std::string> external;
    for (const std::string &call : korvstandin::Journal())
        if (call.rfind("KORV", 0) == 0)
            external.push_back(call);
    EXPECT_THAT(external, ElementsAre("KORVUSBDevEnum(2, (null), 0)",
                                      "KORVUSBDevEnum(2, buffer, 48)",
                                      "KORVExtStgPartsVolInfoGet(sda, 1)",
                                      "KORVExtStgPartsVolInfoGet(sdb, 1)",
                                      "KORVExtStgPartsVolInfoGet(sdc, 1)",
                                      "KORVExtStgPartsVolInfoGet(sdu, 1)",
                                      "KORVUSBDevEnum(16, (null), 0)",
                                      "KORVUSBDevEnum(16, buffer, 12)",
                                      "KORVExtStgPartsVolInfoGet(sdb, 0)"));
    EXPECT_THAT(korvtest::LoggedMessages(), IsEmpty());
}

TEST_F(DiskExternalNames, QuillboxNamesOnlyExternalDevices)
{
    Host().quillbox = true;
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"}};
    Host().esata.devices = {{"sde", "eSATA Disk"}};
    EXPECT_THAT(Names({"sda", "sde"}), ElementsAre("sde=eSATA Disk/eSATA"));
    EXPECT_EQ(korvstandin::CallCount(Op::DiskInfoEnum), 0);
}

struct ExternalFailure {
    const char *name;
    void (*arrange)(korvstandin::HostDescription &host);  // null: the block cannot be allocated
    const char *message;
    int deviceListCalls;  // KORVUSBDevEnum calls before the pass ends
};

class DiskExternalFailure : public korvtest::PlatformTestWithParam<ExternalFailure> {};

TEST_P(DiskExternalFailure, EndsTheCallAndReleasesTheBlock)
{
    Host().quillbox = true;
    Host().usb.devices = {{"sdu", "USB"}};
    if (GetParam().arrange != nullptr)
        GetParam().arrange(Host());
    korvtest::NothrowAllocationFailure usbBlock(GetParam().arrange == nullptr ? 1 : 0);
    Json::Value diskIO(Json::arrayValue), out;
    diskIO.append(Json::Value(Json::objectValue))["device"] = "sdu";
    EXPECT_FALSE(KORVSNMP::FillInCurrentDiskIO(diskIO, out));
    EXPECT_TRUE(out.isNull());
    EXPECT_THAT(korvtest::LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, GetParam().message)));
    EXPECT_EQ(korvstandin::CallCount(Op::KORVUSBDevEnum), GetParam().deviceListCalls);
}

INSTANTIATE_TEST_SUITE_P(
    Failures, DiskExternalFailure,
    ::testing::Values(
        ExternalFailure{"UsbSize", [](korvstandin::HostDescription &host) { host.usb.sizeQueryFails = true; },
                        "Failed to KORVExternalDevEnum EXTERNAL_USB_DEVICE", 1},
        ExternalFailure{"EsataSize",
                        [](korvstandin::HostDescription &host) { host.esata.sizeQueryFails = true; },
                        "Failed to KORVExternalDevEnum EXTERNAL_USB_DEVICE", 3},
        ExternalFailure{"UsbFill", [](korvstandin::HostDescription &host) { host.usb.fillFails = true; },
                        "KORVExternalDevEnum: Error KORVUSBDevEnum", 2},
        ExternalFailure{"EsataFill", [](korvstandin::HostDescription &host) { host.esata.fillFails = true; },
                        "KORVExternalDevEnum: Error KORVUSBDevEnum", 4},
        ExternalFailure{"NegativeSize", [](korvstandin::HostDescription &host) { host.usb.neededClaim = -1; },
                        "Failed to KORVExternalDevEnum EXTERNAL_USB_DEVICE", 1},
        ExternalFailure{"BlockNotAllocated", nullptr, "KORVExternalDevEnum error: Out of Memory", 1}),
    [](const auto &info) { return std::string(info.param.name); });

TEST_F(DiskIORecords, RecordsAndTotal)
{
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"},
                    {2, DISK_CONTAINER_INTERNAL, 0, "/dev/sdb"}};
    Json::Value diskIO(Json::arrayValue);
    diskIO.append(Json::Value());  // unknown, as is a record without "device"
    diskIO.append(Json::Value(Json::objectValue))["utilization"] = 50;
    Json::Value &second = diskIO.append(Json::Value(Json::objectValue));
    second["device"] = "sdb";
    second["utilization"] = 3;
    second["read_access"] = 1;
    second["read_byte"] = 4000000000u;
    second["write_access"] = 2;
    second["write_byte"] = 5;
    second["display_name"] = "old";
    second["queue"] = "kept";
    Json::Value first = second;
    first["device"] = "sda";
    first["utilization"] = 4;
    first.removeMember("read_byte");
    diskIO.append(first);
    diskIO.append(Json::Value(Json::objectValue))["device"] = "sdz";
    Json::Value &third = diskIO.append(Json::Value(Json::objectValue));
    third["device"] = "sdb";
    third["read_byte"] = 4000000000u;

    Json::Value out(Json::objectValue);
    out["other"] = true;
    ASSERT_TRUE(KORVSNMP::FillInCurrentDiskIO(diskIO, out));
    EXPECT_EQ(out["other"], true);
    ASSERT_EQ(out["disk"].size(), 3u);
    Json::Value expectedSecond = second;
    expectedSecond["display_name"] = "Disk 2";
    expectedSecond["type"] = "internal";
    EXPECT_EQ(out["disk"][0], expectedSecond);
    EXPECT_EQ(out["disk"][1]["display_name"], "Disk 1");
    EXPECT_TRUE(out["disk"][1].isMember("read_byte"));
    EXPECT_TRUE(out["disk"][1]["read_byte"].isNull());
    EXPECT_TRUE(out["disk"][2]["write_byte"].isNull());

    Json::Value total(Json::objectValue);
    total["device"] = "total";
    total["utilization"] = Json::UInt64(7 / 3);
    total["read_access"] = Json::UInt64(2);
    total["read_byte"] = Json::UInt64(4000000000u) * 2;
    total["write_access"] = Json::UInt64(4);
    total["write_byte"] = Json::UInt64(10);
    EXPECT_EQ(out["total"], total);
    EXPECT_EQ(out["total"]["read_byte"].asUInt64(), 8000000000u);
}

TEST_F(DiskIORecords, UtilizationMeanRoundsDownAndEmptyInputGivesZeros)
{
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"},
                    {2, DISK_CONTAINER_INTERNAL, 0, "/dev/sdb"}};
    Json::Value diskIO(Json::arrayValue), out;
    ASSERT_TRUE(KORVSNMP::FillInCurrentDiskIO(diskIO, out));
    EXPECT_EQ(out["disk"], Json::Value(Json::arrayValue));
    for (const char *counter :
         {"utilization", "read_access", "read_byte", "write_access", "write_byte"})
        EXPECT_EQ(out["total"][counter], Json::Value(Json::UInt64(0))) << counter;

    for (unsigned int utilization : {3u, 4u}) {
        Json::Value &record = diskIO.append(Json::Value(Json::objectValue));
        record["device"] = utilization == 3 ? "sda" : "sdb";
        record["utilization"] = utilization;
    }
    ASSERT_TRUE(KORVSNMP::FillInCurrentDiskIO(diskIO, out));
    EXPECT_EQ(out["total"]["utilization"].asUInt64(), 3u);
}

TEST_F(DiskIORecords, BadInputFailsWithOutputUntouched)
{
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"}};
    // A named record, then one with `member` set to `value`.
    const auto records = [](const char *member, Json::Value value) {
        Json::Value diskIO(Json::arrayValue);
        diskIO.append(Json::Value(Json::objectValue))["device"] = "sda";
        Json::Value &element = diskIO.append(Json::Value(Json::objectValue));
        element["device"] = "sda";
        element[member] = value;
        return diskIO;
    };
    Json::Value scalarElement(Json::arrayValue);
    scalarElement.append(Json::Value());
    scalarElement.append(1);
    struct Case {
        Json::Value diskIO;
        const char *message;  // null: nothing logged
    } cases[] = {
        {Json::Value(Json::objectValue), nullptr},
        {"sda", nullptr},
        {Json::Value(), nullptr},
        {scalarElement, "DiskIO element 1 is not an object"},
        {records("device", 7), "DiskIO element 1: \"device\" is not a string"},
        {records("write_byte", -1),
         "DiskIO device [sda]: \"write_byte\" is not an unsigned 32-bit number"},
        {records("read_access", Json::UInt64(1) << 32),
         "DiskIO device [sda]: \"read_access\" is not an unsigned 32-bit number"},
        {records("utilization", "5"),
         "DiskIO device [sda]: \"utilization\" is not an unsigned 32-bit number"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.diskIO.toStyledString());
        korvtest::ClearLog();
        Json::Value out(Json::objectValue);
        out["keep"] = 1;
        EXPECT_FALSE(KORVSNMP::FillInCurrentDiskIO(c.diskIO, out));
        EXPECT_EQ(out.getMemberNames(), std::vector<std::string>{"keep"});
        if (c.message == nullptr)
            EXPECT_THAT(korvtest::LoggedMessages(), IsEmpty());
        else
            EXPECT_THAT(korvtest::LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, c.message)));
    }
}

}  // namespace
