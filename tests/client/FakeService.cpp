#include "tests/client/FakeService.h"

#include "tests/Sockets.h"
#include "wire/FrameSplitter.h"

#include <chrono>

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

namespace tamblo::test {

FakeService::FakeService(Handler handler) : handler_(std::move(handler)) {
    start();
}

FakeService::~FakeService() {
    stop();
}

void FakeService::start() {
    listener_ = boundSocket(SOCK_STREAM, path_);
    isStopping_ = false;
    thread_ = std::thread([this] { run(); });
}

void FakeService::stop() {
    if (!thread_.joinable()) {
        return;
    }
    isStopping_ = true;
    thread_.join();
    ::close(listener_);
    ::unlink(path_.c_str());
}

std::vector<wire::Request> FakeService::requests() {
    const std::lock_guard lock(mutex_);
    return requests_;
}

bool FakeService::waitForRequests(std::size_t count) {
    for (int i = 0; i < 5000; ++i) {
        if (requests().size() >= count) {
            return true;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    return false;
}

void FakeService::run() {
    std::vector<Connection> connections;
    while (!isStopping_) {
        std::vector<pollfd> watched{{.fd = listener_, .events = POLLIN, .revents = 0}};
        for (const Connection& connection : connections) {
            watched.push_back({.fd = isDeaf ? -1 : connection.socket, .events = POLLIN, .revents = 0});
        }
        ::poll(watched.data(), watched.size(), 2);
        for (std::size_t i = connections.size(); i-- > 0;) {
            if (watched[i + 1].revents != 0 && !serve(connections[i])) {
                ::close(connections[i].socket);
                connections.erase(connections.begin() + static_cast<std::ptrdiff_t>(i));
            }
        }
        if (watched[0].revents != 0) {
            connections.push_back(
                {.socket = ::accept4(listener_, nullptr, nullptr, SOCK_CLOEXEC), .received = {}});
        }
    }
    for (const Connection& connection : connections) {
        ::close(connection.socket);
    }
}

bool FakeService::serve(Connection& connection) {
    constexpr std::size_t readBytes = 256 * 1024;
    const ssize_t count = ::recv(connection.socket, connection.received.room(readBytes), readBytes, 0);
    if (count <= 0) {
        return false;
    }
    connection.received.commit(static_cast<std::size_t>(count));
    wire::FrameSplitter frames(connection.received.bytes());
    TextBuffer replies;
    KeySetCache keySets;
    while (const auto item = frames.next()) {
        wire::Request request;
        if (wire::decodeRequest(*item, keySets, request)) {
            ++refusals_;
            continue;
        }
        handler_(request, replies);
        const std::lock_guard lock(mutex_);
        requests_.push_back(std::move(request));
    }
    connection.received.dropFront(connection.received.size() - frames.rest().size());
    return replies.empty() || ::send(connection.socket, replies.data(), replies.size(), MSG_NOSIGNAL) ==
                                  static_cast<ssize_t>(replies.size());
}

void FakeService::answer(const wire::Request& request, TextBuffer& replies) {
    if (!request.id) {
        return;
    }
    switch (request.method) {
    case wire::Method::startReportingSessionForID:
    case wire::Method::killService:
        break;
    case wire::Method::sendMessage:
        wire::appendNullReply(replies, *request.id);
        break;
    case wire::Method::getServiceNameForReporterID:
        wire::appendUnsignedReply(replies, *request.id, 7);
        break;
    case wire::Method::reporterID:
        wire::appendDictionaryReply(replies, *request.id,
                                    {{"reporterID", request.reporterID}, {"serviceType", 7}});
        break;
    case wire::Method::getAllReporters: {
        const std::int64_t reporters[] = {7, -8};
        wire::appendIntegersReply(replies, *request.id, reporters);
        break;
    }
    default:
        wire::appendBooleanReply(replies, *request.id, true);
        break;
    }
}

} // namespace tamblo::test
