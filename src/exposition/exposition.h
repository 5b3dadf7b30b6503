// A statistics result as metric families: what korvsnmp-stat writes as
// OpenMetrics text and korvsnmp-exporter serves, built once from the
// catalogue of statistics.
#ifndef KORVSNMP_EXPOSITION_EXPOSITION_H
#define KORVSNMP_EXPOSITION_EXPOSITION_H

#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include <json/value.h>

#include "exposition/network_kinds.h"

namespace korvexposition {

enum class FamilyType { Gauge, Counter };

struct Label {
    std::string name;
    std::string value;  // valid UTF-8, not escaped
};

struct Sample {
    std::vector<Label> labels;
    std::string text;  // the value as the text formats write it: exact where the input is
};

struct Family {
    std::string name;  // a counter's without its samples' "_total"
    FamilyType type;
    std::string unit;  // "" or the name's last words
    std::string help;
    std::vector<Sample> samples;  // at least one, no two with the same labels
};

using Exposition = std::vector<Family>;

// The families of `result` (as SNMPParseReplyData fills it; any shape), in
// the catalogue's order: every statistic with a metric name, one sample per
// record that has a usable value. Values are in base units: shares as ratios
// 0-1, KiB and MiB as bytes, milliseconds and clock ticks as seconds.
// Counters take only integers 0 to 2^64-1; another value (negative,
// fractional, a string, wider than 64 bits) or a missing one gives no
// sample, so a record without counters gives no counter samples. Gauges take
// any number but a boolean. Records are labelled by the catalogue's names
// (device, display_name, type, uuid, lun_name), as valid UTF-8; "network"
// rows by kind (`kinds`) too, its total left out (sum() gives it), as the
// disk and volume totals are. A record whose labels repeat an earlier one's
// gives nothing. Members the catalogue does not know are left out.
// Nothing throws but std::bad_alloc.
Exposition BuildExposition(const Json::Value &result, const NetworkKinds &kinds);

// What a front end that samples on its own adds about its sampling.
struct FrontEnd {
    std::optional<double> snapshotAgeSeconds;  // none before the first snapshot
    uint64_t failedSamples = 0;
    uint32_t sampleIntervalSeconds = 0;
    bool collectorUp = false;
};
Exposition BuildFrontEnd(const FrontEnd &frontEnd);

enum class TextFormat {
    OpenMetrics,  // HELP, TYPE and UNIT lines name the family; a counter's samples add "_total"
    Classic,      // Prometheus's text format 0.0.4: HELP and TYPE name a counter's "_total", no UNIT
};

// The families as text, each with its metadata lines, without an end.
void WriteFamilies(const Exposition &exposition, TextFormat format, std::ostream &out);

// The families as OpenMetrics text, then "# EOF".
void WriteOpenMetrics(const Exposition &exposition, std::ostream &out);

// `text` escaped for a label value: backslash, double quote and line feed
// escaped, bytes that are not UTF-8 replaced by U+FFFD.
std::string EscapeLabelValue(const std::string &text);

}  // namespace korvexposition

#endif
