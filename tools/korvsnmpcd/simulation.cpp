#include "simulation.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <fstream>
#include <memory>
#include <sstream>

#include <json/reader.h>

#include "catalogue/statistics_catalogue.h"
#include "protocol/collector_protocol.h"
#include "protocol/unit_log.h"

namespace korvsnmpcd {
namespace {

constexpr char kLogUnit[] = "simulation";
constexpr char kDeviceMember[] = "device";
constexpr char kTotalDevice[] = "total";
constexpr double kPercent = 100;
constexpr double kMsPerSecond = 1000;
constexpr double kBytesPerMiB = 1048576;
constexpr double kBytesPerPacket = 1200;
constexpr double kTicksPerSecond = 100 * 8;  // USER_HZ on eight processors
constexpr double kUptime = 12 * 86400;       // counters start as after this long at average load
constexpr double kPi = 3.14159265358979323846;

using korvcatalogue::Kind;
using korvcatalogue::Section;
using korvcatalogue::Statistic;
using korvcatalogue::Unit;

// The reply's sections that the simulation moves, with the catalogue's
// section of their records. "Memory" keeps the file's sizes.
struct ReplySection {
    const char *name;
    Section records;
};
constexpr ReplySection kSections[] = {
    {"System", Section::Cpu},   {"Network", Section::Interface}, {"DiskIO", Section::Disk},
    {"SpaceIO", Section::Volume}, {"iSCSI", Section::Lun},       {"NFS", Section::Nfs},
};

uint64_t Hash(const std::string &text, uint64_t salt = 0)
{
    uint64_t hash = 14695981039346656037ull ^ salt;  // FNV-1a
    for (unsigned char c : text) {
        hash ^= c;
        hash *= 1099511628211ull;
    }
    return hash;
}

// A number from 0 to 1 that `hash` picks.
double Fraction(uint64_t hash)
{
    return static_cast<double>(hash % 1000003) / 1000003.0;
}

// The part of the file's average load that `device` carries over a long
// time: 0.25 to 1.75.
double Share(const std::string &device)
{
    return 0.25 + 1.5 * Fraction(Hash(device));
}

// How busy `device` is at `time`, in sample `sample`, relative to the file's
// average: its share, a slow swing (a period of 40 to 160 s) and a jitter of
// up to 15 % that is new in every sample.
double Level(const std::string &device, double time, unsigned long long sample)
{
    const uint64_t hash = Hash(device);
    const double share = Share(device);
    const double period = 40 + 120 * Fraction(hash >> 20);
    const double phase = 2 * kPi * Fraction(hash >> 40);
    const double swing = 1 + 0.5 * std::sin(2 * kPi * time / period + phase);
    const double jitter = 1 + 0.15 * (2 * Fraction(Hash(device, sample + 1)) - 1);
    return share * swing * jitter;
}

std::string FirstWord(const std::string &member)
{
    return member.substr(0, member.find('_'));
}

double Number(const Json::Value &record, const std::string &member)
{
    const Json::Value *value = record.find(member.data(), member.data() + member.size());
    return value != nullptr && value->isNumeric() ? value->asDouble() : 0;
}

// The rate or share in `statistics` of `kind` and `unit` whose member begins
// with `word`, or nullptr.
const Statistic *Sibling(const std::vector<const Statistic *> &statistics, Kind kind, Unit unit,
                         const std::string &word)
{
    for (const Statistic *statistic : statistics)
        if (statistic->kind == kind && statistic->unit == unit && FirstWord(statistic->member) == word)
            return statistic;
    return nullptr;
}

// What `counter` grows by per second in `record`, from the record's rates
// and shares as its catalogue entry relates them: bytes and operations by
// the rate of the same direction, time by the share, mebibytes by the bytes,
// packets by the bytes; errors and drops stay (a healthy appliance); a count
// without a rate of its own (SCSI commands) by every operation.
double Growth(const Statistic &counter, const std::vector<const Statistic *> &statistics,
              const Json::Value &record)
{
    const std::string word = FirstWord(counter.member);
    const auto value = [&record](const Statistic *of) { return of ? Number(record, of->member) : 0; };
    switch (counter.unit) {
    case Unit::ClockTicks:
        return value(Sibling(statistics, Kind::Share, Unit::Percent, word)) / kPercent * kTicksPerSecond;
    case Unit::Milliseconds:
        for (const Statistic *statistic : statistics)
            if (statistic->kind == Kind::Share)
                return value(statistic) / kPercent * kMsPerSecond;
        return 0;
    case Unit::Bytes:
        return value(Sibling(statistics, Kind::Rate, Unit::BytesPerSecond, word));
    case Unit::MiB:
        return value(Sibling(statistics, Kind::Rate, Unit::BytesPerSecond, word)) / kBytesPerMiB;
    case Unit::Operations: {
        if (const Statistic *rate = Sibling(statistics, Kind::Rate, Unit::PerSecond, word))
            return value(rate);
        if (const Statistic *bytes = Sibling(statistics, Kind::Rate, Unit::BytesPerSecond, word)) {
            const Statistic *first = Sibling(statistics, Kind::Counter, Unit::Operations, word);
            return first == &counter ? value(bytes) / kBytesPerPacket : 0;
        }
        double operations = 0;
        for (const Statistic *statistic : statistics)
            if (statistic->kind == Kind::Rate && statistic->unit == Unit::PerSecond)
                operations += value(statistic);
        return operations;
    }
    default:
        return 0;
    }
}

uint32_t Clamped(double value)
{
    return static_cast<uint32_t>(std::clamp(std::round(value), 0.0, 4294967295.0));
}

double RealTime()
{
    using namespace std::chrono;
    return duration<double>(system_clock::now().time_since_epoch()).count();
}

}  // namespace

Simulation::Simulation(std::string path, Clock clock)
    : path_(std::move(path)), clock_(clock ? std::move(clock) : Clock(RealTime))
{
}

bool Simulation::Load()
{
    std::ifstream in(path_, std::ios::binary);
    std::stringstream text;
    text << in.rdbuf();
    if (!in) {
        KORVSNMP_LOG(LOG_ERR, "Cannot read the appliance [%s]", path_.c_str());
        return false;
    }
    Json::CharReaderBuilder builder;
    builder["failIfExtra"] = true;
    std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    const std::string whole = text.str();
    std::string errors;
    bool parsed = false;
    try {
        parsed = reader->parse(whole.data(), whole.data() + whole.size(), &model_, &errors);
    } catch (const Json::Exception &) {
        errors = "nesting too deep";
    }
    if (!parsed || !model_.isObject() || !model_["data"].isObject()) {
        KORVSNMP_LOG(LOG_ERR, "The appliance [%s] holds no reply with a \"data\" object: %s", path_.c_str(),
                     errors.c_str());
        return false;
    }
    sampledAt_ = clock_();
    Sample(0);
    return true;
}

void Simulation::Tick()
{
    const double now = clock_();
    const double interval = std::max(now - sampledAt_, 0.0);
    sampledAt_ = now;
    Sample(interval);
}

void Simulation::Sample(double interval)
{
    ++samples_;
    current_ = model_;
    Json::Value &data = current_["data"];
    for (const ReplySection &section : kSections) {
        Json::Value &records = data[section.name];
        if (!records.isArray() && !records.isObject())
            continue;
        const Json::Value &averages = model_["data"][section.name];
        const std::vector<const Statistic *> statistics = korvcatalogue::StatisticsOf(section.records);
        Json::Value *total = nullptr;
        Json::ArrayIndex counted = 0;
        const bool single = records.isObject();
        for (Json::ArrayIndex i = 0; i < (single ? 1 : records.size()); ++i) {
            Json::Value &record = single ? records : records[i];
            const Json::Value &average = single ? averages : averages[i];
            if (!record.isObject())
                continue;
            const Json::Value *name = record.find(kDeviceMember, kDeviceMember + sizeof kDeviceMember - 1);
            const std::string device = name != nullptr && name->isString() ? name->asString()
                                                                            : std::string(section.name);
            if (device == kTotalDevice && section.records == Section::Volume) {
                total = &record;
                continue;
            }
            ++counted;
            const double level = Level(device, sampledAt_, samples_);
            double busy = 0;  // what the shares other than "idle" add up to
            const Statistic *idle = nullptr;
            for (const Statistic *statistic : statistics) {
                if (statistic->kind != Kind::Rate && statistic->kind != Kind::Share)
                    continue;
                if (!average.isMember(statistic->member))
                    continue;
                double value = Number(average, statistic->member) * level;
                if (statistic->kind == Kind::Share) {
                    if (section.records == Section::Cpu && FirstWord(statistic->member) == "idle") {
                        idle = statistic;
                        continue;
                    }
                    value = std::min(value, kPercent - busy);
                    if (section.records == Section::Cpu)
                        busy += std::round(value);
                }
                record[statistic->member] = Clamped(value);
            }
            if (idle != nullptr)
                record[idle->member] = Clamped(kPercent - busy);
            for (const Statistic *statistic : statistics) {
                if (statistic->kind != Kind::Counter || statistic->member.empty())
                    continue;
                const std::string key = std::string(section.name) + "/" + device + "/" + statistic->member;
                auto [counter, first] = totals_.try_emplace(key, 0.0);
                if (first)
                    counter->second = average.isMember(statistic->member)
                                          ? Number(average, statistic->member)
                                          : Growth(*statistic, statistics, average) * Share(device) * kUptime;
                counter->second += Growth(*statistic, statistics, record) * interval;
                record[statistic->member] = Json::UInt64(counter->second);
            }
        }
        if (total == nullptr)
            continue;
        // The volumes' total: the sums of the records, their mean utilization.
        const Json::Value rows = records;
        for (const Statistic *statistic : korvcatalogue::StatisticsOf(Section::VolumeTotal)) {
            double sum = 0;
            for (const Json::Value &row : rows)
                if (row.isObject() && row[kDeviceMember] != kTotalDevice)
                    sum += Number(row, statistic->member);
            if (statistic->kind == Kind::Counter)
                (*total)[statistic->member] = Json::UInt64(sum);
            else if (statistic->kind == Kind::Share)
                (*total)[statistic->member] = Clamped(counted ? sum / counted : 0);
            else if (statistic->kind == Kind::Rate)
                (*total)[statistic->member] = Clamped(sum);
        }
    }
    data["time"] = static_cast<Json::UInt64>(sampledAt_);
    reply_ = korvproto::CompactJson(current_);
}

}  // namespace korvsnmpcd
