// The moving SNMPParseReplyData against the copying one: for every reply of
// the fuzzing corpus and several requests, the same result, return value and
// messages.
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include <gtest/gtest.h>

#include <json/reader.h>

#include "json_text.h"
#include "korvsnmp/parse_data.h"
#include "platform_test.h"
#include "syslog_capture.h"

namespace {

using namespace korvstandin;
using ReplyOverloadsTest = korvtest::PlatformTest;

struct Outcome {
    std::string text;  // the return value, the result's text, the messages
    Json::Value result;
};

Outcome Assemble(const Json::Value &request, Json::Value reply, bool moving)
{
    korvtest::ClearLog();
    Outcome outcome{"", Json::Value(Json::objectValue)};
    const bool returned = moving ? SNMPParseReplyData(request, std::move(reply), outcome.result)
                                 : SNMPParseReplyData(request, reply, outcome.result);
    outcome.text = std::to_string(returned) + " " + korvtest::JsonText(outcome.result);
    for (const korvtest::LogEntry &message : korvtest::LoggedMessages())
        outcome.text += "\n" + std::to_string(message.priority) + " " + message.text;
    return outcome;
}

TEST_F(ReplyOverloadsTest, MovingAndCopyingAgreeOnTheFuzzingCorpus)
{
    // A host that names some of each section's devices, so that records are
    // kept, renamed and dropped.
    HostDescription &host = Host();
    host.physMemSize = 8388608;
    host.supportsEBox = true;
    host.disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"},
                  {2, DISK_CONTAINER_EBOX, 0, "/dev/sdb"},
                  {12, DISK_CONTAINER_SSD_CACHE, 1, "/dev/nvme0n1"}};
    host.expansionUnits = {{1, {"/dev/sdb"}, std::string("Korvel-X5"), true}};
    host.usb.devices = {{"sdu", "USB Disk 1"}};
    host.esata.devices = {{"sde", "eSATA Disk 1"}};
    host.interfaces = {{"eth0"}, {"eth1"}, {"eth0.5", NetRole::Vlan, "eth0", "eth0.5"},
                       {"bond0", NetRole::Aggregation, "", "", {"eth0", "eth1"}}};
    host.pppoeInterface = "ppp0";
    host.spaces = {{"/dev/null", "volume1"}};
    host.luns = {{Json::Value("uuid-1"), Json::Value("LUN-1")}};
    const char *const kRequests[] = {
        R"({"resource": ["all"]})", R"({})", R"({"resource": ["nfs", "cpu"]})",
        R"({"resource": ["disk", "space", "lun"]})", R"({"resource": "all"})", R"([])"};

    int parsed = 0;
    for (const auto &entry : std::filesystem::directory_iterator(KORVSNMP_FUZZ_CORPUS)) {
        std::ifstream file(entry.path(), std::ios::binary);
        Json::Value reply;
        try {
            if (!Json::Reader().parse(std::string(std::istreambuf_iterator<char>(file), {}), reply, true))
                continue;
        } catch (const Json::Exception &) {
            continue;  // nesting too deep for the reader
        }
        ++parsed;
        for (const char *requestText : kRequests) {
            SCOPED_TRACE(entry.path().filename().string() + " with request " + requestText);
            const Json::Value request = korvtest::ParseJson(requestText);
            const Outcome copied = Assemble(request, reply, false), moved = Assemble(request, reply, true);
            EXPECT_EQ(moved.text, copied.text);
            EXPECT_TRUE(moved.result == copied.result) << "member types differ";
        }
    }
    EXPECT_GE(parsed, 50);  // the corpus must still reach the assembly, or this compares nothing
}

}  // namespace
