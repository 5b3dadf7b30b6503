// Writes generator.yml, the input of snmp_exporter's generator
// (prometheus-snmp-generator), for KORVSNMP-MIB from the statistics
// catalogue: one module, "korvsnmp", that walks korvObjects; in each table
// the names and enumerations become labels of every column (lookups by the
// table's index) instead of series of their own, and so do the indexes;
// the 64-bit sums that
// SNMP types as counters but that are rates become gauges. Counter32 and
// Counter64 objects stay counters, as the generator makes them.
//
// Usage: write_generator_config > generator.yml
#include <iostream>
#include <string>
#include <vector>

#include "catalogue/statistics_catalogue.h"

namespace {

using korvcatalogue::Kind;
using korvcatalogue::Section;
using korvcatalogue::Statistic;
using korvcatalogue::Syntax;

constexpr char kModule[] = "korvsnmp";
constexpr char kWalk[] = "korvObjects";
constexpr char kIndent[] = "    ";

constexpr Section kTables[] = {Section::Disk, Section::Interface, Section::Volume, Section::Lun};

bool Labels(const Statistic &statistic)
{
    return (statistic.kind == Kind::Name || statistic.kind == Kind::Enumeration) &&
           !statistic.snmpObject.empty();
}

}  // namespace

int main()
{
    std::ostream &out = std::cout;
    out << "# prometheus-snmp-generator's input for KORVSNMP-MIB, written from the\n"
           "# statistics catalogue by write_generator_config: do not edit. Regenerate\n"
           "# it and snmp.yml with `cmake --build build --target snmp_exporter_config`.\n"
        << "modules:\n  " << kModule << ":\n" << kIndent << "walk: [" << kWalk << "]\n";

    out << kIndent << "lookups:\n";
    for (Section table : kTables) {
        std::string index;
        for (const Statistic *statistic : korvcatalogue::StatisticsOf(table)) {
            if (statistic->kind == Kind::Index)
                index = statistic->snmpObject;
            else if (Labels(*statistic))
                out << kIndent << "  - source_indexes: [" << index << "]\n"
                    << kIndent << "    lookup: " << statistic->snmpObject << "\n";
        }
    }

    out << kIndent << "overrides:\n";
    for (const Statistic &statistic : korvcatalogue::Statistics()) {
        if (Labels(statistic) || statistic.kind == Kind::Index)
            out << kIndent << "  " << statistic.snmpObject << ":\n" << kIndent << "    ignore: true\n";
        else if (statistic.syntax == Syntax::CounterBasedGauge64)
            out << kIndent << "  " << statistic.snmpObject << ":\n" << kIndent << "    type: gauge\n";
    }
    return out ? 0 : 1;
}
