#include "Assault.h"

#include "../Processes.h"

#include "os/LocalAddress.h"
#include "wire/FrameSplitter.h"

#include <cerrno>
#include <thread>

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>

namespace tamblo::bench {

namespace {

constexpr std::size_t kBytesPerRead = 256U << 10U;
constexpr int kPatienceMilliseconds = 50;

} // namespace

void Assault::noteResidentBytes() const {
    marks_.residentBytes = roughResidentBytesOf(service_);
}

void Assault::sleepUntilOver() const {
    std::this_thread::sleep_until(end_);
}

HostileClient::HostileClient(const Assault& assault, Replies replies) : assault_(assault), replies_(replies) {
    reconnect();
}

void HostileClient::reconnect() {
    socket_ = FileDescriptor(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const auto address = LocalAddress::of(assault_.socketPath());
    // Blocks while the service does not accept, for the time of a bounded send.
    const timeval limit{.tv_sec = 1, .tv_usec = 0};
    ::setsockopt(socket_.get(), SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
    if (!address || ::connect(socket_.get(), address->get(), address->size()) != 0) {
        socket_.reset();
        return;
    }
    ::fcntl(socket_.get(), F_SETFL, O_NONBLOCK);
    incoming_.clear();
    outgoing_.clear();
}

void HostileClient::add(const wire::Request& request) {
    (void)wire::appendRequestFrame(outgoing_, request);
}

void HostileClient::addCall(wire::Request request) {
    request.id = ++lastId_;
    (void)wire::appendRequestFrame(outgoing_, request);
}

bool HostileClient::send() {
    std::string_view rest = outgoing_.view();
    while (isOpen() && !rest.empty() && !assault_.isOver()) {
        turn(rest, kPatienceMilliseconds);
    }
    const bool isSent = rest.empty();
    outgoing_.clear();
    return isSent && isOpen() && !assault_.isOver();
}

void HostileClient::sendWhatFits() {
    std::string_view rest = outgoing_.view();
    std::size_t before = 0;
    do {
        before = rest.size();
        turn(rest, 0);
    } while (isOpen() && !rest.empty() && rest.size() != before);
    outgoing_.dropFront(isOpen() ? outgoing_.size() - rest.size() : outgoing_.size());
}

bool HostileClient::settle() {
    addCall({.method = wire::Method::getServiceNameForReporterID, .reporterID = 1});
    const std::uint64_t awaited = lastId_;
    if (!send()) {
        return false;
    }
    std::string_view nothing;
    while (isOpen() && lastAnswered_ < awaited && !assault_.isOver()) {
        turn(nothing, kPatienceMilliseconds);
    }
    return isOpen() && !assault_.isOver();
}

void HostileClient::turn(std::string_view& rest, int patience) {
    const bool reads = replies_ == Replies::read;
    const int wanted = (rest.empty() ? 0 : POLLOUT) | (reads ? POLLIN : 0);
    pollfd waiting{socket_.get(), static_cast<short>(wanted), 0};
    if (::poll(&waiting, 1, patience) <= 0) {
        return;
    }
    if ((waiting.revents & POLLIN) != 0) {
        receive();
    }
    if (!rest.empty() && isOpen() && (waiting.revents & (POLLOUT | POLLHUP | POLLERR)) != 0) {
        const ssize_t count = ::send(socket_.get(), rest.data(), rest.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
        if (count > 0) {
            assault_.marks().sentBytes += static_cast<std::uint64_t>(count);
            rest.remove_prefix(static_cast<std::size_t>(count));
        } else if (errno != EAGAIN) {
            receive(); // what the service has said last
            if (isOpen()) {
                ++assault_.marks().endedConnections;
                close();
            }
        }
    } else if ((waiting.revents & (POLLHUP | POLLERR)) != 0 && isOpen()) {
        ++assault_.marks().endedConnections;
        close();
    }
}

void HostileClient::receive() {
    const ssize_t count = ::recv(socket_.get(), incoming_.room(kBytesPerRead), kBytesPerRead, MSG_DONTWAIT);
    if (count <= 0) {
        if (count == 0 || errno != EAGAIN) {
            ++assault_.marks().endedConnections;
            close();
        }
        return;
    }
    incoming_.commit(static_cast<std::size_t>(count));
    wire::FrameSplitter frames(incoming_.bytes());
    while (const auto item = frames.next()) {
        countReply(*item);
    }
    incoming_.dropFront(incoming_.size() - frames.rest().size());
}

/// Reads no further than to the error: what a client may be answered is long.
void HostileClient::countReply(std::span<const std::uint8_t> item) {
    CborReader reader(item);
    auto frame = reader.readArrayHead();
    const auto kind = frame ? reader.readUnsigned() : std::nullopt;
    const auto id = kind ? reader.readUnsigned() : std::nullopt;
    ++assault_.marks().replies;
    if (id) {
        lastAnswered_ = std::max(lastAnswered_, *id);
        assault_.marks().refusals += reader.nextIsNull() ? 0U : 1U;
    }
}

wire::Request messageFor(std::int64_t reporterID, Dictionary payload) {
    return {.method = wire::Method::sendMessage,
            .dictionary = std::move(payload),
            .category = 4, // playback
            .type = 1,     // start
            .reporterIDs = {reporterID}};
}

void addSession(HostileClient& client, std::int64_t reporterID, std::uint16_t serviceType) {
    client.add({.method = wire::Method::createReportingSession, .reporterID = reporterID});
    client.add(
        {.method = wire::Method::setServiceType, .reporterID = reporterID, .serviceType = serviceType});
    client.add({.method = wire::Method::startReportingSessionForID, .reporterID = reporterID});
}

} // namespace tamblo::bench
