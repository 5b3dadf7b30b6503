// One GetNext lookup for every object of a snapshot with the large
// appliance's tables, as a walk asks them: the layout answered from
// now (EncodedSnapshot::FindNext, no copy, no allocation) against the former
// way (the asked name copied into an Oid, std::upper_bound over the entries
// comparing vectors, the found name copied out for net-snmp).
#include <benchmark/benchmark.h>

#include <algorithm>
#include <vector>

#include "catalogue/statistics_catalogue.h"
#include "encoded_snapshot.h"
#include "mib_layout.h"

namespace {

using korvagentx::Entry;
using korvagentx::Oid;
using korvagentx::Snapshot;
using korvagentx::ValueType;

// Tables of the large appliance's shape (72 disks, 32 interfaces, 64
// volumes and 512 LUNs), with the catalogue's columns of each.
Snapshot LargeSnapshot()
{
    using korvcatalogue::Section;
    using korvcatalogue::Syntax;
    const std::pair<Section, uint32_t> tables[] = {
        {Section::Disk, 72}, {Section::Interface, 32}, {Section::Volume, 64}, {Section::Lun, 512}};
    Snapshot snapshot;
    for (const auto &[section, rows] : tables)
        for (const korvcatalogue::Statistic *column : korvcatalogue::StatisticsOf(section)) {
            if (column->syntax == Syntax::None || column->kind == korvcatalogue::Kind::Index)
                continue;
            const ValueType type = column->syntax == Syntax::SnmpAdminString ? ValueType::Text
                                   : column->syntax == Syntax::Counter64     ? ValueType::Counter64
                                                                             : ValueType::Gauge32;
            for (uint32_t row = 1; row <= rows; ++row) {
                Oid oid(std::begin(korvagentx::kKorvsnmpArc), std::end(korvagentx::kKorvsnmpArc));
                oid.insert(oid.end(),
                           {korvagentx::kObjects, korvcatalogue::SnmpGroupOf(section), 1, column->snmpNumber, row});
                snapshot.entries.push_back({oid, {type, row, type == ValueType::Text ? "device" : ""}});
            }
        }
    std::sort(snapshot.entries.begin(), snapshot.entries.end(),
              [](const Entry &a, const Entry &b) { return a.oid < b.oid; });
    return snapshot;
}

// The names that a walk asks, in net-snmp's sub-identifiers.
std::vector<std::vector<oid>> Asked(const Snapshot &snapshot)
{
    std::vector<std::vector<oid>> asked;
    for (const Entry &entry : snapshot.entries)
        asked.emplace_back(entry.oid.begin(), entry.oid.end());
    return asked;
}

void FormerLookup(benchmark::State &state)
{
    const Snapshot snapshot = LargeSnapshot();
    const std::vector<std::vector<oid>> asked = Asked(snapshot);
    for (auto _ : state)
        for (const std::vector<oid> &name : asked) {
            const Oid key(name.begin(), name.end());
            auto found = std::upper_bound(snapshot.entries.begin(), snapshot.entries.end(), key,
                                          [](const Oid &k, const Entry &entry) { return k < entry.oid; });
            if (found != snapshot.entries.end()) {
                std::vector<oid> answer(found->oid.begin(), found->oid.end());
                benchmark::DoNotOptimize(answer.data());
            }
        }
    state.SetItemsProcessed(state.iterations() * static_cast<int64_t>(asked.size()));
}
BENCHMARK(FormerLookup);

void EncodedLookup(benchmark::State &state)
{
    const Snapshot snapshot = LargeSnapshot();
    const korvagentx::EncodedSnapshot encoded(snapshot);
    const std::vector<std::vector<oid>> asked = Asked(snapshot);
    for (auto _ : state)
        for (const std::vector<oid> &name : asked) {
            const korvagentx::EncodedObject *found = encoded.FindNext(name.data(), name.size());
            if (found != nullptr)
                benchmark::DoNotOptimize(encoded.Name(*found));
        }
    state.SetItemsProcessed(state.iterations() * static_cast<int64_t>(asked.size()));
}
BENCHMARK(EncodedLookup);

// Laying a snapshot out, once per sample.
void Encoding(benchmark::State &state)
{
    const Snapshot snapshot = LargeSnapshot();
    for (auto _ : state) {
        const korvagentx::EncodedSnapshot encoded(snapshot);
        benchmark::DoNotOptimize(encoded.Objects().data());
    }
}
BENCHMARK(Encoding);

}  // namespace

BENCHMARK_MAIN();
