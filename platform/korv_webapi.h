// The appliance's web API runtime.
//
// Declarations only: on the appliance the web API runtime defines these;
// elsewhere the stand-in libkorvplatform.so.1 does.
#ifndef KORV_PLATFORM_WEBAPI_H
#define KORV_PLATFORM_WEBAPI_H

#include <string>

#include <json/value.h>

namespace KORV {

class APIRunner {
public:
    // Runs `method` of web API `api` (version `version`) with `params` as
    // `user`, and writes the method's response object into `response`.
    // The response's "success" tells the outcome; the result is 0 when the
    // method ran, negative otherwise.
    static int Exec(Json::Value &response, const std::string &api, int version,
                    const std::string &method, const Json::Value &params,
                    const std::string &user);
};

class WebAPIUtil {
public:
    // True when `array` holds a string element equal to `name`.
    static bool JsonArrayHasString(const Json::Value &array, const std::string &name);
};

}  // namespace KORV

#endif
