// What a statistic's value reads as in korvsnmp-stat's tables, in the unit
// that the catalogue gives it.
#ifndef KORVSNMP_STAT_COUNTERS_H
#define KORVSNMP_STAT_COUNTERS_H

#include <string>

#include <json/value.h>

#include "catalogue/statistics_catalogue.h"

namespace korvstat {

// The cell of `value` for `statistic`, "" when it is no number (booleans are
// none): sizes and byte counts as df -h shows them ("1.5K"), or exact bytes
// when `rawNumbers`; byte rates in kB/s with two decimals, as iostat's
// "rkB/s"; everything else in its own unit, exactly.
std::string CellText(const Json::Value &value, const korvcatalogue::Statistic &statistic, bool rawNumbers);

// A byte count as df -h shows it: "512", "1.5K", "16G" (powers of 1024).
std::string HumanBytes(double bytes);

}  // namespace korvstat

#endif
