#include "exposition/exposition.h"

#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <cmath>
#include <limits>
#include <map>
#include <sstream>
#include <set>

#include "catalogue/statistics_catalogue.h"
#include "catalogue/utf8_text.h"

namespace korvexposition {

namespace {

using korvcatalogue::Kind;
using korvcatalogue::Section;
using korvcatalogue::Statistic;
using korvcatalogue::Unit;

constexpr char kTotalSuffix[] = "_total";
constexpr char kKindLabel[] = "kind";
constexpr uint64_t kBytesPerKiB = 1024;
constexpr uint64_t kBytesPerMiB = 1024 * 1024;
constexpr uint64_t kMillisecondsPerSecond = 1000;
constexpr uint64_t kPercentPerRatio = 100;
constexpr uint64_t kDefaultClockTicks = 100;

uint64_t ClockTicksPerSecond()
{
    static const uint64_t ticks = [] {
        const long value = sysconf(_SC_CLK_TCK);
        return value > 0 ? static_cast<uint64_t>(value) : kDefaultClockTicks;
    }();
    return ticks;
}

// How a unit becomes its base unit: times `multiplier` or divided by `divisor`.
struct Scale {
    uint64_t multiplier = 1;
    uint64_t divisor = 1;
    const char *unit = "";  // the base unit's name in OpenMetrics
};

Scale ScaleOf(Unit unit)
{
    switch (unit) {
    case Unit::Percent: return {1, kPercentPerRatio, "ratio"};
    case Unit::BytesPerSecond: return {1, 1, "bytes_per_second"};
    case Unit::KiB: return {kBytesPerKiB, 1, "bytes"};
    case Unit::Bytes: return {1, 1, "bytes"};
    case Unit::MiB: return {kBytesPerMiB, 1, "bytes"};
    case Unit::Milliseconds: return {1, kMillisecondsPerSecond, "seconds"};
    case Unit::ClockTicks: return {1, ClockTicksPerSecond(), "seconds"};
    case Unit::Seconds: return {1, 1, "seconds"};
    case Unit::None:
    case Unit::PerSecond:
    case Unit::Operations:
    case Unit::TimeTicks: return {};
    }
    return {};
}

std::string FloatText(double value)
{
    if (std::isnan(value))
        return "NaN";
    if (std::isinf(value))
        return value > 0 ? "+Inf" : "-Inf";
    char text[64];
    const auto written = std::to_chars(text, text + sizeof text, value);
    return std::string(text, written.ptr);
}

bool IsPowerOfTen(uint64_t value)
{
    while (value >= 10 && value % 10 == 0)
        value /= 10;
    return value == 1;
}

// `magnitude` scaled, exactly in decimal where that is possible.
std::string ScaledText(uint64_t magnitude, bool negative, const Scale &scale)
{
    const std::string sign = negative ? "-" : "";
    if (scale.divisor == 1) {
        if (magnitude <= std::numeric_limits<uint64_t>::max() / scale.multiplier)
            return sign + std::to_string(magnitude * scale.multiplier);
        return FloatText((negative ? -1.0 : 1.0) * static_cast<double>(magnitude) *
                         static_cast<double>(scale.multiplier));
    }
    if (!IsPowerOfTen(scale.divisor))
        return FloatText((negative ? -1.0 : 1.0) * static_cast<double>(magnitude) /
                         static_cast<double>(scale.divisor));
    std::string text = sign + std::to_string(magnitude / scale.divisor);
    std::string fraction = std::to_string(magnitude % scale.divisor + scale.divisor).substr(1);
    fraction.erase(fraction.find_last_not_of('0') + 1);
    return fraction.empty() ? text : text + "." + fraction;
}

// The sample value of `value` for `statistic`; false when it gives none.
bool ValueOf(const Json::Value &value, const Statistic &statistic, Sample &sample)
{
    const Scale scale = ScaleOf(statistic.unit);
    const bool counter = statistic.kind == Kind::Counter;
    if (value.type() == Json::uintValue ||
        (value.type() == Json::intValue && (!counter || value.asLargestInt() >= 0))) {
        const bool negative = value.type() == Json::intValue && value.asLargestInt() < 0;
        const uint64_t magnitude = negative ? 0 - static_cast<uint64_t>(value.asLargestInt())
                                            : static_cast<uint64_t>(value.asLargestUInt());
        sample.text = ScaledText(magnitude, negative, scale);
    } else if (value.type() == Json::realValue && !counter) {
        sample.text = FloatText(value.asDouble() * static_cast<double>(scale.multiplier) /
                                static_cast<double>(scale.divisor));
    } else {
        return false;
    }
    return true;
}

// The records of `section` in `result`.
std::vector<const Json::Value *> RecordsOf(Section section, const Json::Value &result)
{
    const auto member = [](const Json::Value &object, const char *name) -> const Json::Value * {
        if (!object.isObject())
            return nullptr;
        return object.find(name, name + std::char_traits<char>::length(name));
    };
    const auto objects = [](const Json::Value *array) {
        std::vector<const Json::Value *> records;
        if (array != nullptr && array->isArray())
            for (const Json::Value &element : *array)
                if (element.isObject())
                    records.push_back(&element);
        return records;
    };
    const Json::Value *holder = member(result, korvcatalogue::ResultMemberOf(section));
    switch (section) {
    case Section::Agent:
        if (result.isObject())
            return {&result};
        return {};
    case Section::Cpu:
    case Section::Memory:
    case Section::Nfs:
        if (holder != nullptr && holder->isObject())
            return {holder};
        return {};
    case Section::Disk: return objects(holder != nullptr ? member(*holder, "disk") : nullptr);
    case Section::Volume: return objects(holder != nullptr ? member(*holder, "volume") : nullptr);
    case Section::Interface:
    case Section::Lun: return objects(holder);
    case Section::DiskTotal:
    case Section::VolumeTotal: {
        const Json::Value *total = holder != nullptr ? member(*holder, "total") : nullptr;
        if (total != nullptr && total->isObject())
            return {total};
        return {};
    }
    }
    return {};
}

// The labels of `record`: the section's names that it has as strings.
std::vector<Label> LabelsOf(Section section, const Json::Value &record)
{
    std::vector<Label> labels;
    for (const Statistic *statistic : korvcatalogue::StatisticsOf(section)) {
        const bool names = statistic->kind == Kind::Name || statistic->kind == Kind::Enumeration;
        if (!names || statistic->member.empty())
            continue;
        const Json::Value *value = record.find(statistic->member.data(),
                                               statistic->member.data() + statistic->member.size());
        if (value != nullptr && value->isString())
            labels.push_back({statistic->member, korvcatalogue::ValidUtf8(value->asString())});
    }
    return labels;
}

// A fixed label as the catalogue writes it: name="value".
Label FixedLabel(const std::string &text)
{
    const size_t equals = text.find('=');
    std::string value = text.substr(equals + 1);
    if (value.size() >= 2 && value.front() == '"' && value.back() == '"')
        value = value.substr(1, value.size() - 2);
    return {text.substr(0, equals), value};
}

// The words that the help texts of a family's statistics begin with alike.
std::string CommonWords(const std::vector<const Statistic *> &statistics)
{
    const auto words = [](const std::string &text) {
        std::vector<std::string> all;
        std::istringstream stream(text);
        for (std::string word; stream >> word;)
            all.push_back(word);
        return all;
    };
    std::vector<std::string> common = words(statistics.front()->help);
    for (const Statistic *statistic : statistics) {
        const std::vector<std::string> other = words(statistic->help);
        const auto differ = std::mismatch(common.begin(), common.end(), other.begin(), other.end());
        common.erase(differ.first, common.end());
    }
    std::string text;
    for (const std::string &word : common)
        text += (text.empty() ? "" : " ") + word;
    return text;
}

// The families in the order of their first statistic; a family gathers the
// samples of every statistic that names it (the CPU modes), and its help is
// what their helps say alike.
class Builder {
public:
    void Add(const Statistic &statistic, const std::vector<const Json::Value *> &records,
             const std::vector<std::vector<Label>> &labels)
    {
        Family &family = FamilyOf(statistic);
        for (size_t i = 0; i < records.size(); ++i) {
            const Json::Value *value =
                records[i]->find(statistic.member.data(), statistic.member.data() + statistic.member.size());
            Sample sample{labels[i], ""};
            if (!statistic.metricLabel.empty())
                sample.labels.push_back(FixedLabel(statistic.metricLabel));
            if (value == nullptr || !ValueOf(*value, statistic, sample))
                continue;
            std::string series;
            for (const Label &label : sample.labels)
                series += label.name + '\0' + label.value + '\0';
            if (series_[family.name].insert(series).second)
                family.samples.push_back(std::move(sample));
        }
    }

    void AddValue(const Statistic &statistic, const Json::Value &value)
    {
        Family &family = FamilyOf(statistic);
        Sample sample{{}, ""};
        if (ValueOf(value, statistic, sample))
            family.samples.push_back(std::move(sample));
    }

    Exposition Finish()
    {
        Exposition exposition;
        for (Family &family : families_) {
            if (family.samples.empty())
                continue;
            const std::vector<const Statistic *> &statistics = statistics_[family.name];
            family.help = statistics.size() == 1
                              ? statistics.front()->help
                              : CommonWords(statistics) + " by " +
                                    FixedLabel(statistics.front()->metricLabel).name;
            family.help = std::string(korvcatalogue::TitleOf(statistics.front()->section)) + ": " +
                          family.help;
            exposition.push_back(std::move(family));
        }
        return exposition;
    }

private:
    Family &FamilyOf(const Statistic &statistic)
    {
        auto found = positions_.find(statistic.metric);
        if (found == positions_.end()) {
            const std::string unit = ScaleOf(statistic.unit).unit;
            const std::string suffix = "_" + unit;
            const bool named = !unit.empty() && statistic.metric.size() > suffix.size() &&
                               statistic.metric.compare(statistic.metric.size() - suffix.size(),
                                                        suffix.size(), suffix) == 0;
            families_.push_back({statistic.metric,
                                 statistic.kind == Kind::Counter ? FamilyType::Counter : FamilyType::Gauge,
                                 named ? unit : "", "", {}});
            found = positions_.emplace(statistic.metric, families_.size() - 1).first;
        }
        std::vector<const Statistic *> &statistics = statistics_[statistic.metric];
        if (statistics.empty() || statistics.back()->help != statistic.help)
            statistics.push_back(&statistic);
        return families_[found->second];
    }

    std::vector<Family> families_;
    std::map<std::string, size_t> positions_;
    std::map<std::string, std::vector<const Statistic *>> statistics_;
    std::map<std::string, std::set<std::string>> series_;
};

}  // namespace

Exposition BuildExposition(const Json::Value &result, const NetworkKinds &kinds)
{
    Builder builder;
    Section current = Section::Agent;
    std::vector<const Json::Value *> records;
    std::vector<std::vector<Label>> labels;
    bool first = true;
    for (const Statistic &statistic : korvcatalogue::Statistics()) {
        if (statistic.metric.empty() || statistic.member.empty())
            continue;
        if (first || statistic.section != current) {
            first = false;
            current = statistic.section;
            records.clear();
            labels.clear();
            const std::vector<const Json::Value *> all = RecordsOf(current, result);
            for (size_t i = 0; i < all.size(); ++i) {
                std::vector<Label> named = LabelsOf(current, *all[i]);
                if (current == Section::Interface) {
                    const Json::Value &device = (*all[i])["device"];
                    const InterfaceKind kind =
                        KindOf(i, device.isString() ? device.asString() : "", kinds);
                    if (kind == InterfaceKind::Total)
                        continue;
                    named.push_back({kKindLabel, KindName(kind)});
                }
                records.push_back(all[i]);
                labels.push_back(std::move(named));
            }
        }
        builder.Add(statistic, records, labels);
    }
    return builder.Finish();
}

Exposition BuildFrontEnd(const FrontEnd &frontEnd)
{
    using korvcatalogue::AgentStatistic;
    using korvcatalogue::AgentValue;
    Builder builder;
    if (frontEnd.snapshotAgeSeconds.has_value())
        builder.AddValue(AgentStatistic(AgentValue::SnapshotAge), Json::Value(*frontEnd.snapshotAgeSeconds));
    builder.AddValue(AgentStatistic(AgentValue::FailedSamples),
                     Json::Value(static_cast<Json::UInt64>(frontEnd.failedSamples)));
    builder.AddValue(AgentStatistic(AgentValue::SampleInterval), Json::Value(frontEnd.sampleIntervalSeconds));
    builder.AddValue(AgentStatistic(AgentValue::CollectorUp), Json::Value(frontEnd.collectorUp ? 1u : 0u));
    return builder.Finish();
}

std::string EscapeLabelValue(const std::string &text)
{
    const std::string valid = korvcatalogue::ValidUtf8(text);
    std::string escaped;
    escaped.reserve(valid.size());
    for (const char c : valid) {
        if (c == '\\')
            escaped += "\\\\";
        else if (c == '"')
            escaped += "\\\"";
        else if (c == '\n')
            escaped += "\\n";
        else
            escaped += c;
    }
    return escaped;
}

void WriteFamilies(const Exposition &exposition, TextFormat format, std::ostream &out)
{
    const bool openMetrics = format == TextFormat::OpenMetrics;
    for (const Family &family : exposition) {
        const bool counter = family.type == FamilyType::Counter;
        const std::string sampleName = counter ? family.name + kTotalSuffix : family.name;
        const std::string &described = openMetrics ? family.name : sampleName;
        out << "# HELP " << described << ' ' << family.help << '\n';
        out << "# TYPE " << described << (counter ? " counter\n" : " gauge\n");
        if (openMetrics && !family.unit.empty())
            out << "# UNIT " << described << ' ' << family.unit << '\n';
        for (const Sample &sample : family.samples) {
            out << sampleName;
            for (size_t i = 0; i < sample.labels.size(); ++i)
                out << (i == 0 ? "{" : ",") << sample.labels[i].name << "=\""
                    << EscapeLabelValue(sample.labels[i].value) << '"';
            out << (sample.labels.empty() ? " " : "} ") << sample.text << '\n';
        }
    }
}

void WriteOpenMetrics(const Exposition &exposition, std::ostream &out)
{
    WriteFamilies(exposition, TextFormat::OpenMetrics, out);
    out << "# EOF\n";
}

}  // namespace korvexposition
