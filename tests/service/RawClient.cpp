#include "tests/service/RawClient.h"

#include "tests/service/ServiceProcess.h"
#include "wire/FrameSplitter.h"

#include <array>

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

namespace tamblo::test {

namespace {

constexpr int kPatienceMilliseconds = 20'000;
constexpr int kSilenceMilliseconds = 50;

} // namespace

RawClient::RawClient(const std::string& socketPath)
    : socket_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    const sockaddr_un address = addressOf(socketPath);
    if (::connect(socket_, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        close();
    }
}

RawClient::~RawClient() {
    close();
}

void RawClient::close() {
    if (socket_ >= 0) {
        ::close(socket_);
        socket_ = -1;
    }
}

bool RawClient::sendBytes(std::string_view bytes) const {
    while (!bytes.empty()) {
        const ssize_t count = ::send(socket_, bytes.data(), bytes.size(), MSG_NOSIGNAL);
        if (count <= 0) {
            return false;
        }
        bytes.remove_prefix(static_cast<std::size_t>(count));
    }
    return true;
}

bool RawClient::sendItem(std::string_view item) const {
    std::string frame;
    for (std::size_t i = 0; i < wire::kLengthBytes; ++i) {
        frame += static_cast<char>(item.size() >> (8 * i));
    }
    return sendBytes(frame.append(item));
}

bool RawClient::send(const wire::Request& request) const {
    TextBuffer frame;
    return wire::appendRequestFrame(frame, request) && sendBytes(frame.view());
}

std::optional<wire::Reply> RawClient::receive() {
    for (;;) {
        wire::FrameSplitter frames(received_);
        if (const auto item = frames.next()) {
            auto reply = wire::decodeReply(*item);
            received_.erase(received_.begin(),
                            received_.end() - static_cast<std::ptrdiff_t>(frames.rest().size()));
            return reply;
        }
        pollfd descriptor{.fd = socket_, .events = POLLIN, .revents = 0};
        if (::poll(&descriptor, 1, kPatienceMilliseconds) != 1) {
            return std::nullopt;
        }
        std::array<std::uint8_t, 65536> bytes;
        const ssize_t count = ::recv(socket_, bytes.data(), bytes.size(), 0);
        if (count <= 0) {
            return std::nullopt;
        }
        received_.insert(received_.end(), bytes.begin(), bytes.begin() + count);
    }
}

std::optional<wire::Reply> RawClient::call(wire::Request request) {
    request.id = nextID_++;
    return send(request) ? receive() : std::nullopt;
}

bool RawClient::staysSilent() const {
    pollfd descriptor{.fd = socket_, .events = POLLIN, .revents = 0};
    return received_.empty() && ::poll(&descriptor, 1, kSilenceMilliseconds) == 0;
}

bool RawClient::isClosedByService() {
    std::array<std::uint8_t, 65536> bytes;
    for (;;) {
        pollfd descriptor{.fd = socket_, .events = POLLIN, .revents = 0};
        if (::poll(&descriptor, 1, kPatienceMilliseconds) != 1) {
            return false;
        }
        if (::recv(socket_, bytes.data(), bytes.size(), 0) <= 0) {
            return true;
        }
    }
}

wire::Request request(wire::Method method, std::int64_t reporterID) {
    wire::Request request;
    request.method = method;
    request.reporterID = reporterID;
    return request;
}

wire::Request message(Dictionary payload, std::vector<std::int64_t> reporterIDs, std::uint32_t category,
                      std::uint16_t type) {
    wire::Request request;
    request.method = wire::Method::sendMessage;
    request.dictionary = std::move(payload);
    request.category = category;
    request.type = type;
    request.reporterIDs = std::move(reporterIDs);
    return request;
}

void startSession(RawClient& client, std::int64_t reporterID, std::uint16_t serviceType) {
    client.call(request(wire::Method::createReportingSession, reporterID));
    wire::Request type = request(wire::Method::setServiceType, reporterID);
    type.serviceType = serviceType;
    client.call(type);
    wire::Request start = request(wire::Method::startReportingSessionForID, reporterID);
    start.id = 1'000'000 + static_cast<std::uint64_t>(reporterID);
    client.send(start);
    // The start itself is not answered yet: what comes behind it shows that it has been carried out.
    client.call(request(wire::Method::reporterID, reporterID));
}

} // namespace tamblo::test
