// A synthetic appliance: a host description for the stand-in and the
// collector reply that matches it, device for device. The benchmark, the
// tests and the example files under examples/ all take it from here.
#ifndef KORVEXAMPLE_APPLIANCE_H
#define KORVEXAMPLE_APPLIANCE_H

#include <string>
#include <vector>

#include <json/value.h>

#include "korv_standin.h"

namespace korvexample {

// How many of each part the appliance has.
struct ApplianceShape {
    int internalDisks = 24;
    int ssdCacheDisks = 0;     // dedicated SSD-cache devices, after the internal bays
    int expansionUnits = 5;
    int disksPerUnit = 8;
    int usbDevices = 2;
    int esataDevices = 6;
    int plainInterfaces = 24;  // eth0...
    int vlans = 6;             // eth0.10... on eth0
    int aggregations = 2;      // bond0... of two plain interfaces each, from the last ones
    int ovsMasters = 0;        // ovs-br0...
    bool pppoe = true;         // ppp0
    int spaces = 64;
    int flashCaches = 16;      // on the first spaces
    int luns = 512;
};

// The large appliance: 72 disks over 24 internal bays, five expansion units
// of eight, two USB and six eSATA devices; 32 interfaces (24 plain, six
// VLANs, two aggregations) and a PPPoE link; 64 spaces, 16 of them behind
// flash caches; 512 LUNs.
ApplianceShape LargeAppliance();

// A small appliance with one of every kind of part, for tests that run the
// road many times.
ApplianceShape SmallAppliance();

// A space's block device: the node's path and the kernel name that the node
// resolves to through /sys/dev/block.
struct SpaceDevice {
    std::string path;
    std::string kernelName;
};

// Devices named as on an appliance ("/dev/mapper/vg1-volume_1", "dm-0"),
// for descriptions written to files. Where no such nodes exist, the library
// leaves the spaces out of its result.
std::vector<SpaceDevice> ApplianceSpaceDevices(int count);

struct Appliance {
    korvstandin::HostDescription host;
    Json::Value reply;  // the collector's reply: {"data": {...}}
};

// The appliance of `shape`; space i (and flash cache i's layered device,
// which is space i+1's) use `spaceDevices`, which should hold at least
// `shape.spaces` entries (spaces beyond it are left out). The result is the
// same for the same arguments.
Appliance MakeAppliance(const ApplianceShape &shape, const std::vector<SpaceDevice> &spaceDevices);

}  // namespace korvexample

#endif
