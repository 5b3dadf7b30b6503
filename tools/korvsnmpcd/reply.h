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
// "SpaceIO":[...],"iSCSI":[],"NFS":{...},"time":N}}; `sample` gives the
// memory sizes, the sample time and which devices exist.
Json::Value StatisticsReply(const Rates &rates, const Snapshot &sample);

// The same, as compact JSON text.
std::string StatisticsReplyText(const Rates &rates, const Snapshot &sample);

// The reply body to one request body (JSON text; trailing NULs are ignored):
// {"request":"reload"} and {"request":"history_mode","reason":...} are
// answered {"success":true} and logged; any other JSON object is a
// statistics request, answered with `statisticsReply`; anything else is
// answered {"success":false,"error":...}. Never throws but std::bad_alloc.
std::string AnswerRequest(std::string_view body, const std::string &statisticsReply);

}  // namespace korvsnmpcd

#endif
