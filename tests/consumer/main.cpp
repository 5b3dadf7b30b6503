// A program built against an installed korvsnmp: it asks for nothing but the
// time of a reply, and checks that a Transmitor without a host name refuses.
#include <cstdio>

#include <json/reader.h>
#include <korvsnmp/korvsnmp.h>

int main()
{
    Json::Value request, reply, result;
    request["resource"].append("bogus");
    Json::Reader().parse(R"({"data": {"time": 42}})", reply);
    Transmitor transmitor("");
    if (!SNMPParseReplyData(request, reply, result) || result["time"].asInt() != 42 ||
        transmitor.Transmit(request) != -1) {
        std::puts("korvsnmp consumer: unexpected answer");
        return 1;
    }
    std::puts("korvsnmp consumer: ok");
    return 0;
}
