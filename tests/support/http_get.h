// One HTTP/1.0 GET to a server on the loopback, for the exporter's tests
// and its benchmark.
#ifndef KORVTEST_HTTP_GET_H
#define KORVTEST_HTTP_GET_H

#include <string>

namespace korvtest {

struct HttpReply {
    int status = 0;    // 0 when there was no reply
    std::string body;
};

// GET `target` (path and query) from 127.0.0.1:`port` with `headers`
// ("Name: value\r\n" each), read until the server closes.
HttpReply HttpGet(int port, const std::string &target, const std::string &headers = "");

// `text` with every byte but letters, digits and "-._~" percent-encoded.
std::string UrlEncode(const std::string &text);

// A TCP port on 127.0.0.1 that was free a moment ago.
int FreeLoopbackPort();

}  // namespace korvtest

#endif
