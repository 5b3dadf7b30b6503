// Describing the live Linux host, for the stand-in when no test describes
// one. Each probe reads its sources under `root` ("" for the real system,
// a directory tree shaped like / for tests) and never fails: a missing
// optional source leaves its part of the description empty.
#ifndef KORV_STANDIN_LIVE_HOST_H
#define KORV_STANDIN_LIVE_HOST_H

#include <string>

#include "korv_standin.h"

namespace korvstandin::live {

// Physical memory in KiB, from sysinfo (not under `root`).
unsigned int ProbeMemory();

// Whole disks from sys/block: internal bays numbered from 1 in a stable
// order, and devices on a USB bus as USB devices with their model as text.
void ProbeDisks(const std::string &root, HostDescription &host);

// Interfaces from sys/class/net (the loopback left out), VLANs from
// proc/net/vlan/config, bonding masters and their slaves, a ppp link.
void ProbeNetwork(const std::string &root, HostDescription &host);

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
