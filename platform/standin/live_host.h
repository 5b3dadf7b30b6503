// Describing the live Linux host, for the stand-in when no test describes
// one. Each probe reads its sources under `root` ("" for the real system,
// a directory tree shaped like / for tests) and never fails: a missing
// optional source leaves its part of the description empty.
#ifndef KORV_STANDIN_LIVE_HOST_H
#define KORV_STANDIN_LIVE_HOST_H

#include <optional>
#include <string>
#include <vector>

#include "korv_standin.h"

namespace korvstandin::live {

// Physical memory in KiB, from sysinfo (not under `root`).
unsigned int ProbeMemory();

// Whole disks from sys/block: internal bays numbered from 1 in a stable
// order, and devices on a USB bus as USB devices with their model as text.
void ProbeDisks(const std::string &root, HostDescription &host);

// The external device `name` (sys/block/<name>) when it is one of the kind
// asked for (on a USB bus or not), with its vendor and model as text.
std::optional<ExternalDevice> ProbeExternalDevice(const std::string &root, const std::string &name,
                                                  bool usb);

// Interface names from sys/class/net, sorted, the loopback left out.
std::vector<std::string> ProbeInterfaceNames(const std::string &root);

// One interface of sys/class/net: a VLAN when proc/net/vlan/config lists it,
// a link aggregation with its members when it is a bonding master, else
// plain. None when sys/class/net has no such interface.
std::optional<NetInterface> ProbeInterface(const std::string &root, const std::string &name);

// The first interface whose name starts with "ppp"; empty when none.
std::string ProbePppLink(const std::string &root);

// Block-device filesystems mounted (proc/self/mounts), named after their
// mount point.
void ProbeSpaces(const std::string &root, HostDescription &host);

// The kernel iSCSI target's backstores (sys/kernel/config/target/core).
void ProbeLuns(const std::string &root, HostDescription &host);

// The web interface's strings file when it exists, else the shipped
// English texts.
void ProbeStrings(const std::string &root, HostDescription &host);

// Parses a sectioned text file: "[section]" lines, then "key=value" lines
// (blanks around both and one pair of double quotes around the value are
// dropped; lines starting with '#' or ';' are comments).
SectionedFile ParseSectionedFile(const std::string &text);

}  // namespace korvstandin::live

#endif
