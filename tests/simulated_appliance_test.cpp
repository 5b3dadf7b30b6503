// The simulated appliance across real processes: korvsnmpcd replays the large
// appliance's recorded reply, korvsnmp-stat reads the appliance's host
// description file, and what it prints is exactly what the library assembles
// in this process from the same two files.
#include <csignal>
#include <cstdlib>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <json/value.h>

#include "collector_process.h"
#include "json_text.h"
#include "host_file.h"
#include "korv_standin.h"
#include "korvsnmp/korvsnmp.h"
#include "platform_test.h"
#include "test_collector.h"

namespace {

constexpr char kHostFile[] = KORVSNMP_EXAMPLES_DIR "/large-appliance.host.json";
constexpr char kReplyFile[] = KORVSNMP_EXAMPLES_DIR "/large-appliance.reply.json";

using SimulatedAppliance = korvtest::PlatformTest;

TEST_F(SimulatedAppliance, KorvsnmpStatPrintsWhatTheLibraryAssemblesFromTheSameFiles)
{
    setenv(korvstandin::kHostFileVariable, kHostFile, 1);
    korvstandin::UseProcessHost();
    Json::Value inProcess;
    ASSERT_TRUE(SNMPParseReplyData(Json::Value(Json::objectValue),
                                   korvtest::ParseJson(korvtest::ReadWholeFile(kReplyFile)), inProcess));
    ASSERT_EQ(inProcess["disk"]["disk"].size(), 72u);
    ASSERT_EQ(inProcess["lun"].size(), 512u);

    // The collector listens where this process's redirection sends the fixed path.
    const std::string &socket = korvtest::PrivateCollectorPath();
    korvtest::CollectorProcess collector(KORVSNMPCD_PATH, {"--foreground", "--socket", socket, "--replay", kReplyFile},
                                         socket + ".log");
    ASSERT_TRUE(korvtest::WaitUntilConnectable(socket)) << collector.Log();

    std::vector<std::string> command = korvtest::RedirectedChildVariables();
    command.insert(command.end(), {std::string(korvstandin::kHostFileVariable) + "=" + kHostFile,
                                   KORVSNMP_STAT_PATH, "--compact"});
    korvtest::CollectorProcess korvsnmpStat("/usr/bin/env", command, socket + ".stat");  // its output, stderr included
    ASSERT_EQ(korvsnmpStat.WaitForExit(), 0) << korvsnmpStat.Log();
    EXPECT_EQ(korvtest::JsonText(korvtest::ParseJson(korvsnmpStat.Log())), korvtest::JsonText(inProcess));
    EXPECT_EQ(collector.Stop(SIGTERM), 0) << collector.Log();
}

}  // namespace
