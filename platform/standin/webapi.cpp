// Stand-in for the web API runtime. It knows one method: "list" of
// "KORV.Core.ISCSI.LUN", answered from the description's LUN list.
#include <json/writer.h>

#include "standin_state.h"

using korvstandin::Fault;
using korvstandin::detail::Current;
using korvstandin::detail::Domain;
using korvstandin::LunAnswer;
using korvstandin::Op;
using korvstandin::detail::Enter;
using korvstandin::detail::Guarded;

namespace {

constexpr char kLunApi[] = "KORV.Core.ISCSI.LUN";
constexpr char kListMethod[] = "list";
constexpr int kUnknownMethodError = 102;
constexpr int kRunFailedError = 117;

// The parameters' compact text for the journal; nothing while it is off.
std::string JournalText(const Json::Value &value)
{
    if (!korvstandin::detail::JournalOn())
        return "";
    std::string text = Json::FastWriter().write(value);
    if (!text.empty() && text.back() == '\n')
        text.pop_back();
    return text;
}

Json::Value ErrorResponse(int code)
{
    Json::Value response(Json::objectValue);
    response["success"] = false;
    response["error"]["code"] = code;
    return response;
}

Json::Value LunListResponse()
{
    const korvstandin::HostDescription &host = Current(Domain::Luns);
    if (host.lunAnswer == LunAnswer::Unsuccessful)
        return ErrorResponse(kRunFailedError);
    Json::Value response(Json::objectValue);
    response["success"] = true;
    if (host.lunAnswer == LunAnswer::SuccessNotBoolean)
        response["success"] = "true";
    if (host.lunAnswer == LunAnswer::WithoutData)
        return response;
    Json::Value &data = response["data"] = Json::Value(Json::objectValue);
    if (host.lunAnswer == LunAnswer::WithoutLuns)
        return response;
    const bool byUuid = host.lunAnswer == LunAnswer::LunsNotArray;
    Json::Value &luns = data["luns"] = Json::Value(byUuid ? Json::objectValue : Json::arrayValue);
    for (const korvstandin::Lun &lun : host.luns) {
        Json::Value entry(Json::objectValue);
        if (!lun.uuid.isNull())
            entry["uuid"] = lun.uuid;
        if (!lun.name.isNull())
            entry["name"] = lun.name;
        if (byUuid)
            luns[lun.uuid.isString() ? lun.uuid.asString() : std::to_string(luns.size())] = entry;
        else
            luns.append(entry);
    }
    return response;
}

}  // namespace

namespace KORV {

int APIRunner::Exec(Json::Value &response, const std::string &api, int version,
                    const std::string &method, const Json::Value &params, const std::string &user)
{
    if (Enter(Op::APIRunnerExec, api, version, method, JournalText(params), user) != Fault::None) {
        response = ErrorResponse(kRunFailedError);
        return -1;
    }
    if (api != kLunApi || method != kListMethod || version != 1) {
        response = ErrorResponse(kUnknownMethodError);
        return -1;
    }
    const int result = Guarded(Op::APIRunnerExec, -1, [&] {
        response = LunListResponse();
        return 0;
    });
    if (result < 0)
        response = ErrorResponse(kRunFailedError);
    return result;
}

bool WebAPIUtil::JsonArrayHasString(const Json::Value &array, const std::string &name)
{
    if (Enter(Op::JsonArrayHasString, name) != Fault::None || !array.isArray())
        return false;
    for (const Json::Value &element : array) {
        const char *begin = nullptr;
        const char *end = nullptr;
        if (element.isString() && element.getString(&begin, &end) &&
            name.compare(0, std::string::npos, begin, static_cast<size_t>(end - begin)) == 0)
            return true;
    }
    return false;
}

}  // namespace KORV
