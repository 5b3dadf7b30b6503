#include "catalogue/statistics_catalogue.h"


namespace korvcatalogue {

namespace {

using S = Section;
using K = Kind;
using U = Unit;
using X = Syntax;

// What a table row starts with: its index (column 1).
void AddIndex(std::vector<Statistic> &all, Section section, const std::string &object)
{
    all.push_back({section, "", K::Index, U::None, object + "Index", 1, X::Unsigned32, "", "", "#",
                   "The row's index, kept for the same device across samples and restarts"});
}

void AddName(std::vector<Statistic> &all, Section section, const char *member, const std::string &object,
             uint32_t column, const char *title, const char *help)
{
    all.push_back({section, member, K::Name, U::None, object, column, X::SnmpAdminString, "", "", title,
                   help});
}

// Utilization and the four rates that disks, volumes and LUNs share, from
// column `first` on. `syntax` is Gauge32 in a table; the totals' sums are
// CounterBasedGauge64. `metric` is empty where the exposition leaves them to sum().
void AddDeviceRates(std::vector<Statistic> &all, Section section, const std::string &object,
                    uint32_t first, Syntax syntax, const std::string &metric)
{
    const auto name = [&](const char *suffix) { return metric.empty() ? metric : metric + suffix; };
    all.push_back({section, "utilization", K::Share, U::Percent, object + "Utilization", first,
                   X::Gauge32, name("_utilization_ratio"), "", "%util",
                   "Share of the last interval with I/O in flight"});
    all.push_back({section, "read_access", K::Rate, U::PerSecond, object + "ReadAccess", first + 1,
                   syntax, name("_reads_per_second"), "", "r/s", "Read operations completed per second"});
    all.push_back({section, "read_byte", K::Rate, U::BytesPerSecond, object + "ReadByte", first + 2,
                   syntax, name("_read_bytes_per_second"), "", "rkB/s", "Bytes read per second"});
    all.push_back({section, "write_access", K::Rate, U::PerSecond, object + "WriteAccess", first + 3,
                   syntax, name("_writes_per_second"), "", "w/s", "Write operations completed per second"});
    all.push_back({section, "write_byte", K::Rate, U::BytesPerSecond, object + "WriteByte", first + 4,
                   syntax, name("_write_bytes_per_second"), "", "wkB/s", "Bytes written per second"});
}

// The cumulative block device counters of /proc/diskstats, from column
// `first` on. In the total groups they are the sums of the table's rows.
void AddBlockCounters(std::vector<Statistic> &all, Section section, const std::string &object,
                      uint32_t first, const std::string &metric)
{
    const auto name = [&](const char *suffix) { return metric.empty() ? metric : metric + suffix; };
    all.push_back({section, "read_access_total", K::Counter, U::Operations, object + "ReadAccessTotal",
                   first, X::Counter64, name("_reads_completed"), "", "reads", "Read operations completed"});
    all.push_back({section, "read_byte_total", K::Counter, U::Bytes, object + "ReadByteTotal", first + 1,
                   X::Counter64, name("_read_bytes"), "", "rbytes", "Bytes read"});
    all.push_back({section, "write_access_total", K::Counter, U::Operations, object + "WriteAccessTotal",
                   first + 2, X::Counter64, name("_writes_completed"), "", "writes",
                   "Write operations completed"});
    all.push_back({section, "write_byte_total", K::Counter, U::Bytes, object + "WriteByteTotal",
                   first + 3, X::Counter64, name("_written_bytes"), "", "wbytes", "Bytes written"});
    all.push_back({section, "busy_ms_total", K::Counter, U::Milliseconds, object + "BusyMsTotal",
                   first + 4, X::Counter64, name("_io_time_seconds"), "", "busy",
                   "Time with I/O in flight"});
}

// A table's discontinuity column, or a group's discontinuity scalar.
void AddDiscontinuity(std::vector<Statistic> &all, Section section, const std::string &object,
                      uint32_t number, bool row = true)
{
    all.push_back({section, "", K::Discontinuity, U::TimeTicks, object + "DiscontinuityTime", number,
                   X::TimeStamp, "", "", "disc",
                   row ? "sysUpTime when the row appeared or one of its counters went back"
                       : "sysUpTime when the counters were first served or one of them went back"});
}

void AddCpu(std::vector<Statistic> &all)
{
    struct State {
        const char *name;  // the member and the mode label
        const char *object;
        const char *title;
        const char *help;  // after "Share of processor time" and "Processor time"
    };
    static const State kStates[] = {
        {"user", "User", "%usr", "in user mode"},
        {"nice", "Nice", "%nice", "in user mode at a lowered priority"},
        {"system", "System", "%sys", "in the kernel"},
        {"idle", "Idle", "%idle", "idle"},
        {"iowait", "Iowait", "%iowait", "idle while I/O was outstanding"},
        {"irq", "Irq", "%irq", "serving interrupts"},
        {"softirq", "Softirq", "%soft", "serving software interrupts"},
        {"steal", "Steal", "%steal", "taken by the hypervisor for other guests"},
    };
    uint32_t number = 1;
    for (const State &state : kStates)
        all.push_back({S::Cpu, state.name, K::Share, U::Percent, std::string("korvCpu") + state.object,
                       number++, X::Gauge32, "korvsnmp_cpu_ratio",
                       std::string("mode=\"") + state.name + "\"", state.title,
                       std::string("Share of processor time ") + state.help});
    for (const State &state : kStates)
        all.push_back({S::Cpu, std::string(state.name) + "_ticks_total", K::Counter, U::ClockTicks,
                       std::string("korvCpu") + state.object + "TicksTotal", number++, X::Counter64,
                       "korvsnmp_cpu_seconds", std::string("mode=\"") + state.name + "\"",
                       state.title + 1, std::string("Processor time ") + state.help});
}

}  // namespace

// Column numbers: the existing objects keep theirs; the cumulative counters
// and discontinuity times follow them. A 0 in the device macros is set below.
const std::vector<Statistic> &Statistics()
{
    static const std::vector<Statistic> statistics = [] {
        std::vector<Statistic> all = {
            // korvAgent: the front end's own scalars.
            {S::Agent, "time", K::Gauge, U::Seconds, "korvSampleTime", 1, X::Unsigned32,
             "korvsnmp_sample_timestamp_seconds", "", "time",
             "Time of the collector's sample, seconds since the epoch"},
            {S::Agent, "", K::Gauge, U::Seconds, "korvSnapshotAge", 2, X::Unsigned32,
             "korvsnmp_snapshot_age_seconds", "", "age", "Age of the snapshot being served"},
            {S::Agent, "", K::Counter, U::Operations, "korvFailedSamples", 3, X::Counter32,
             "korvsnmp_failed_samples", "", "fail", "Samples that failed since the start"},
            {S::Agent, "", K::Gauge, U::Seconds, "korvSampleInterval", 4, X::Unsigned32,
             "korvsnmp_sample_interval_seconds", "", "intv", "Interval between samples"},
            // The exporter's own: SNMP tells the same by korvSnapshotAge.
            {S::Agent, "", K::Gauge, U::None, "", 0, X::None, "korvsnmp_collector_up", "", "up",
             "Whether the last sample reached the collector: 1, else 0"},
        };
        AddCpu(all);
        AddDiscontinuity(all, S::Cpu, "korvCpu", 17, false);
        all.insert(all.end(), {
            // korvMemory: sizes at the sample.
            {S::Memory, "memory_size", K::Gauge, U::KiB, "korvMemorySize", 1, X::Gauge32,
             "korvsnmp_memory_size_bytes", "", "size", "Physical memory size"},
            {S::Memory, "total_real", K::Gauge, U::KiB, "korvMemoryTotalReal", 2, X::Gauge32,
             "korvsnmp_memory_total_real_bytes", "", "total", "Main memory usable by the system"},
            {S::Memory, "avail_real", K::Gauge, U::KiB, "korvMemoryAvailReal", 3, X::Gauge32,
             "korvsnmp_memory_avail_real_bytes", "", "avail",
             "Main memory available for new work without swapping"},
            {S::Memory, "free_real", K::Gauge, U::KiB, "korvMemoryFreeReal", 4, X::Gauge32,
             "korvsnmp_memory_free_real_bytes", "", "free", "Main memory unused"},
            {S::Memory, "cached", K::Gauge, U::KiB, "korvMemoryCached", 5, X::Gauge32,
             "korvsnmp_memory_cached_bytes", "", "cached", "Main memory in the page cache"},
            {S::Memory, "buffer", K::Gauge, U::KiB, "korvMemoryBuffer", 6, X::Gauge32,
             "korvsnmp_memory_buffer_bytes", "", "buff", "Main memory in block device buffers"},
            {S::Memory, "total_swap", K::Gauge, U::KiB, "korvMemoryTotalSwap", 7, X::Gauge32,
             "korvsnmp_memory_total_swap_bytes", "", "swap", "Swap space"},
            {S::Memory, "avail_swap", K::Gauge, U::KiB, "korvMemoryAvailSwap", 8, X::Gauge32,
             "korvsnmp_memory_avail_swap_bytes", "", "swfree", "Swap space unused"},

            // korvNfs: the NFS server.
            {S::Nfs, "calls", K::Rate, U::PerSecond, "korvNfsCalls", 1, X::Gauge32,
             "korvsnmp_nfs_calls_per_second", "", "calls/s", "NFS remote procedure calls per second"},
            {S::Nfs, "read_byte", K::Rate, U::BytesPerSecond, "korvNfsReadByte", 2, X::Gauge32,
             "korvsnmp_nfs_read_bytes_per_second", "", "rkB/s", "Bytes read by NFS clients per second"},
            {S::Nfs, "write_byte", K::Rate, U::BytesPerSecond, "korvNfsWriteByte", 3, X::Gauge32,
             "korvsnmp_nfs_write_bytes_per_second", "", "wkB/s",
             "Bytes written by NFS clients per second"},
            {S::Nfs, "calls_total", K::Counter, U::Operations, "korvNfsCallsTotal", 4, X::Counter64,
             "korvsnmp_nfs_calls", "", "calls", "NFS remote procedure calls"},
            {S::Nfs, "read_byte_total", K::Counter, U::Bytes, "korvNfsReadByteTotal", 5, X::Counter64,
             "korvsnmp_nfs_read_bytes", "", "rbytes", "Bytes read by NFS clients"},
            {S::Nfs, "write_byte_total", K::Counter, U::Bytes, "korvNfsWriteByteTotal", 6, X::Counter64,
             "korvsnmp_nfs_write_bytes", "", "wbytes", "Bytes written by NFS clients"},
        });
        AddDiscontinuity(all, S::Nfs, "korvNfs", 7, false);

        // korvDiskTotal: the "total" record, then the 64-bit sums of the rows' counters.
        AddDeviceRates(all, S::DiskTotal, "korvDiskTotal", 1, X::CounterBasedGauge64, "");
        AddBlockCounters(all, S::DiskTotal, "korvDiskTotal", 6, "");
        AddDiscontinuity(all, S::DiskTotal, "korvDiskTotal", 11, false);
        // korvDiskTable.
        AddIndex(all, S::Disk, "korvDisk");
        AddName(all, S::Disk, "device", "korvDiskDevice", 2, "device", "The disk's kernel name");
        AddName(all, S::Disk, "display_name", "korvDiskDisplayName", 3, "name", "The disk's name for users");
        all.push_back({S::Disk, "type", K::Enumeration, U::None, "korvDiskType", 4, X::Integer, "", "",
                       "type", "Where the disk sits: internal, ebox, usb, eSATA or other"});
        AddDeviceRates(all, S::Disk, "korvDisk", 5, X::Gauge32, "korvsnmp_disk");
        AddBlockCounters(all, S::Disk, "korvDisk", 10, "korvsnmp_disk");
        AddDiscontinuity(all, S::Disk, "korvDisk", 15);

        // korvIfTable: total, interfaces, aggregations, PPPoE.
        AddIndex(all, S::Interface, "korvIf");
        AddName(all, S::Interface, "device", "korvIfDevice", 2, "device", "The interface's name");
        all.push_back({S::Interface, "", K::Enumeration, U::None, "korvIfKind", 3, X::Integer, "", "", "kind",
                       "What the row is: total, interface, aggregation or pppoe"});
        struct Direction {
            const char *member;  // "rx", "tx"
            const char *object;  // "Rx", "Tx"
            const char *metric;  // "receive", "transmit"
            const char *verb;    // "received", "transmitted"
        };
        static const Direction kDirections[] = {{"rx", "Rx", "receive", "received"},
                                                {"tx", "Tx", "transmit", "transmitted"}};
        uint32_t column = 4;
        for (const Direction &d : kDirections)
            all.push_back({S::Interface, d.member, K::Rate, U::BytesPerSecond, std::string("korvIf") + d.object,
                           column++, X::Gauge32,
                           std::string("korvsnmp_network_") + d.metric + "_bytes_per_second", "",
                           std::string(d.member) + "kB/s", std::string("Bytes ") + d.verb + " per second"});
        struct Count {
            const char *member;  // after "rx_"
            const char *object;
            const char *metric;
            Unit unit;
            const char *help;    // before the verb
        };
        static const Count kCounts[] = {{"byte", "Byte", "bytes", U::Bytes, "Bytes"},
                                        {"packet", "Packet", "packets", U::Operations, "Packets"},
                                        {"error", "Error", "errors", U::Operations, "Errors in packets"},
                                        {"drop", "Drop", "drops", U::Operations, "Packets dropped"}};
        for (const Direction &d : kDirections)
            for (const Count &c : kCounts)
                all.push_back({S::Interface, std::string(d.member) + "_" + c.member + "_total", K::Counter,
                               c.unit, std::string("korvIf") + d.object + c.object + "Total", column++,
                               X::Counter64, std::string("korvsnmp_network_") + d.metric + "_" + c.metric, "",
                               std::string(d.member) + c.member + "s",
                               std::string(c.help) + " " + (c.unit == U::Bytes || c.member[0] == 'p'
                                                                ? d.verb
                                                                : std::string("while ") +
                                                                      (d.member[0] == 'r' ? "receiving"
                                                                                          : "transmitting"))});
        AddDiscontinuity(all, S::Interface, "korvIf", 14);

        // korvVolumeTotal and korvVolumeTable.
        AddDeviceRates(all, S::VolumeTotal, "korvVolumeTotal", 1, X::CounterBasedGauge64, "");
        AddBlockCounters(all, S::VolumeTotal, "korvVolumeTotal", 6, "");
        AddDiscontinuity(all, S::VolumeTotal, "korvVolumeTotal", 11, false);
        AddIndex(all, S::Volume, "korvVolume");
        AddName(all, S::Volume, "device", "korvVolumeDevice", 2, "device",
                "The kernel name of the block device that carries the volume");
        AddName(all, S::Volume, "display_name", "korvVolumeDisplayName", 3, "name", "The volume's name");
        AddDeviceRates(all, S::Volume, "korvVolume", 4, X::Gauge32, "korvsnmp_volume");
        AddBlockCounters(all, S::Volume, "korvVolume", 9, "korvsnmp_volume");
        AddDiscontinuity(all, S::Volume, "korvVolume", 14);

        // korvLunTable: what the kernel's iSCSI target counts.
        AddIndex(all, S::Lun, "korvLun");
        AddName(all, S::Lun, "uuid", "korvLunUuid", 2, "uuid", "The LUN's UUID");
        AddName(all, S::Lun, "lun_name", "korvLunName", 3, "name", "The LUN's name");
        AddDeviceRates(all, S::Lun, "korvLun", 4, X::Gauge32, "korvsnmp_lun");
        all.push_back({S::Lun, "command_total", K::Counter, U::Operations, "korvLunCommandTotal", 9,
                       X::Counter64, "korvsnmp_lun_commands", "", "cmds", "SCSI commands received"});
        all.push_back({S::Lun, "read_mbyte_total", K::Counter, U::MiB, "korvLunReadMbyteTotal", 10,
                       X::Counter64, "korvsnmp_lun_read_bytes", "", "rMiB", "Data read, in whole mebibytes"});
        all.push_back({S::Lun, "write_mbyte_total", K::Counter, U::MiB, "korvLunWriteMbyteTotal", 11,
                       X::Counter64, "korvsnmp_lun_written_bytes", "", "wMiB",
                       "Data written, in whole mebibytes"});
        AddDiscontinuity(all, S::Lun, "korvLun", 12);
        return all;
    }();
    return statistics;
}

const Statistic &AgentStatistic(AgentValue value)
{
    const std::vector<const Statistic *> agent = StatisticsOf(S::Agent);
    return *agent.at(static_cast<size_t>(value));
}

std::vector<const Statistic *> StatisticsOf(Section section)
{
    std::vector<const Statistic *> of;
    for (const Statistic &statistic : Statistics())
        if (statistic.section == section)
            of.push_back(&statistic);
    return of;
}

const Statistic *Find(Section section, const std::string &member)
{
    for (const Statistic &statistic : Statistics())
        if (statistic.section == section && !member.empty() && statistic.member == member)
            return &statistic;
    return nullptr;
}

uint32_t SnmpGroupOf(Section section)
{
    switch (section) {
    case S::Agent: return 1;
    case S::Cpu: return 2;
    case S::Memory: return 3;
    case S::Nfs: return 4;
    case S::DiskTotal: return 5;
    case S::Disk: return 6;
    case S::Interface: return 7;
    case S::VolumeTotal: return 8;
    case S::Volume: return 9;
    case S::Lun: return 10;
    }
    return 0;
}

const char *ResultMemberOf(Section section)
{
    switch (section) {
    case S::Agent: return "";
    case S::Cpu: return "cpu";
    case S::Memory: return "memory";
    case S::Nfs: return "nfs";
    case S::DiskTotal:
    case S::Disk: return "disk";
    case S::Interface: return "network";
    case S::VolumeTotal:
    case S::Volume: return "space";
    case S::Lun: return "lun";
    }
    return "";
}

const char *UnitWordOf(Unit unit)
{
    switch (unit) {
    case U::None: return "";
    case U::Percent: return "percent";
    case U::PerSecond: return "per second";
    case U::BytesPerSecond: return "bytes per second";
    case U::KiB: return "KiB";
    case U::Bytes: return "bytes";
    case U::Operations: return "number of";
    case U::Milliseconds: return "milliseconds";
    case U::ClockTicks: return "clock ticks";
    case U::MiB: return "MiB";
    case U::Seconds: return "seconds";
    case U::TimeTicks: return "hundredths of a second";
    }
    return "";
}

const char *TitleOf(Section section)
{
    switch (section) {
    case S::Agent: return "Agent";
    case S::Cpu: return "CPU";
    case S::Memory: return "Memory";
    case S::Nfs: return "NFS";
    case S::DiskTotal: return "Disk total";
    case S::Disk: return "Disk";
    case S::Interface: return "Interface";
    case S::VolumeTotal: return "Volume total";
    case S::Volume: return "Volume";
    case S::Lun: return "LUN";
    }
    return "";
}

}  // namespace korvcatalogue
