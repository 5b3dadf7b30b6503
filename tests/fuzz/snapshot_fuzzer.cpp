// Arbitrary bytes as the library's result: when they parse as JSON, through
// BuildSnapshot three times with one memory (as samples follow each other),
// and as the row index file's text. Nothing may crash, throw or leak, and
// every snapshot must be what the front ends can serve: ascending OIDs of
// known objects, names of valid UTF-8 of at most 255 bytes, a layout for
// answering that finds each object with its value under its own name and the
// next one after it, the file text of the indexes read back as written.
#include "encoded_snapshot.h"  // net-snmp's configuration before its headers

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

#include <json/reader.h>

#include "catalogue/utf8_text.h"
#include "snapshot.h"
#include "syslog_capture.h"

namespace {

using namespace korvagentx;

constexpr int kStackLimit = 256;

void Require(bool condition)
{
    if (!condition)
        std::abort();
}

void Check(const Snapshot &snapshot)
{
    for (size_t i = 0; i < snapshot.entries.size(); ++i) {
        const Entry &entry = snapshot.entries[i];
        Require(i == 0 || snapshot.entries[i - 1].oid < entry.oid);
        Require(IsInstanceOfKnownObject(entry.oid));
        if (entry.value.type == ValueType::Text) {
            Require(entry.value.text.size() <= korvcatalogue::kAdminStringSize);
            Require(korvcatalogue::ValidUtf8(entry.value.text) == entry.value.text);
        }
    }
    const EncodedSnapshot encoded(snapshot);
    Require(encoded.Objects().size() == snapshot.entries.size());
    for (size_t i = 0; i < snapshot.entries.size(); ++i) {
        const Entry &entry = snapshot.entries[i];
        const std::vector<oid> name(entry.oid.begin(), entry.oid.end());
        const EncodedObject *found = encoded.Find(name.data(), name.size());
        Require(found == &encoded.Objects()[i]);
        Require(found->kind == entry.value.type);
        Require(found->number == entry.value.number);
        Require(std::string(encoded.Text(*found), found->textLength) == entry.value.text);
        const EncodedObject *next = encoded.FindNext(name.data(), name.size());
        Require(next == (i + 1 < encoded.Objects().size() ? &encoded.Objects()[i + 1] : nullptr));
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    korvtest::ClearLog();
    const char *text = reinterpret_cast<const char *>(data);
    TableIndexes fromText;
    std::string whyNot;
    if (ParseIndexText(std::string(text, size), fromText, whyNot))
        Require(ParseIndexText(IndexText(fromText), fromText, whyNot));

    Json::CharReaderBuilder builder;
    builder["stackLimit"] = kStackLimit;
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    Json::Value result;
    std::string errors;
    try {
        if (!reader->parse(text, text + size, &result, &errors))
            return 0;
    } catch (const Json::Exception &) {
        return 0;
    }
    const NetworkKinds kinds{{"bond0", "eth1"}, "ppp"};
    SampleMemory memory;
    for (uint32_t upTime : {100u, 200u, 300u})
        Check(BuildSnapshot(result, kinds, memory, 5, upTime, {}));
    TableIndexes read;
    Require(ParseIndexText(IndexText(memory.indexes), read, whyNot));
    Require(IndexText(read) == IndexText(memory.indexes));
    return 0;
}
