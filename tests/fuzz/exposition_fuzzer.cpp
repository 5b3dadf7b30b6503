// Arbitrary bytes as a statistics result: when they parse as JSON, through
// the OpenMetrics exposition and korvsnmp-stat's tables, with aggregations
// and a PPPoE link among the network rows. Nothing may crash, throw or
// leak, and the exposition must stay valid UTF-8 and end with "# EOF".
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <sstream>

#include <json/reader.h>

#include "catalogue/utf8_text.h"
#include "exposition/exposition.h"
#include "table_format.h"

namespace {

constexpr int kStackLimit = 256;  // below the depth at which jsoncpp throws
constexpr char kEnd[] = "# EOF\n";

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    Json::CharReaderBuilder builder;
    builder["stackLimit"] = kStackLimit;
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    const char *text = reinterpret_cast<const char *>(data);
    Json::Value result;
    try {
        if (!reader->parse(text, text + size, &result, nullptr))
            return 0;
    } catch (const Json::Exception &) {
        return 0;
    }
    const korvexposition::NetworkKinds kinds{{"bond0", "bond1"}, "ppp"};
    std::ostringstream metrics;
    korvexposition::WriteOpenMetrics(korvexposition::BuildExposition(result, kinds), metrics);
    const std::string exposition = metrics.str();
    const size_t endLength = sizeof kEnd - 1;
    if (korvcatalogue::ValidUtf8(exposition) != exposition || exposition.size() < endLength ||
        exposition.compare(exposition.size() - endLength, endLength, kEnd) != 0)
        std::abort();
    std::ostringstream tables;
    korvstat::WriteTables(result, size % 2 == 0, tables);
    return 0;
}
