// Where the kernel's iSCSI target (LIO) describes its LUNs, and how a LUN's
// UUID is read there: the collector counts per LUN under this tree, the
// stand-in's live host lists the LUNs from it, and both name a LUN alike.
#ifndef KORVPROTO_LIO_TARGET_H
#define KORVPROTO_LIO_TARGET_H

#include <string>
#include <string_view>

namespace korvproto {

// Under sysfs: one directory per backstore HBA, in each one per device (LUN).
inline constexpr char kLioCoreDirectory[] = "kernel/config/target/core";

// In a device's directory: its unit serial, "T10 VPD Unit Serial Number: UUID".
inline constexpr char kLioUnitSerialFile[] = "wwn/vpd_unit_serial";

// In a device's directory: the SCSI logical unit's counters, one number a file.
inline constexpr char kLioCommandsFile[] = "statistics/scsi_lu/num_cmds";
inline constexpr char kLioReadMbytesFile[] = "statistics/scsi_lu/read_mbytes";
inline constexpr char kLioWriteMbytesFile[] = "statistics/scsi_lu/write_mbytes";

// The UUID in the text of a unit serial file: what follows its last ':',
// without surrounding blanks; "" when there is no ':' or nothing after it.
inline std::string LunUuidOfUnitSerial(std::string_view serial)
{
    constexpr std::string_view kBlanks = " \t\r\n";
    size_t colon = serial.rfind(':');
    if (colon == std::string_view::npos)
        return "";
    std::string_view uuid = serial.substr(colon + 1);
    size_t first = uuid.find_first_not_of(kBlanks);
    if (first == std::string_view::npos)
        return "";
    return std::string(uuid.substr(first, uuid.find_last_not_of(kBlanks) - first + 1));
}

}  // namespace korvproto

#endif
