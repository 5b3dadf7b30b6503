// The daemon's answers: the statistics reply built from one interval's
// rates, and the answer to any request body.
#ifndef KORVSNMPCD_REPLY_H
#define KORVSNMPCD_REPLY_H

#include <string>
#include <string_view>

#include <json/json.h>

#include "rates.h"

namespace korvsnmpcd {

// {"data":{"System":[...],"Memory":[...],"Network":[...],"DiskIO":[...],
// "SpaceIO":[...],"iSCSI":[...],"NFS":{...},"time":N}}: the rates of `rates`,
// one record per device there, and from `sample` the memory sizes, the
// sample time and each record's cumulative counters (an empty counter gives
// no member). Member names come from the catalogue, matched to the values
// by the catalogue's order of a section's statistics.
Json::Value StatisticsReply(const Rates &rates, const Snapshot &sample);

// The same, as compact JSON text.
std::string StatisticsReplyText(const Rates &rates, const Snapshot &sample);

enum class RequestKind {
    kStatistics,       // any JSON object that is not a control request
    kControl,          // {"request":"reload"} or {"request":"history_mode","reason":...}
    kForbiddenControl, // a control request from a client that may not steer: refused
    kNotAnObject,      // anything else: refused
};

// The kind of one request body (JSON text; trailing NULs are ignored). A
// control request is kControl when `mayControl`, else kForbiddenControl.
// Logs each control request carried out (the reload, the history mode's
// reason); logs nothing for the others. Never throws but std::bad_alloc.
RequestKind ReadRequest(std::string_view body, bool mayControl = true);

// The reply body to a request of `kind`, kControl, kForbiddenControl or
// kNotAnObject: {"success":true}, or {"success":false,"error":...}.
std::string ControlReply(RequestKind kind);

}  // namespace korvsnmpcd

#endif
