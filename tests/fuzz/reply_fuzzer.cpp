// Arbitrary bytes as a collector reply: through GetDataJson and, when they
// parse, through SNMPParseReplyData with every resource selected, against a
// host with disks of every kind, VLANs, an aggregation, PPPoE, spaces with a
// flash cache and LUNs. Nothing may crash, throw or leak.
#include <cstddef>
#include <cstdint>

#include "korv_standin.h"
#include "korvsnmp/korvsnmp.h"
#include "syslog_capture.h"

namespace {

void DescribeHost()
{
    using namespace korvstandin;
    Reset();
    HostDescription &host = Host();
    host.physMemSize = 8388608;
    host.supportsEBox = true;
    host.disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"},
                  {2, DISK_CONTAINER_EBOX, 0, "/dev/sdb"},
                  {12, DISK_CONTAINER_SSD_CACHE, 1, "/dev/nvme0n1"},
                  {3, 3, 0, "/dev/sdc"}};
    host.expansionUnits = {{1, {"/dev/sdb"}, std::string("Korvel-X5"), true}};
    host.usb.devices = {{"sdu", "USB Disk 1"}};
    host.esata.devices = {{"sde", "eSATA Disk 1"}};
    host.interfaces = {{"eth0"}, {"eth1"}, {"eth0.5", NetRole::Vlan, "eth0", "eth0.5"},
                       {"bond0", NetRole::Aggregation, "", "", {"eth0", "eth1"}},
                       {"ovs_eth2", NetRole::OvsMaster}};
    host.pppoeInterface = "ppp0";
    host.spaces = {{"/dev/null", "volume1"}};
    host.flashCaches = {{"/dev/null", "/volume1", "/dev/null"}};
    host.luns = {{Json::Value("uuid-1"), Json::Value("LUN-1")}};
    host.files[kStringsFilePath]["volume"] = {{"volume_disk", "Disk"},
                                              {"volume_expansion", "Expansion Unit"},
                                              {"dedicated_ssd_cache", "SSD Cache"}};
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    static const bool described = (DescribeHost(), true);
    (void)described;

    korvtest::ClearLog();  // the library logs every refusal; keep only this input's
    Transmitor transmitor("fuzz");
    transmitor.dataStr.assign(reinterpret_cast<const char *>(data), size);
    Json::Value reply;
    if (transmitor.GetDataJson(reply) != 0)
        return 0;
    Json::Value request(Json::objectValue);
    request["resource"].append("all");
    Json::Value result(Json::objectValue);
    SNMPParseReplyData(request, reply, result);
    return 0;
}
