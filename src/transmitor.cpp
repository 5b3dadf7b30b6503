// The collector client object: request and reply frames, whole exchanges,
// and the collector control requests.
#include <sys/select.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <utility>

#include <json/reader.h>

#include "korvsnmp/transmitor.h"
#include "protocol/collector_protocol.h"
#include "protocol/unique_fd.h"
#include "protocol/unit_log.h"

namespace {

constexpr char kLogUnit[] = "transmitor";

constexpr timeval kWritableWait = {10, 500000};
constexpr timeval kReadableWait = {90, 0};
constexpr size_t kLengthPrefixSize = korvproto::kFramePrefixBytes;
constexpr size_t kReplyReadSize = 1024;
// Room for the announced reply is made at once up to this size; an
// announcement beyond it (a hostile or broken peer) grows as bytes arrive.
constexpr int64_t kReplyReserveLimit = 4 << 20;

constexpr char kControlHostName[] = "localhost";

// Closes the connection that `fd` holds, if any, and marks it closed: the
// one place where the object's descriptor is closed.
void CloseConnection(int &fd) { korvproto::UniqueFd(std::exchange(fd, -1)).Reset(); }

// Closes the connection in `fd` when the scope ends, whether by return or by
// an exception, unless KeepOpen() was called.
class ConnectionScope {
public:
    explicit ConnectionScope(int &fd) : fd_(fd) {}
    ~ConnectionScope()
    {
        if (!keepOpen_)
            CloseConnection(fd_);
    }
    ConnectionScope(const ConnectionScope &) = delete;
    ConnectionScope &operator=(const ConnectionScope &) = delete;

    void KeepOpen() { keepOpen_ = true; }

private:
    int &fd_;
    bool keepOpen_ = false;
};

enum class Direction { Send, Receive };

// The wait before a frame moves: at most 10.5 s for writability before
// sending, 90 s for readability before receiving. True when the caller may go
// on; otherwise the reason is logged, except a silent collector's.
bool WaitUntilReady(int fd, Direction direction)
{
    if (fd < 0) {
        KORVSNMP_LOG(LOG_ERR, "Bad parameter");
        return false;
    }
    // select() watches descriptors below FD_SETSIZE only: FD_SET on a higher
    // one would write past the set.
    if (fd >= FD_SETSIZE) {
        KORVSNMP_LOG(LOG_ERR, "socket descriptor %d is beyond select()'s limit of %d", fd,
                     FD_SETSIZE);
        return false;
    }
    const bool sending = direction == Direction::Send;
    timeval wait = sending ? kWritableWait : kReadableWait;
    fd_set set;
    FD_ZERO(&set);
    FD_SET(fd, &set);
    const int result =
        select(fd + 1, sending ? nullptr : &set, sending ? &set : nullptr, nullptr, &wait);
    if (result < 0 || (result == 0 && sending)) {
        KORVSNMP_LOG(LOG_ERR, "select() failed. ret=[%d]", result);
        return false;
    }
    if (result == 0)  // the collector kept silent for the whole wait
        return false;
    if (sending && !FD_ISSET(fd, &set)) {
        KORVSNMP_LOG(LOG_ERR, "socket is unwritable");
        return false;
    }
    return true;
}

// Writes all `size` bytes with one call. The collector may have gone away:
// MSG_NOSIGNAL turns the SIGPIPE that would end the caller into an error.
bool SendWhole(int fd, const void *data, size_t size)
{
    return send(fd, data, size, MSG_NOSIGNAL) == static_cast<ssize_t>(size);
}

bool IsSuccessReply(const Json::Value &reply)
{
    if (!reply.isObject())
        return false;
    const Json::Value &success = reply["success"];
    return success.isBool() && success.asBool();
}

// Runs one control exchange on a Transmitor of its own and judges the reply.
bool SendControlRequest(const Json::Value &request)
{
    Json::Value reply(Json::objectValue);
    Transmitor transmitor(kControlHostName);

    if (transmitor.Transmit(request) == -1) {
        KORVSNMP_LOG(LOG_ERR, "Failed to send request to korvsnmpcd, request: [%s]",
                     korvproto::CompactJson(request).c_str());
        return false;
    }
    if (transmitor.GetDataJson(reply) == -1) {
        KORVSNMP_LOG(LOG_ERR, "Failed to get response from korvsnmpcd, request: [%s]",
                     korvproto::CompactJson(request).c_str());
        return false;
    }
    if (IsSuccessReply(reply))
        return true;
    KORVSNMP_LOG(LOG_ERR, "Failed to send request: [%s], result: [%s]",
                 korvproto::CompactJson(request).c_str(), korvproto::CompactJson(reply).c_str());
    return false;
}

}  // namespace

Transmitor::Transmitor(const std::string &name) : hostName(name), dataStr(), socketFd(-1) {}

Transmitor::~Transmitor() { CloseConnection(socketFd); }

int Transmitor::SetHostName(const std::string &name)
{
    if (name.empty()) {
        KORVSNMP_LOG(LOG_ERR, "Error: Wrong parameter");
        return -1;
    }
    hostName = name;
    return 0;
}

int Transmitor::Transmit(const Json::Value &request)
{
    CloseConnection(socketFd);  // never leak a connection that a caller left open
    const ConnectionScope connection(socketFd);  // closed on every way out
    if (hostName.empty()) {
        KORVSNMP_LOG(LOG_ERR, "wrong parameter");
        return -1;
    }
    socketFd = SocketInit();
    if (socketFd < 0)
        return -1;
    if (TransmitData(request) < 0) {
        KORVSNMP_LOG(LOG_ERR, "Error: cannot transmit the data");
        return -1;
    }
    if (ReceiveData() < 0) {
        KORVSNMP_LOG(LOG_ERR, "Error: cannot received the data");
        return -1;
    }
    return 0;
}

int Transmitor::GetDataStr(std::string &text) const
{
    if (dataStr.empty()) {
        KORVSNMP_LOG(LOG_ERR, "Error: wrong member data inside");
        return -1;
    }
    text = dataStr;
    return 0;
}

int Transmitor::GetDataJson(Json::Value &value) const
{
    Json::Reader reader;
    if (dataStr.empty()) {
        KORVSNMP_LOG(LOG_ERR, "Error: wrong member data inside");
        return -1;
    }
    std::string errors;
    try {
        // Parsed where it lies: the string form would copy the whole text first.
        if (reader.parse(dataStr.data(), dataStr.data() + dataStr.size(), value, true))
            return 0;
        errors = reader.getFormattedErrorMessages();
    } catch (const Json::Exception &error) {
        // The reader gives up on very deep nesting by throwing.
        errors = error.what();
    }
    KORVSNMP_LOG(LOG_ERR, "Error: cannot convert the string to json format %s", errors.c_str());
    return -1;
}

int Transmitor::TransmitData(const Json::Value &request)
{
    ConnectionScope connection(socketFd);
    if (!WaitUntilReady(socketFd, Direction::Send))
        return -1;
    // The prefix and the text (with its NUL) go out in one call each.
    const std::string frame = korvproto::EncodeRequestFrame(request);
    if (!SendWhole(socketFd, frame.data(), kLengthPrefixSize) ||
        !SendWhole(socketFd, frame.data() + kLengthPrefixSize, frame.size() - kLengthPrefixSize)) {
        KORVSNMP_LOG(LOG_ERR, "Failed to send command.");
        return -1;
    }
    connection.KeepOpen();
    return 0;
}

int Transmitor::ReceiveData()
{
    ConnectionScope connection(socketFd);
    if (!WaitUntilReady(socketFd, Direction::Receive))
        return -1;

    dataStr.clear();
    unsigned char prefix[kLengthPrefixSize];
    if (read(socketFd, prefix, sizeof prefix) != static_cast<ssize_t>(sizeof prefix)) {
        KORVSNMP_LOG(LOG_ERR, "client Failed to read action");
        return -1;
    }
    const int32_t length = static_cast<int32_t>(korvproto::DecodeFramePrefix(prefix));

    // Every read asks for a whole piece: bytes that arrive beyond the length
    // in the same burst are kept too. The body is gathered apart, so that a
    // failure never leaves half a reply behind.
    std::string body;
    body.reserve(static_cast<size_t>(std::clamp<int64_t>(length, 0, kReplyReserveLimit)));
    char piece[kReplyReadSize];
    for (int64_t missing = length; missing > 0;) {
        const ssize_t received = read(socketFd, piece, sizeof piece);
        if (received <= 0) {
            KORVSNMP_LOG(LOG_ERR, "client Failed to read the reply body, %lld of %d bytes missing",
                         static_cast<long long>(missing), length);
            return -1;
        }
        body.append(piece, static_cast<size_t>(received));
        missing -= received;
    }
    dataStr = std::move(body);
    connection.KeepOpen();
    return 0;
}

bool Transmitor::EnterHistoryMode(std::string reason)
{
    Json::Value request(Json::objectValue);
    request["request"] = "history_mode";
    request["reason"] = reason;
    return SendControlRequest(request);
}

bool Transmitor::Reload()
{
    Json::Value request(Json::objectValue);
    request["request"] = "reload";
    return SendControlRequest(request);
}
