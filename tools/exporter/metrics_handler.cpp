#include "metrics_handler.h"

#include <civetweb.h>

#include <cstring>
#include <string>

namespace korvexporter {

namespace {

constexpr char kOpenMetricsType[] = "application/openmetrics-text";
constexpr int kOk = 200;
constexpr int kMethodNotAllowed = 405;

const SnapshotExporter *served = nullptr;

int BeginRequest(mg_connection *connection)
{
    const mg_request_info *request = mg_get_request_info(connection);
    if (served == nullptr || request == nullptr || request->local_uri == nullptr ||
        std::strcmp(request->local_uri, kMetricsPath) != 0)
        return 0;
    const bool head = std::strcmp(request->request_method, "HEAD") == 0;
    if (!head && std::strcmp(request->request_method, "GET") != 0) {
        mg_send_http_error(connection, kMethodNotAllowed, "%s", "Only GET and HEAD\n");
        return kMethodNotAllowed;
    }
    const korvexposition::TextFormat format = FormatFor(mg_get_header(connection, "Accept"));
    const std::string body = served->Render(format);
    mg_send_http_ok(connection, ContentTypeOf(format), static_cast<long long>(body.size()));
    if (!head)
        mg_write(connection, body.data(), body.size());
    return kOk;
}

}  // namespace

korvexposition::TextFormat FormatFor(const char *accept)
{
    return accept != nullptr && std::strstr(accept, kOpenMetricsType) != nullptr
               ? korvexposition::TextFormat::OpenMetrics
               : korvexposition::TextFormat::Classic;
}

const char *ContentTypeOf(korvexposition::TextFormat format)
{
    return format == korvexposition::TextFormat::OpenMetrics
               ? "application/openmetrics-text; version=1.0.0; charset=utf-8"
               : "text/plain; version=0.0.4; charset=utf-8";
}

CivetCallbacks MetricsCallbacks(const SnapshotExporter &exporter)
{
    served = &exporter;
    CivetCallbacks callbacks{};
    callbacks.begin_request = BeginRequest;
    return callbacks;
}

}  // namespace korvexporter
