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

// How many block devices the spaces of `shape` need: one per space, and one
// per flash cache for the layered device that it forms over its space.
int SpaceDeviceCount(const ApplianceShape &shape);

// The devices of `shape`'s spaces named as on an appliance: the spaces'
// ("/dev/mapper/vg1-volume_1", "dm-0"...), then the flash caches'
// ("/dev/mapper/cachedev_1", after the spaces' dm numbers), for descriptions
// written to files. Where no such nodes exist, the library leaves the
// spaces out of its result.
std::vector<SpaceDevice> ApplianceSpaceDevices(const ApplianceShape &shape);

struct Appliance {
    korvstandin::HostDescription host;
    Json::Value reply;  // the collector's reply: {"data": {...}}
};

// The appliance of `shape`. `spaceDevices` holds SpaceDeviceCount(shape)
// devices: first the spaces', then the flash caches' layered devices; spaces
// and flash caches beyond it are left out. The reply has a record for every
// one of them, so that every space is named: a cached one through its cache's
// device. The result is the same for the same arguments.
Appliance MakeAppliance(const ApplianceShape &shape, const std::vector<SpaceDevice> &spaceDevices);

}  // namespace korvexample

#endif
