#include "tests/service/RawClient.h"

#include "tests/Sockets.h"
#include "wire/FrameSplitter.h"

#include <array>
#include <cerrno>

#include <poll.h>
#include <unistd.h>

namespace tamblo::test {

namespace {

constexpr int kPatienceMilliseconds = 20'000;
constexpr int kSilenceMilliseconds = 50;
/// Above those that `call` gives.
constexpr std::uint64_t kStartID = 1'000'000;

bool isReadable(int socket, int milliseconds) {
    pollfd descriptor{.fd = socket, .events = POLLIN, .revents = 0};
    return ::poll(&descriptor, 1, milliseconds) == 1;
}

} // namespace

wire::Request request(Method method, std::int64_t reporterID) {
    wire::Request request;
    request.method = method;
    request.reporterID = reporterID;
    return request;
}

wire::Request message(Dictionary payload, std::vector<std::int64_t> reporterIDs, std::uint32_t category,
                      std::uint16_t type) {
    wire::Request request;
    request.method = Method::sendMessage;
    request.dictionary = std::move(payload);
    request.category = category;
    request.type = type;
    request.reporterIDs = std::move(reporterIDs);
    return request;
}

std::string framesOf(wire::Request request, std::uint64_t firstID, std::size_t count) {
    TextBuffer frames;
    for (std::size_t i = 0; i < count; ++i) {
        request.id = firstID + i;
        (void)wire::appendRequestFrame(frames, request);
    }
    return std::string(frames.view());
}

RawClient::RawClient(const std::string& socketPath)
    : socket_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    const sockaddr_un address = addressOf(socketPath);
    // What fails here fails again with the first bytes that are sent.
    (void)::connect(socket_, reinterpret_cast<const sockaddr*>(&address), sizeof address);
}

RawClient::~RawClient() {
    ::close(socket_);
}

bool RawClient::send(std::string_view bytes) const {
    while (!bytes.empty()) {
        const ssize_t count = ::send(socket_, bytes.data(), bytes.size(), MSG_NOSIGNAL);
        if (count <= 0) {
            return false;
        }
        bytes.remove_prefix(static_cast<std::size_t>(count));
    }
    return true;
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
        std::array<std::uint8_t, 65536> bytes;
        const bool isWaiting = isReadable(socket_, kPatienceMilliseconds);
        const ssize_t count = isWaiting ? ::recv(socket_, bytes.data(), bytes.size(), 0) : 0;
        if (count <= 0) {
            return std::nullopt;
        }
        received_.insert(received_.end(), bytes.begin(), bytes.begin() + count);
    }
}

std::size_t RawClient::receiveAll(std::uint64_t leastID) {
    std::size_t count = 0;
    for (auto reply = receive(); reply; reply = receive()) {
        count += reply->id >= leastID ? 1U : 0U;
    }
    return count;
}

std::optional<wire::Reply> RawClient::call(wire::Request request) {
    return send(framesOf(std::move(request), nextID_++)) ? receive() : std::nullopt;
}

std::optional<wire::Reply> RawClient::call(Method method, std::int64_t reporterID) {
    return call(request(method, reporterID));
}

bool RawClient::staysSilent() const {
    return received_.empty() && !isReadable(socket_, kSilenceMilliseconds);
}

bool RawClient::isClosedByService() {
    receiveAll();
    char byte = 0;
    const ssize_t count = ::recv(socket_, &byte, 1, MSG_DONTWAIT);
    return count == 0 || (count < 0 && errno != EAGAIN);
}

Session::Session(const std::string& socketPath, std::int64_t reporterID, std::uint16_t serviceType)
    : RawClient(socketPath) {
    start(reporterID, serviceType);
}

void Session::start(std::int64_t reporterID, std::uint16_t serviceType) {
    call(Method::createReportingSession, reporterID);
    wire::Request type = request(Method::setServiceType, reporterID);
    type.serviceType = serviceType;
    call(type);
    send(framesOf(request(Method::startReportingSessionForID, reporterID),
                  kStartID + static_cast<std::uint64_t>(reporterID)));
    // The start itself is not answered yet: what comes behind it shows that it has been carried out.
    call(Method::reporterID, reporterID);
}

bool Session::stop(std::int64_t reporterID) {
    const auto start = call(Method::stopReportingSessionForID, reporterID);
    return start && start->id >= kStartID && receive();
}

} // namespace tamblo::test
