// Assembly of the caller's statistics result from one collector reply.
#include <type_traits>
#include <utility>

#include <json/value.h>
#include <korv_webapi.h>

#include "korvsnmp/fill_in_current_disk_io.h"
#include "korvsnmp/fill_in_current_lun_io.h"
#include "korvsnmp/fill_in_current_memory.h"
#include "korvsnmp/fill_in_current_network.h"
#include "korvsnmp/fill_in_current_space_io.h"
#include "korvsnmp/parse_data.h"
#include "json_take.h"
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

// What is done with a section that passed its test.
enum class Action { Cpu, Memory, Network, Disk, Space, Lun, Nfs };

struct Section {
    const char *resource;  // the name that selects it in the request
    const char *member;    // its member of the reply's "data"
    Shape shape;
    Action action;
    const char *failure;   // logged when the section is missing or malformed
};

// In the order in which the result is filled.
const Section kSections[] = {
    {"cpu", "System", Shape::OneElementArray, Action::Cpu, "Failed to get CPU data"},
    {"memory", "Memory", Shape::OneElementArray, Action::Memory, "Failed to get Memory data"},
    {"network", "Network", Shape::NonEmptyArray, Action::Network, "Failed to get Network data"},
    {"disk", "DiskIO", Shape::Present, Action::Disk, "Failed to get DiskIO data"},
    {"space", "SpaceIO", Shape::Present, Action::Space, "Failed to get SpaceIO data"},
    {"lun", "iSCSI", Shape::Present, Action::Lun, "Failed to get ISCSI data"},
    {"nfs", "NFS", Shape::Present, Action::Nfs, "Failed to get NFS data"},
};

// Hands a reply section to a fill-in function that has a moving form.
template <typename Data, typename FillIn>
bool Hand(Data &section, Json::Value &out, FillIn fillIn)
{
    if constexpr (std::is_const_v<Data>)
        return fillIn(section, out);
    else
        return fillIn(std::move(section), out);
}

// Takes `section` over into the result. `Data` is const Json::Value (the
// reply is copied from) or Json::Value (the reply is taken apart).
template <typename Data>
bool TakeOver(Action action, Data &section, Json::Value &result)
{
    using korvsnmp::Take;
    switch (action) {
    case Action::Cpu:
        result["cpu"] = Take(section[0]);
        return true;
    case Action::Memory:
        return KORVSNMP::FillInCurrentMemory(std::as_const(section)[0], result["memory"]);
    case Action::Network:
        return KORVSNMP::FillInCurrentNetwork(std::as_const(section), result["network"]);
    case Action::Disk:
        return Hand(section, result["disk"], [](auto &&in, Json::Value &out) {
            return KORVSNMP::FillInCurrentDiskIO(std::forward<decltype(in)>(in), out);
        });
    case Action::Space:
        return Hand(section, result["space"], [](auto &&in, Json::Value &out) {
            return KORVSNMP::FillInCurrentSpaceIO(std::forward<decltype(in)>(in), out);
        });
    case Action::Lun: {
        Json::Value &lun = result["lun"] = Take(section);
        return KORVSNMP::FillInCurrentLunIO(lun);
    }
    case Action::Nfs:
        result["nfs"] = Take(section);
        return true;
    }
    return false;
}

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

// `Reply` is const Json::Value or Json::Value, as for TakeOver.
template <typename Reply>
bool Assemble(const Json::Value &request, Reply &reply, Json::Value &result)
{
    if (!IsObjectOrNull(request) || !IsObjectOrNull(reply) || !IsObjectOrNull(result)) {
        KORVSNMP_LOG(LOG_ERR, "Request, reply and result must be JSON objects (types %d, %d, %d)",
                     request.type(), reply.type(), result.type());
        return false;
    }
    Json::Value noData;
    Reply &data = reply.isMember("data") ? reply["data"] : noData;
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
        if (!TakeOver(section.action, data[section.member], result))
            return false;  // the fill-in function has said why
    }

    if (!data.isMember("time")) {
        KORVSNMP_LOG(LOG_ERR, "Failed to get time data");
        return false;
    }
    result["time"] = korvsnmp::Take(data["time"]);
    return true;
}

}  // namespace

namespace {

template <typename Reply>
bool AssembleCaught(const Json::Value &request, Reply &reply, Json::Value &result)
{
    try {
        return Assemble(request, reply, result);
    } catch (const Json::Exception &error) {
        // Only a platform answer could get here; the caller gets false, not the exception.
        KORVSNMP_LOG(LOG_ERR, "Failed to assemble the reply: %s", error.what());
        return false;
    }
}

}  // namespace

bool SNMPParseReplyData(const Json::Value &request, const Json::Value &reply, Json::Value &result)
{
    return AssembleCaught(request, reply, result);
}

bool SNMPParseReplyData(const Json::Value &request, Json::Value &&reply, Json::Value &result)
{
    return AssembleCaught(request, reply, result);
}
