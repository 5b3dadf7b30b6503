// A statistics result as OpenMetrics text, for node_exporter's textfile
// collector or a scrape.
#ifndef KORVSNMP_STAT_OPENMETRICS_FORMAT_H
#define KORVSNMP_STAT_OPENMETRICS_FORMAT_H

#include <ostream>
#include <string>

#include <json/value.h>

namespace korvstat {

// Writes one gauge family per counter of `result` (as SNMPParseReplyData
// fills it): korvsnmp_<section>_<counter>_<unit> with HELP, TYPE and UNIT
// lines, one sample per record, labelled device, display_name and type where
// the record has them (a LUN's uuid and lun_name as device and display_name);
// sizes in bytes; the sample time as korvsnmp_sample_timestamp_seconds; then
// "# EOF". Members of unknown meaning become unit-less families of their
// own name. Non-numeric values are left out, and so is a repeated series
// (the first stays). Label values are escaped and made valid UTF-8.
// Nothing throws but std::bad_alloc.
void WriteOpenMetrics(const Json::Value &result, std::ostream &out);

// `text` escaped for a label value: backslash, double quote and line feed
// escaped, bytes that are not UTF-8 replaced by U+FFFD.
std::string EscapeLabelValue(const std::string &text);

}  // namespace korvstat

#endif
