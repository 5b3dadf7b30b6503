// The iSCSI LUN section of the statistics result: records renamed from the
// LUN's UUID to "uuid" and "lun_name".
#include "korvsnmp/fill_in_current_lun_io.h"

#include <deque>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include <korv_webapi.h>

#include "json_read.h"
#include "protocol/unit_log.h"

namespace {

constexpr char kLogUnit[] = "fill_in_current_lun_io";

constexpr char kLunApi[] = "KORV.Core.ISCSI.LUN";
constexpr int kLunApiVersion = 1;
constexpr char kLunListMethod[] = "list";
constexpr char kLunApiUser[] = "admin";

constexpr char kDeviceKey[] = "device";
constexpr char kUuidKey[] = "uuid";
constexpr char kLunNameKey[] = "lun_name";

// The LUN list's UUIDs and names, moved out of the web API's answer, and
// the names by UUID (viewed in `lunList`, whose elements never move).
// A later LUN with the same UUID replaces the earlier one's name.
struct LunNameMap {
    std::deque<std::pair<Json::Value, Json::Value>> lunList;  // UUID, name
    std::unordered_map<std::string_view, const Json::Value *> names;
};

// `key` is a string literal.
template <size_t N>
const Json::Value *Member(const Json::Value &object, const char (&key)[N])
{
    return object.find(key, key + N - 1);
}

// The member of an object that the caller may change (and so take apart).
template <size_t N>
Json::Value *Member(Json::Value &object, const char (&key)[N])
{
    return const_cast<Json::Value *>(object.find(key, key + N - 1));
}

std::string_view View(const Json::Value &text)
{
    const char *begin = nullptr;
    const char *end = nullptr;
    return text.getString(&begin, &end) ? std::string_view(begin, end - begin) : std::string_view();
}

// Every record must follow the record rule (json_read.h); otherwise nothing
// of `lunIO` may be rewritten. Collects each record's "device" (a null
// pointer where it has none) for the rewrite.
bool ReadDevices(const Json::Value &lunIO, std::vector<const Json::Value *> &devices)
{
    devices.reserve(lunIO.size());
    // By iterator, as the rewrite walks them: an index that a sparse array
    // lacks is neither checked nor rewritten.
    for (auto element = lunIO.begin(); element != lunIO.end(); ++element) {
        const Json::Value &record = *element;
        if (!korvread::IsRecord(record)) {
            KORVSNMP_LOG(LOG_ERR, "LunIO element %u is not an object", element.index());
            return false;
        }
        const Json::Value *device = record.isObject() ? Member(record, kDeviceKey) : nullptr;
        if (device != nullptr && !device->isString() && !device->isNull()) {
            KORVSNMP_LOG(LOG_ERR, "LunIO element %u: \"%s\" is not a string", element.index(),
                         kDeviceKey);
            return false;
        }
        devices.push_back(device);
    }
    return true;
}

// The web API answers "success" with a boolean; a value that is no boolean,
// number or null reads as false.
bool ReadsTrue(const Json::Value &value)
{
    return (value.isBool() || value.isNumeric() || value.isNull()) && value.asBool();
}

// Asks the web API for the LUN list and names its LUNs.
LunNameMap FetchLunNames()
{
    Json::Value answer;
    KORV::APIRunner::Exec(answer, kLunApi, kLunApiVersion, kLunListMethod, Json::Value(),
                          kLunApiUser);
    LunNameMap map;
    const Json::Value *success = answer.isObject() ? Member(std::as_const(answer), "success") : nullptr;
    if (success == nullptr || !ReadsTrue(*success)) {
        KORVSNMP_LOG(LOG_ERR, "Failed to list LUNs");
        return map;
    }
    Json::Value *data = Member(answer, "data");
    Json::Value *luns = data != nullptr && data->isObject() ? Member(*data, "luns") : nullptr;
    if (luns == nullptr || !luns->isArray()) {
        KORVSNMP_LOG(LOG_ERR, "LUNs json data not found");
        return map;
    }
    // The list grows as the answer's LUN objects go, so that the two are
    // never held whole at once.
    for (Json::Value &lun : *luns) {
        if (!lun.isObject())
            continue;
        Json::Value *name = Member(lun, "name");
        Json::Value *uuid = Member(lun, "uuid");
        if (name == nullptr || !name->isString() || uuid == nullptr || !uuid->isString())
            continue;
        // A moved string keeps its characters where they are: the view stays valid.
        map.lunList.emplace_back(std::move(*uuid), std::move(*name));
        map.names[View(map.lunList.back().first)] = &map.lunList.back().second;
        lun = Json::Value();  // what is left of it goes now, not with the whole answer
    }
    return map;
}

}  // namespace

namespace KORVSNMP {

bool FillInCurrentLunIO(Json::Value &lunIO)
{
    if (!lunIO.isArray()) {
        KORVSNMP_LOG(LOG_ERR, "LunIO is not array.");
        return false;
    }
    std::vector<const Json::Value *> devices;
    if (!ReadDevices(lunIO, devices))
        return false;
    if (lunIO.empty())
        return true;

    const LunNameMap map = FetchLunNames();
    const auto &names = map.names;

    Json::ArrayIndex index = 0;
    for (Json::Value &record : lunIO) {
        const Json::Value *device = devices[index++];
        const auto named = names.find(device != nullptr ? View(*device) : std::string_view());
        // "device" becomes "uuid": its string moves over before the member goes.
        Json::Value &uuid = record[kUuidKey];
        if (device != nullptr && device->isString())
            uuid = std::move(*const_cast<Json::Value *>(device));
        else
            uuid = "";  // no "device", or a null one
        if (device != nullptr)
            record.removeMember(kDeviceKey);
        record[kLunNameKey] = named != names.end() ? *named->second : uuid;
    }
    return true;
}

}  // namespace KORVSNMP
