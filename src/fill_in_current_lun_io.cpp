// The iSCSI LUN section of the statistics result: records renamed from the
// LUN's UUID to "uuid" and "lun_name".
#include "korvsnmp/fill_in_current_lun_io.h"

#include <map>
#include <string>

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

// LUN UUID -> LUN name.
using LunNameMap = std::map<std::string, std::string>;

// Every record must follow the record rule; otherwise nothing of `lunIO` may
// be rewritten.
bool RecordsAreReadable(const Json::Value &lunIO)
{
    for (Json::ArrayIndex index = 0; index < lunIO.size(); ++index) {
        const Json::Value &record = lunIO[index];
        if (!korvread::IsRecord(record)) {
            KORVSNMP_LOG(LOG_ERR, "LunIO element %u is not an object", index);
            return false;
        }
        std::string device;
        if (!korvread::ReadDeviceName(record, device)) {
            KORVSNMP_LOG(LOG_ERR, "LunIO element %u: \"%s\" is not a string", index, kDeviceKey);
            return false;
        }
    }
    return true;
}

// The web API answers "success" with a boolean; a value that is no boolean,
// number or null reads as false.
bool ReadsTrue(const Json::Value &value)
{
    return (value.isBool() || value.isNumeric() || value.isNull()) && value.asBool();
}

bool IsStringMember(const Json::Value &object, const char *key)
{
    return object.isMember(key) && object[key].isString();
}

LunNameMap FetchLunNames()
{
    Json::Value answer;
    KORV::APIRunner::Exec(answer, kLunApi, kLunApiVersion, kLunListMethod, Json::Value(),
                          kLunApiUser);
    const Json::Value &response = answer;

    LunNameMap names;
    if (!response.isObject() || !response.isMember("success") ||
        !ReadsTrue(response["success"])) {
        KORVSNMP_LOG(LOG_ERR, "Failed to list LUNs");
        return names;
    }
    const Json::Value &data = response["data"];
    if (!data.isObject() || !data.isMember("luns") || !data["luns"].isArray()) {
        KORVSNMP_LOG(LOG_ERR, "LUNs json data not found");
        return names;
    }
    for (const Json::Value &lun : data["luns"]) {
        if (lun.isObject() && IsStringMember(lun, "name") && IsStringMember(lun, "uuid"))
            names[lun["uuid"].asString()] = lun["name"].asString();
    }
    return names;
}

}  // namespace

namespace KORVSNMP {

bool FillInCurrentLunIO(Json::Value &lunIO)
{
    if (!lunIO.isArray()) {
        KORVSNMP_LOG(LOG_ERR, "LunIO is not array.");
        return false;
    }
    if (!RecordsAreReadable(lunIO))
        return false;
    if (lunIO.empty())
        return true;

    const LunNameMap names = FetchLunNames();
    for (Json::Value &record : lunIO) {
        Json::Value device;
        record.removeMember(kDeviceKey, &device);
        const std::string uuid = device.isString() ? device.asString() : std::string();
        const auto named = names.find(uuid);
        record[kUuidKey] = uuid;
        record[kLunNameKey] = named != names.end() ? named->second : uuid;
    }
    return true;
}

}  // namespace KORVSNMP
