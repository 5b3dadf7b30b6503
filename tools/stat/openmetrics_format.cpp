#include "openmetrics_format.h"

#include <algorithm>
#include <set>
#include <vector>

#include "counters.h"

namespace korvstat {
namespace {

constexpr char kPrefix[] = "korvsnmp_";
constexpr char kReplacement[] = "\xEF\xBF\xBD";  // U+FFFD

struct Label {
    const char *name;
    const char *member;  // the record's member that gives its value
};

// One section of the result: where its records are and what names them.
struct Section {
    const char *metric;   // korvsnmp_<metric>_...
    const char *title;    // starts each HELP text
    std::vector<Label> labels;
    const std::vector<Counter> &counters;
};

struct Family {
    std::string name;
    std::string unit;
    std::string help;
    std::vector<std::string> samples;  // "{labels} value" or " value"
};

// Length of the valid UTF-8 sequence at `at`, 0 when there is none.
size_t Utf8Length(const std::string &text, size_t at)
{
    const auto byte = [&](size_t i) { return static_cast<unsigned char>(text[i]); };
    const unsigned char lead = byte(at);
    size_t length;
    unsigned char low = 0x80, high = 0xBF;  // bounds of the second byte
    if (lead < 0x80)
        return 1;
    if (lead >= 0xC2 && lead <= 0xDF)
        length = 2;
    else if (lead >= 0xE0 && lead <= 0xEF) {
        length = 3;
        low = lead == 0xE0 ? 0xA0 : 0x80;  // no overlong forms
        high = lead == 0xED ? 0x9F : 0xBF; // no surrogates
    } else if (lead >= 0xF0 && lead <= 0xF4) {
        length = 4;
        low = lead == 0xF0 ? 0x90 : 0x80;
        high = lead == 0xF4 ? 0x8F : 0xBF;  // nothing above U+10FFFF
    } else
        return 0;
    if (at + length > text.size() || byte(at + 1) < low || byte(at + 1) > high)
        return 0;
    for (size_t i = 2; i < length; ++i)
        if (byte(at + i) < 0x80 || byte(at + i) > 0xBF)
            return 0;
    return length;
}

// A member's name as a metric name part: [a-zA-Z0-9_], anything else '_'.
std::string MetricPart(const std::string &name)
{
    std::string part = name;
    for (char &c : part)
        if (!((c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9')))
            c = '_';
    return part;
}

std::string LabelSet(const Json::Value &record, const std::vector<Label> &labels)
{
    std::string set;
    for (const Label &label : labels) {
        const Json::Value &value = record[label.member];
        if (!value.isString())
            continue;
        set += set.empty() ? "{" : ",";
        set += std::string(label.name) + "=\"" + EscapeLabelValue(value.asString()) + "\"";
    }
    return set.empty() ? set : set + "}";
}

class Exposition {
public:
    // The samples of one section's `records` (objects; others are left out).
    void AddSection(const Section &section, const std::vector<const Json::Value *> &records)
    {
        const std::string stem = std::string(kPrefix) + section.metric + "_";
        for (const Counter &counter : section.counters) {
            Family &family = FamilyNamed(stem + counter.metric, counter.unitName,
                                         std::string(section.title) + ": " + counter.help);
            for (const Json::Value *record : records)
                AddSample(family, *record, section.labels, counter.member, counter.unit);
        }
        std::set<std::string> others;
        for (const Json::Value *record : records)
            for (const std::string &name : record->getMemberNames())
                if (!IsNamed(name, section))
                    others.insert(name);
        for (const std::string &name : others) {
            Family &family = FamilyNamed(stem + MetricPart(name), "",
                                         std::string(section.title) + ": the collector's member " +
                                             MetricPart(name) + ", unit unknown");
            for (const Json::Value *record : records)
                AddSample(family, *record, section.labels, name, Unit::PerSecond);
        }
    }

    void AddTime(const Json::Value &time)
    {
        Family &family = FamilyNamed(std::string(kPrefix) + "sample_timestamp_seconds", "seconds",
                                     "Time of the collector's sample, seconds since the epoch");
        const std::string value = ExactText(time, Unit::PerSecond);
        if (!value.empty())
            family.samples.push_back(" " + value);
    }

    void Write(std::ostream &out) const
    {
        for (const Family &family : families_) {
            if (family.samples.empty())
                continue;
            out << "# HELP " << family.name << ' ' << family.help << '\n';
            out << "# TYPE " << family.name << " gauge\n";
            if (!family.unit.empty())
                out << "# UNIT " << family.name << ' ' << family.unit << '\n';
            for (const std::string &sample : family.samples)
                out << family.name << sample << '\n';
        }
        out << "# EOF\n";
    }

private:
    static bool IsNamed(const std::string &name, const Section &section)
    {
        return std::any_of(section.labels.begin(), section.labels.end(),
                           [&](const Label &l) { return name == l.member; }) ||
               std::any_of(section.counters.begin(), section.counters.end(),
                           [&](const Counter &c) { return name == c.member; });
    }

    // The family of that name; a family that another member has taken
    // already (two members that read alike) is handed out, so that the
    // first member's samples stay and the others' repeat their series.
    Family &FamilyNamed(const std::string &name, const std::string &unit, const std::string &help)
    {
        for (Family &family : families_)
            if (family.name == name)
                return family;
        families_.push_back({name, unit, help, {}});
        return families_.back();
    }

    void AddSample(Family &family, const Json::Value &record, const std::vector<Label> &labels,
                   const std::string &member, Unit unit)
    {
        const std::string value = ExactText(record[member], unit);
        if (value.empty())
            return;
        const std::string labelSet = LabelSet(record, labels);
        if (!series_.insert(family.name + labelSet).second)
            return;
        family.samples.push_back(labelSet + " " + value);
    }

    std::vector<Family> families_;
    std::set<std::string> series_;
};

std::vector<const Json::Value *> Objects(const Json::Value &array)
{
    std::vector<const Json::Value *> objects;
    if (array.isArray())
        for (const Json::Value &element : array)
            if (element.isObject())
                objects.push_back(&element);
    return objects;
}

// The records of a section held as an object with a list and a "total".
std::vector<const Json::Value *> ListAndTotal(const Json::Value &section, const char *list)
{
    if (!section.isObject())
        return {};
    std::vector<const Json::Value *> records = Objects(section[list]);
    if (section["total"].isObject())
        records.push_back(&section["total"]);
    return records;
}

std::vector<const Json::Value *> IfObject(const Json::Value &value)
{
    if (value.isObject())
        return {&value};
    return {};
}

}  // namespace

std::string EscapeLabelValue(const std::string &text)
{
    std::string escaped;
    for (size_t at = 0; at < text.size();) {
        const size_t length = Utf8Length(text, at);
        if (length == 0) {
            escaped += kReplacement;
            ++at;
            continue;
        }
        if (text[at] == '\\')
            escaped += "\\\\";
        else if (text[at] == '"')
            escaped += "\\\"";
        else if (text[at] == '\n')
            escaped += "\\n";
        else
            escaped.append(text, at, length);
        at += length;
    }
    return escaped;
}

void WriteOpenMetrics(const Json::Value &result, std::ostream &out)
{
    const std::vector<Label> device = {{"device", "device"}};
    const std::vector<Label> disk = {{"device", "device"}, {"display_name", "display_name"},
                                     {"type", "type"}};
    const std::vector<Label> volume = {{"device", "device"}, {"display_name", "display_name"}};
    const std::vector<Label> lun = {{"device", "uuid"}, {"display_name", "lun_name"}};

    Exposition exposition;
    if (result.isObject()) {
        exposition.AddSection({"cpu", "CPU", {}, CpuCounters()}, IfObject(result["cpu"]));
        exposition.AddSection({"memory", "Memory", {}, MemoryCounters()},
                              IfObject(result["memory"]));
        exposition.AddSection({"network", "Network interface", device, NetworkCounters()},
                              Objects(result["network"]));
        exposition.AddSection({"disk", "Disk", disk, DeviceCounters()},
                              ListAndTotal(result["disk"], "disk"));
        exposition.AddSection({"volume", "Volume", volume, DeviceCounters()},
                              ListAndTotal(result["space"], "volume"));
        exposition.AddSection({"lun", "iSCSI LUN", lun, DeviceCounters()},
                              Objects(result["lun"]));
        exposition.AddSection({"nfs", "NFS server", {}, NfsCounters()}, IfObject(result["nfs"]));
        exposition.AddTime(result["time"]);
    }
    exposition.Write(out);
}

}  // namespace korvstat
