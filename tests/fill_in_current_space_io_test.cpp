// The space section. Device nodes are real: the tests make block-device nodes
// for devices that the running kernel has, so that their kernel names come
// back through the real links under /sys/dev/block.
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <fstream>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/writer.h>  // prints a Json::Value in a failure

#include "block_nodes.h"
#include "json_text.h"
#include "korv_standin.h"
#include "platform_test.h"
#include "korvsnmp/fill_in_current_space_io.h"
#include "syslog_capture.h"

namespace {

using ::testing::ElementsAre, ::testing::IsEmpty;

constexpr char kUnit[] = "fill_in_current_space_io";
constexpr char kSysBlock[] = "/sys/dev/block";

const auto Parse = korvtest::ParseJson;

// Runs the fill-in on `spaceIO` over a `space` holding "earlier"; expects
// the result `succeeds`.
Json::Value Fill(const Json::Value &spaceIO, bool succeeds = true)
{
    Json::Value space = Parse(R"({"earlier": 1})");
    EXPECT_EQ(KORVSNMP::FillInCurrentSpaceIO(spaceIO, space), succeeds);
    return space;
}

using SpaceIOTest = korvtest::PlatformTest;

TEST_F(SpaceIOTest, UnreadableInputFailsUntouchedAndEmptyInputGivesNoVolumes)
{
    korvstandin::Host().spaces = {{"/dev/none", "vol"}};
    const struct { const char *spaceIO, *message; } cases[] = {
        {R"({"device": "total"})", "SpaceIO is not array."},
        {R"([{"device": "total"}, 3])", "SpaceIO element 1 is not an object"},
        {R"([{"device": "total"}, {"device": 7}])", R"(SpaceIO element 1: "device" is not a string)"},
        {R"([{"device": ["sda"]}])", R"(SpaceIO element 0: "device" is not a string)"}};
    for (const auto &c : cases) {
        korvtest::ClearLog(); SCOPED_TRACE(c.spaceIO);
        EXPECT_EQ(Fill(Parse(c.spaceIO), false), Parse(R"({"earlier": 1})"));
        EXPECT_THAT(korvtest::LoggedMessages(), ElementsAre(korvtest::Logged(LOG_ERR, kUnit, c.message)));
    }
    // An empty section gives an empty volume list.
    korvtest::ClearLog(); Json::Value notAnObject = "x";
    EXPECT_EQ(Fill(Json::Value(Json::arrayValue)), Parse(R"({"earlier": 1, "volume": []})"));
    EXPECT_TRUE(KORVSNMP::FillInCurrentSpaceIO(Parse(R"([{"device": "total"}])"), notAnObject));
    EXPECT_EQ(notAnObject, Parse(R"({"volume": [], "total": {"device": "total"}})"));
    EXPECT_THAT(korvtest::LoggedMessages(), IsEmpty());
}

struct SpaceIONodeTest : SpaceIOTest {
    void SetUp() override
    {
        SpaceIOTest::SetUp();
        if (std::string whyNot; !nodes_.Make(5, whyNot)) GTEST_SKIP() << whyNot;
        directory_ = nodes_.Directory(); std::ofstream(directory_ + "/regular") << "not a device";
    }
    const std::string &Node(size_t i) const { return nodes_.Node(i); }

    // The record of device `i`'s kernel name with `members`.
    std::string Record(size_t i, const std::string &members = "") const
    { return R"({"device": ")" + nodes_.Name(i) + '"' + (members.empty() ? "" : ", " + members) + "}"; }

    korvtest::BlockNodes nodes_; std::string directory_;
};

TEST_F(SpaceIONodeTest, SpaceDevicesAreNamedAndTheLastTotalKept)
{
    korvstandin::Host().spaces = {{Node(0), "Volume 1"}, {Node(1), "Volume 2"}, {Node(2), ""}};
    const Json::Value space = Fill(Parse("[" + Record(1, R"("r": 1, "display_name": "old")") +
                                         R"(, {"device": "total", "n": 1}, )" + Record(3) +
                                         R"(, {"r": 9}, {"device": null}, null, )" + Record(0) + ", " + Record(2) +
                                         R"(, {"device": "Total"}, {"device": "total", "n": 2}, )" +
                                         Record(1, R"("r": 2)") + "]"));
    EXPECT_EQ(space, Parse(R"({"earlier": 1, "total": {"device": "total", "n": 2}, "volume": [)" +
                           Record(1, R"("r": 1, "display_name": "Volume 2")") + ", " +
                           Record(0, R"("display_name": "Volume 1")") + ", " +
                           Record(1, R"("r": 2, "display_name": "Volume 2")") + "]}"));
    EXPECT_THAT(korvtest::LoggedMessages(), IsEmpty());
}

TEST_F(SpaceIONodeTest, EachCacheSuppressesOneSpaceWithItsPath)
{
    // Names are cut to 1023 characters.
    const std::string longName(1500, 'n'), cut = longName.substr(0, 1023);
    korvstandin::Host().spaces = {{Node(0), "first"}, {Node(0), "second"}, {Node(3), longName}};
    korvstandin::Host().flashCaches = {{Node(0), "//cache1", Node(1), false},
                                       {Node(0), "/" + longName + "v", Node(2), false},
                                       {Node(4), "/cache3", Node(3), false}};
    const Json::Value spaceIO = Parse("[" + Record(0) + ", " + Record(1) + ", " + Record(2) + ", " + Record(3) + "]");
    // A cached space is reported under the cache's layered device, named by
    // the cache's path without its first '/'.
    const std::string cachesAndPlain = Record(1, R"("display_name": "/cache1")") + ", " +
                                       Record(2, R"("display_name": ")" + cut + '"') + ", " +
                                       Record(3, R"("display_name": ")" + cut + '"');
    EXPECT_EQ(Fill(spaceIO)["volume"], Parse("[" + cachesAndPlain + "]"));

    // A third space with the cached path is beyond what the two caches take.
    korvstandin::Host().spaces.insert(korvstandin::Host().spaces.begin() + 2, {Node(0), "third"});
    EXPECT_EQ(Fill(spaceIO)["volume"], Parse("[" + Record(0, R"("display_name": "third")") + ", " + cachesAndPlain + "]"));
}

// A node that is missing, not a device or has no /sys/dev/block link names
// nothing; a cache whose layered device is so leaves its space named.
TEST_F(SpaceIONodeTest, UnresolvedNodesAndCaches)
{
    const std::string unlinked = directory_ + "/unlinked";
    ASSERT_EQ(mknod(unlinked.c_str(), S_IFBLK | 0600, makedev(nodes_.Device(0).major, 1048575)), 0);
    korvstandin::Host().spaces = {{directory_ + "/missing", "Missing"}, {directory_ + "/regular", "File"},
                                  {unlinked, "Unlinked"}, {Node(0), "zero"}, {Node(1), "one"}, {Node(2), "two"}};
    korvstandin::Host().flashCaches = {{Node(0), "/c0", Node(3), true},
                                       {Node(1), "/c1", directory_ + "/regular", false},
                                       {Node(2), "/c2", unlinked, false}};
    const std::string spaceIO = "[" + Record(0) + ", " + Record(1) + ", " + Record(2) + ", " + Record(3) + "]";
    const Json::Value expected = Parse("[" + Record(0, R"("display_name": "zero")") + ", " +
                                       Record(1, R"("display_name": "one")") + ", " +
                                       Record(2, R"("display_name": "two")") + "]");
    EXPECT_EQ(Fill(Parse(spaceIO))["volume"], expected);

    // Without the cache list, no cache is named either way.
    korvstandin::Host().flashCaches = {{Node(0), "/c0", Node(3), false}};
    for (korvstandin::Fault fault : {korvstandin::Fault::Fail, korvstandin::Fault::FailLeavingList}) {
        korvstandin::SetFault(korvstandin::Op::KORVFlashCacheConfigGet, fault);
        EXPECT_EQ(Fill(Parse(spaceIO))["volume"], expected);
    }
    EXPECT_THAT(korvtest::LoggedMessages(), IsEmpty());
}

// A link target of 1024 characters or more stays terminated and is cut: the
// test replaces /sys/dev/block, in a mount namespace of a child process of
// its own, with one long link.
TEST_F(SpaceIONodeTest, OverlongLinkTargetIsCutAndTerminated)
{
    const std::string target = "../" + std::string(1000, 'd') + "/abcdefghijklmnopqrstuvwxyz0123456789";
    const std::string key = target.substr(0, 1023).substr(1004);
    constexpr int kRefused = 77; korvstandin::Host().spaces = {{Node(0), "long link"}};
    const std::string link = std::string(kSysBlock) + "/" + std::to_string(nodes_.Device(0).major) +
                             ":" + std::to_string(nodes_.Device(0).minor);

    pid_t child = fork(); ASSERT_NE(child, -1) << std::strerror(errno);
    if (child == 0) {
        if (unshare(CLONE_NEWNS) != 0 || mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0 ||
            mount("tmpfs", kSysBlock, "tmpfs", 0, nullptr) != 0 || symlink(target.c_str(), link.c_str()) != 0)
            _exit(kRefused);
        Json::Value space;
        _exit(KORVSNMP::FillInCurrentSpaceIO(Parse(R"([{"device": ")" + key + R"("}])"), space) && space["volume"].size() == 1 &&
                      space["volume"][0]["display_name"] == "long link" ? 0 : 1);
    }
    int status = 0; ASSERT_EQ(waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFEXITED(status)) << "the child ended abnormally";
    if (WEXITSTATUS(status) == kRefused)
        GTEST_SKIP() << "cannot replace " << kSysBlock << " in a private mount namespace";
    EXPECT_EQ(WEXITSTATUS(status), 0) << "the device was not named under the key " << key;
}

}  // namespace
