#include "http_get.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cctype>
#include <cstdio>
#include <cstdlib>

#include "protocol/unique_fd.h"

namespace korvtest {

namespace {

sockaddr_in Loopback(int port)
{
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(static_cast<uint16_t>(port));
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    return address;
}

}  // namespace

HttpReply HttpGet(int port, const std::string &target, const std::string &headers)
{
    korvproto::UniqueFd fd(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const sockaddr_in address = Loopback(port);
    if (!fd.Valid() || connect(fd.Get(), reinterpret_cast<const sockaddr *>(&address), sizeof address) != 0)
        return {};
    const std::string request = "GET " + target + " HTTP/1.0\r\nHost: 127.0.0.1\r\n" + headers + "\r\n";
    if (send(fd.Get(), request.data(), request.size(), MSG_NOSIGNAL) != static_cast<ssize_t>(request.size()))
        return {};
    std::string response;
    char buffer[65536];
    for (ssize_t got; (got = recv(fd.Get(), buffer, sizeof buffer, 0)) > 0;)
        response.append(buffer, static_cast<size_t>(got));
    const size_t headerEnd = response.find("\r\n\r\n");
    HttpReply reply;
    if (headerEnd == std::string::npos || std::sscanf(response.c_str(), "HTTP/%*s %d", &reply.status) != 1)
        return {};
    reply.body = response.substr(headerEnd + 4);
    return reply;
}

std::string UrlEncode(const std::string &text)
{
    std::string encoded;
    for (const unsigned char c : text) {
        if (std::isalnum(c) || c == '-' || c == '.' || c == '_' || c == '~') {
            encoded += static_cast<char>(c);
        } else {
            char escape[4];
            std::snprintf(escape, sizeof escape, "%%%02X", c);
            encoded += escape;
        }
    }
    return encoded;
}

int FreeLoopbackPort()
{
    korvproto::UniqueFd fd(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_in address = Loopback(0);
    socklen_t length = sizeof address;
    if (!fd.Valid() || bind(fd.Get(), reinterpret_cast<const sockaddr *>(&address), sizeof address) != 0 ||
        getsockname(fd.Get(), reinterpret_cast<sockaddr *>(&address), &length) != 0)
        return 0;
    return ntohs(address.sin_port);
}

}  // namespace korvtest
