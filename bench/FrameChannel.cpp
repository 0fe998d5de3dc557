#include "FrameChannel.h"

#include "Payloads.h"
#include "os/LocalAddress.h"
#include "wire/FrameSplitter.h"

#include <cerrno>
#include <stdexcept>
#include <system_error>

#include <poll.h>
#include <sys/socket.h>

namespace tamblo::bench {

namespace {

constexpr std::size_t kBytesPerRead = 64 * 1024;

} // namespace

FrameChannel::FrameChannel(const std::string& socketPath)
    : socket_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    const auto address = LocalAddress::of(socketPath);
    if (!address) {
        throw std::runtime_error("the socket's path is too long; set TMPDIR");
    }
    if (!socket_.isOpen() || ::connect(socket_.get(), address->get(), address->size()) != 0) {
        throw std::system_error(errno, std::generic_category(), socketPath);
    }
}

void FrameChannel::limitWaits(std::chrono::seconds longest) const {
    const timeval limit{.tv_sec = longest.count(), .tv_usec = 0};
    ::setsockopt(socket_.get(), SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
    ::setsockopt(socket_.get(), SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
}

void FrameChannel::append(const wire::Request& request) {
    if (!wire::appendRequestFrame(outgoing_, request)) {
        throw std::logic_error("a frame is too long");
    }
}

void FrameChannel::queue(wire::Request& request) {
    request.id = ++lastId_;
    append(request);
    ++outstanding_;
}

void FrameChannel::queueWithoutReply(wire::Request& request) {
    request.id.reset();
    append(request);
}

void FrameChannel::flush() {
    std::size_t sent = 0;
    while (sent < outgoing_.size()) {
        const ssize_t count =
            ::send(socket_.get(), outgoing_.data() + sent, outgoing_.size() - sent, MSG_NOSIGNAL);
        if (count < 0) {
            throw std::system_error(errno, std::generic_category(), "send");
        }
        sent += static_cast<std::size_t>(count);
    }
    outgoing_.clear();
}

void FrameChannel::receive() {
    const ssize_t count = ::recv(socket_.get(), incoming_.room(kBytesPerRead), kBytesPerRead, 0);
    if (count <= 0) {
        throw std::system_error(count == 0 ? ECONNRESET : errno, std::generic_category(), "recv");
    }
    incoming_.commit(static_cast<std::size_t>(count));
    wire::FrameSplitter frames(incoming_.bytes());
    while (const auto item = frames.next()) {
        last_ = wire::decodeReply(*item);
        if (!last_ || last_->error) {
            throw std::runtime_error("the service refuses: " + (last_ ? last_->error->message : "no reply"));
        }
        --outstanding_;
    }
    incoming_.dropFront(incoming_.size() - frames.rest().size());
}

bool FrameChannel::hasReply() const noexcept {
    pollfd waiting{socket_.get(), POLLIN, 0};
    return ::poll(&waiting, 1, 0) > 0;
}

void FrameChannel::finish() {
    flush();
    while (outstanding_ > 0) {
        receive();
    }
}

wire::Reply FrameChannel::call(wire::Request& request) {
    queue(request);
    finish();
    return std::move(*last_);
}

wire::Request reporterRequest(wire::Method method, std::int64_t reporterID) {
    wire::Request request;
    request.method = method;
    request.reporterID = reporterID;
    return request;
}

void FrameChannel::createSession(std::int64_t reporterID, client::ServiceType serviceType) {
    wire::Request create = reporterRequest(wire::Method::createReportingSession, reporterID);
    queue(create);
    wire::Request type = reporterRequest(wire::Method::setServiceType, reporterID);
    type.serviceType = static_cast<std::uint16_t>(serviceType);
    queue(type);
    wire::Request configuration = reporterRequest(wire::Method::setConfiguration, reporterID);
    configuration.dictionary = sessionConfiguration();
    queue(configuration);
}

void FrameChannel::startSession(std::int64_t reporterID) {
    wire::Request request = reporterRequest(wire::Method::startReportingSessionForID, reporterID);
    queueWithoutReply(request);
}

void FrameChannel::beginSession(std::int64_t reporterID, client::ServiceType serviceType) {
    createSession(reporterID, serviceType);
    startSession(reporterID);
}

void FrameChannel::stopSession(std::int64_t reporterID) {
    wire::Request request = reporterRequest(wire::Method::stopReportingSessionForID, reporterID);
    queue(request);
}

} // namespace tamblo::bench
