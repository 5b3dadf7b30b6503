// Host description files: a good file answers as the same description in
// memory; a bad one makes every operation fail, with one message that names
// the file and the member, and never a crash.
#include <syslog.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <iterator>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "appliance.h"
#include "block_nodes.h"
#include "host_file.h"
#include "json_text.h"
#include "korvsnmp/parse_data.h"
#include "platform_test.h"
#include "syslog_capture.h"

namespace {


// A host file in a temporary directory, named to the stand-in through the
// environment for the test's lifetime.
struct HostFileTest : korvtest::PlatformTest {
    ~HostFileTest() override { unsetenv(korvstandin::kHostFileVariable); std::remove(path_.c_str()); korvstandin::Reset(); }

    // Writes `text` as the host file and lets the next platform call read it.
    void UseHostFile(const std::string &text)
    {
        std::ofstream(path_, std::ios::binary | std::ios::trunc) << text;
        setenv(korvstandin::kHostFileVariable, path_.c_str(), 1); korvstandin::UseProcessHost();
        korvtest::ClearLog();
    }

    const std::string path_ = "/tmp/korvsnmp-host-" + std::to_string(getpid()) + ".json";
};

std::string FileText(const char *p) { std::ifstream in(p); return {std::istreambuf_iterator<char>(in), {}}; }

TEST_F(HostFileTest, GoodFileAnswersAsTheDescriptionInMemory)
{
    const korvexample::ApplianceShape shape = korvexample::SmallAppliance();
    const size_t count = static_cast<size_t>(korvexample::SpaceDeviceCount(shape));
    korvtest::BlockNodes nodes;
    if (std::string whyNot; !nodes.Make(count, whyNot)) GTEST_SKIP() << whyNot;
    std::vector<korvexample::SpaceDevice> devices;
    for (size_t i = 0; i < count; ++i) devices.push_back({nodes.Node(i), nodes.Name(i)});
    const korvexample::Appliance appliance = korvexample::MakeAppliance(shape, devices);
    const Json::Value request(Json::objectValue); korvstandin::Host() = appliance.host;
    Json::Value inMemory, fromFile;
    ASSERT_TRUE(SNMPParseReplyData(request, appliance.reply, inMemory));

    const std::string text = korvstandin::HostFileText(appliance.host);
    korvstandin::HostDescription read; std::string error;
    ASSERT_TRUE(korvstandin::ParseHostDescription(text, read, error)) << error;
    EXPECT_EQ(korvstandin::HostFileText(read), text);  // written and read back the same

    UseHostFile(text); ASSERT_TRUE(SNMPParseReplyData(request, appliance.reply, fromFile));

    EXPECT_EQ(korvtest::JsonText(fromFile), korvtest::JsonText(inMemory));
    EXPECT_FALSE(fromFile["space"]["volume"].empty());  // the nodes resolved: spaces are named
    EXPECT_THAT(korvtest::LoggedMessages(), ::testing::IsEmpty());
}

TEST_F(HostFileTest, LargeApplianceExampleFilesMatch)
{
    const Json::Value reply = korvtest::ParseJson(FileText(KORVSNMP_EXAMPLES_DIR "/large-appliance.reply.json"));
    UseHostFile(FileText(KORVSNMP_EXAMPLES_DIR "/large-appliance.host.json"));

    Json::Value result;
    ASSERT_TRUE(SNMPParseReplyData(Json::Value(Json::objectValue), reply, result));
    EXPECT_EQ(result["disk"]["disk"].size(), 72u);
    EXPECT_EQ(result["network"].size(), 1u + 30u + 2u + 1u);  // total, listed, aggregations, PPPoE
    EXPECT_EQ(result["lun"][511]["lun_name"].asString(), "LUN-512");
    EXPECT_THAT(korvtest::LoggedMessages(), ::testing::IsEmpty());
}

// `error`: what the message says after the file's path; `absent`: the file is gone before it is read.
struct BadFile { const char *name; std::string text; const char *error; bool absent = false; };

// `count` copies of `element`, separated by commas.
std::string Repeated(const std::string &element, int count)
{
    std::string list = element;
    for (int i = 1; i < count; ++i) list += "," + element;
    return list;
}

const BadFile kBadFiles[] = {
    {"Absent", "", "cannot be opened", true},
    {"NotJson", "{\"disks\": [", "not JSON: * Line 1, Column 12"},
    {"TrailingGarbage", "{} {}", "not JSON: * Line 1, Column 4"},
    {"NotAnObject", "[]", "top level: not an object"},
    {"UnknownMember", R"({"interface": []})", "interface: unknown member"},
    {"ListIsAnObject", R"({"interfaces": {}})", "interfaces: not an array"},
    {"NumberAsText", R"({"disks": [{"number": "1", "container": "internal", "device_path": "/dev/sda"}]})",
     "disks[0].number: not an integer from -2147483648 to 2147483647"},
    {"NegativeMemory", R"({"memory_size": -1})", "memory_size: not an unsigned 32-bit integer"},
    {"MissingMember", R"({"spaces": [{"name": "volume1"}]})", "spaces[0]: member \"device_path\" missing"},
    {"UnknownRole", R"({"interfaces": [{"name": "br0", "role": "bridge"}]})",
     "interfaces[0].role: unknown role \"bridge\" (plain, vlan, aggregation or ovs_master)"},
    {"PathLongerThanItsField",
     R"({"disks": [{"number": 1, "container": "internal", "device_path": "/dev/)" + std::string(59, 'x') + "\"}]}",
     "disks[0].device_path: longer than 63 characters"},
    {"NameLongerThanItsField", R"({"interfaces": [{"name": "eth0123456789abc"}]})",
     "interfaces[0].name: longer than 15 characters"},
    {"TooManyMembers", R"({"interfaces": [{"name": "bond0", "role": "aggregation", "members": [)" +
                           Repeated(R"("eth0")", 33) + "]}]}",
     "interfaces[0].members: 33 elements, more than 32"},
    {"TenThousandInterfaces", R"({"interfaces": [)" + Repeated(R"({"name": "eth0"})", 10000) + "]}",
     "interfaces: 10000 elements, more than 256"},
    {"DeeplyNested", std::string(100000, '[') + std::string(100000, ']'), "not JSON: "}};

TEST_F(HostFileTest, BadFileFailsEveryOperationWithOneMessage)
{
    for (const BadFile &bad : kBadFiles) {
        SCOPED_TRACE(bad.name);
        UseHostFile(bad.text);
        if (bad.absent) std::remove(path_.c_str());

        KLIBNetInterfaceInfo records[4] = {};
        EXPECT_EQ(KLIBNetGetInterfaceInfo(records, 4, 6), -1);
        DiskFilter filter{DISK_CONTAINER_INTERNAL};
        DiskInfoList *disks = nullptr;
        EXPECT_EQ(DiskInfoEnum(&filter, &disks), -1);
        EXPECT_EQ(KLIBSystemPhysMemSizeGet(), 0u);
        char text[64] = {};
        EXPECT_EQ(KLIBCFileGetSectionValue(korvstandin::kStringsFilePath, "volume", "volume_disk", text, 64), -1);
        Json::Value response;
        EXPECT_LT(KORV::APIRunner::Exec(response, "KORV.Core.ISCSI.LUN", 1, "list", Json::Value(), "admin"), 0);
        EXPECT_FALSE(response["success"].asBool());
        EXPECT_EQ(KORVPPPoeIntfGet(nullptr, 0), -1);
        EXPECT_EQ(SupportEBox(), 0);

        const std::vector<korvtest::LogEntry> logged = korvtest::LoggedMessages();
        ASSERT_EQ(logged.size(), 1u);
        EXPECT_EQ(logged[0].priority, LOG_ERR);
        EXPECT_THAT(logged[0].text,
                    ::testing::AllOf(::testing::StartsWith("korvplatform:"),
                                     ::testing::HasSubstr("Host description " + path_ + ": " + bad.error),
                                     ::testing::EndsWith("; every platform operation fails")));
    }
}

}  // namespace
