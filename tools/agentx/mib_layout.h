// Where KORVSNMP-MIB's objects sit: the module's arc and the numbers below
// it, as mibs/KORVSNMP-MIB.txt defines them.
#ifndef KORVAGENTX_MIB_LAYOUT_H
#define KORVAGENTX_MIB_LAYOUT_H

#include <cstdint>

namespace korvagentx {

// korvsnmpMIB: experimental.7947, until the maker's enterprise number takes
// its place (change it here and in the MIB's MODULE-IDENTITY).
inline constexpr uint32_t kKorvsnmpArc[] = {1, 3, 6, 1, 3, 7947};

// korvObjects = arc.1; its groups and tables are the statistics catalogue's
// (korvcatalogue::SnmpGroupOf).
inline constexpr uint32_t kObjects = 1;

// korvAgent's scalars that the front end answers itself (the catalogue's
// korvSnapshotAge, korvFailedSamples and korvSampleInterval).
inline constexpr uint32_t kSnapshotAge = 2;
inline constexpr uint32_t kFailedSamples = 3;
inline constexpr uint32_t kSampleInterval = 4;

// korvDiskType and korvIfKind.
enum class DiskType : uint32_t { Internal = 1, Ebox = 2, Usb = 3, Esata = 4, Other = 5 };
enum class IfKind : uint32_t { Total = 1, Interface = 2, Aggregation = 3, Pppoe = 4 };

}  // namespace korvagentx

#endif
