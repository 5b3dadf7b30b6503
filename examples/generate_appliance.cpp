// Writes the large appliance as a host description file and the matching
// collector reply:
//
//   generate_appliance DIRECTORY
//
// gives DIRECTORY/large-appliance.host.json, DIRECTORY/large-appliance.reply.json
// and DIRECTORY/large-appliance.devices: the block devices that the spaces
// and flash caches stand on, one a line, "KERNEL-NAME NODE-PATH" (what
// run_stat.sh --simulate makes for them).
#include <cstdio>
#include <fstream>
#include <string>
#include <vector>

#include <json/writer.h>

#include "appliance.h"
#include "host_file.h"

namespace {

bool Write(const std::string &path, const std::string &text)
{
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out << text;
    out.close();
    if (!out) {
        std::fprintf(stderr, "generate_appliance: cannot write %s\n", path.c_str());
        return false;
    }
    return true;
}

}  // namespace

int main(int argc, char **argv)
{
    if (argc != 2 || argv[1][0] == '\0' || argv[1][0] == '-') {
        std::fprintf(stderr, "usage: generate_appliance DIRECTORY\n");
        return 2;
    }
    const std::string directory = argv[1];
    const korvexample::ApplianceShape shape = korvexample::LargeAppliance();
    const std::vector<korvexample::SpaceDevice> devices = korvexample::ApplianceSpaceDevices(shape);
    const korvexample::Appliance appliance = korvexample::MakeAppliance(shape, devices);
    std::string deviceLines;
    for (const korvexample::SpaceDevice &device : devices)
        deviceLines += device.kernelName + " " + device.path + "\n";
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "  ";
    const bool written =
        Write(directory + "/large-appliance.host.json", korvstandin::HostFileText(appliance.host)) &&
        Write(directory + "/large-appliance.reply.json", Json::writeString(builder, appliance.reply) + "\n") &&
        Write(directory + "/large-appliance.devices", deviceLines);
    return written ? 0 : 1;
}
