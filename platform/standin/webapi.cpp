// Stand-in for the web API runtime. It knows one method: "list" of
// "KORV.Core.ISCSI.LUN", answered from the description's LUN list.
#include <json/writer.h>

#include "standin_internal.h"

using korvstandin::Fault;
using korvstandin::detail::Current;
using korvstandin::detail::Domain;
using korvstandin::LunAnswer;
using korvstandin::Op;
using korvstandin::detail::Enter;

namespace {

constexpr char kLunApi[] = "KORV.Core.ISCSI.LUN";
constexpr char kListMethod[] = "list";
constexpr int kUnknownMethodError = 102;
constexpr int kRunFailedError = 117;

std::string Compact(const Json::Value &value)
{
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
    if (host.lunAnswer == LunAnswer::WithoutData)
        return response;
    Json::Value &data = response["data"] = Json::Value(Json::objectValue);
    if (host.lunAnswer == LunAnswer::WithoutLuns)
        return response;
    Json::Value &luns = data["luns"] = Json::Value(Json::arrayValue);
    for (const korvstandin::Lun &lun : host.luns) {
        Json::Value entry(Json::objectValue);
        if (!lun.uuid.isNull())
            entry["uuid"] = lun.uuid;
        if (!lun.name.isNull())
            entry["name"] = lun.name;
        luns.append(entry);
    }
    return response;
}

}  // namespace

namespace KORV {

int APIRunner::Exec(Json::Value &response, const std::string &api, int version,
                    const std::string &method, const Json::Value &params, const std::string &user)
{
    if (Enter(Op::APIRunnerExec, api, version, method, Compact(params),
              user) != Fault::None) {
        response = ErrorResponse(kRunFailedError);
        return -1;
    }
    if (api != kLunApi || method != kListMethod || version != 1) {
        response = ErrorResponse(kUnknownMethodError);
        return -1;
    }
    response = LunListResponse();
    return 0;
}

bool WebAPIUtil::JsonArrayHasString(const Json::Value &array, const std::string &name)
{
    if (Enter(Op::JsonArrayHasString, name) != Fault::None || !array.isArray())
        return false;
    for (const Json::Value &element : array)
        if (element.isString() && element.asString() == name)
            return true;
    return false;
}

}  // namespace KORV
