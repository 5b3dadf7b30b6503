// Assembly of the caller's statistics result from one collector reply.
#include <json/value.h>
#include <korv_webapi.h>

#include "korvsnmp/fill_in_current_disk_io.h"
#include "korvsnmp/fill_in_current_lun_io.h"
#include "korvsnmp/fill_in_current_memory.h"
#include "korvsnmp/fill_in_current_network.h"
#include "korvsnmp/fill_in_current_space_io.h"
#include "korvsnmp/parse_data.h"
#include "protocol/unit_log.h"

namespace {

constexpr char kLogUnit[] = "parse_data";
constexpr char kAllResources[] = "all";

// What a selected section of the reply's "data" must look like.
enum class Shape {
    OneElementArray,  // an array of exactly one element
    NonEmptyArray,    // an array of at least one element
    Present,          // any value; the fill-in function judges its shape
};

// Takes a section that passed its test over into the result.
using TakeOver = bool (*)(const Json::Value &section, Json::Value &result);

struct Section {
    const char *resource;  // the name that selects it in the request
    const char *member;    // its member of the reply's "data"
    Shape shape;
    TakeOver takeOver;
    const char *failure;   // logged when the section is missing or malformed
};

// In the order in which the result is filled.
const Section kSections[] = {
    {"cpu", "System", Shape::OneElementArray,
     [](const Json::Value &section, Json::Value &result) {
         result["cpu"] = section[0];
         return true;
     },
     "Failed to get CPU data"},
    {"memory", "Memory", Shape::OneElementArray,
     [](const Json::Value &section, Json::Value &result) {
         return KORVSNMP::FillInCurrentMemory(section[0], result["memory"]);
     },
     "Failed to get Memory data"},
    {"network", "Network", Shape::NonEmptyArray,
     [](const Json::Value &section, Json::Value &result) {
         return KORVSNMP::FillInCurrentNetwork(section, result["network"]);
     },
     "Failed to get Network data"},
    {"disk", "DiskIO", Shape::Present,
     [](const Json::Value &section, Json::Value &result) {
         return KORVSNMP::FillInCurrentDiskIO(section, result["disk"]);
     },
     "Failed to get DiskIO data"},
    {"space", "SpaceIO", Shape::Present,
     [](const Json::Value &section, Json::Value &result) {
         return KORVSNMP::FillInCurrentSpaceIO(section, result["space"]);
     },
     "Failed to get SpaceIO data"},
    {"lun", "iSCSI", Shape::Present,
     [](const Json::Value &section, Json::Value &result) {
         Json::Value &lun = result["lun"] = section;
         return KORVSNMP::FillInCurrentLunIO(lun);
     },
     "Failed to get ISCSI data"},
    {"nfs", "NFS", Shape::Present,
     [](const Json::Value &section, Json::Value &result) {
         result["nfs"] = section;
         return true;
     },
     "Failed to get NFS data"},
};

// `data` is an object or null.
bool PassesTest(const Json::Value &data, const Section &section)
{
    if (!data.isMember(section.member))
        return false;
    const Json::Value &value = data[section.member];
    switch (section.shape) {
    case Shape::OneElementArray:
        return value.isArray() && value.size() == 1;
    case Shape::NonEmptyArray:
        return value.isArray() && value.size() != 0;
    case Shape::Present:
        return true;
    }
    return false;
}

// Member lookups by key are defined on objects and null only.
bool IsObjectOrNull(const Json::Value &value) { return value.isObject() || value.isNull(); }

bool Assemble(const Json::Value &request, const Json::Value &reply, Json::Value &result)
{
    if (!IsObjectOrNull(request) || !IsObjectOrNull(reply) || !IsObjectOrNull(result)) {
        KORVSNMP_LOG(LOG_ERR, "Request, reply and result must be JSON objects (types %d, %d, %d)",
                     request.type(), reply.type(), result.type());
        return false;
    }
    const Json::Value &data = reply["data"];
    if (!IsObjectOrNull(data)) {
        KORVSNMP_LOG(LOG_ERR, "Reply data is not a JSON object (type %d)", data.type());
        return false;
    }

    Json::Value defaultList(Json::arrayValue);
    defaultList.append(kAllResources);
    const Json::Value &list = request.isMember("resource") ? request["resource"] : defaultList;
    const bool all = KORV::WebAPIUtil::JsonArrayHasString(list, kAllResources) || list.size() == 0;

    for (const Section &section : kSections) {
        if (!all && !KORV::WebAPIUtil::JsonArrayHasString(list, section.resource))
            continue;
        if (!PassesTest(data, section)) {
            KORVSNMP_LOG(LOG_ERR, "%s", section.failure);
            return false;
        }
        if (!section.takeOver(data[section.member], result))
            return false;  // the fill-in function has said why
    }

    if (!data.isMember("time")) {
        KORVSNMP_LOG(LOG_ERR, "Failed to get time data");
        return false;
    }
    result["time"] = data["time"];
    return true;
}

}  // namespace

bool SNMPParseReplyData(const Json::Value &request, const Json::Value &reply, Json::Value &result)
{
    try {
        return Assemble(request, reply, result);
    } catch (const Json::Exception &error) {
        // Only a platform answer could get here; the caller gets false, not the exception.
        KORVSNMP_LOG(LOG_ERR, "Failed to assemble the reply: %s", error.what());
        return false;
    }
}
