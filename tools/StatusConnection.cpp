#include "tools/StatusConnection.h"

#include "base/Format.h"
#include "base/Json.h"
#include "os/FileDescriptor.h"
#include "os/LocalAddress.h"
#include "wire/Directories.h"
#include "wire/StatusProtocol.h"

#include <array>
#include <cerrno>
#include <utility>

#include <poll.h>
#include <sys/socket.h>
#include <sys/time.h>

namespace tamblo::tools {

namespace {

/// For each step of the answer.
constexpr int kPatience = 10'000;

std::string pathFrom(const Arguments& arguments) {
    if (const auto given = arguments.last("--socket")) {
        return std::string(*given);
    }
    const std::string runtime = wire::Directories::ofThisProcess().runtime;
    return runtime.empty() ? std::string() : wire::statusSocketPath(runtime);
}

/// Everything up to the end of the connection; nothing when it does not come in time.
std::optional<std::string> readToEnd(int socket) {
    std::string text;
    std::array<char, 65536> bytes;
    for (;;) {
        pollfd readable{.fd = socket, .events = POLLIN, .revents = 0};
        const int ready = ::poll(&readable, 1, kPatience);
        if (ready < 0 && errno == EINTR) {
            continue;
        }
        const ssize_t count = ready > 0 ? ::recv(socket, bytes.data(), bytes.size(), 0) : -1;
        if (ready <= 0 || (count < 0 && text.empty())) {
            return std::nullopt;
        }
        if (count <= 0) {
            return text;
        }
        text.append(bytes.data(), static_cast<std::size_t>(count));
    }
}

} // namespace

const Value& StatusDocument::member(const Value& object, std::string_view name) {
    static const Value kNone;
    const Value* const found = object.isDictionary() ? object.dictionaryValue().find(name) : nullptr;
    return found != nullptr ? *found : kNone;
}

StatusConnection::StatusConnection(const Arguments& arguments) : path_(pathFrom(arguments)) {}

std::variant<FileDescriptor, Unreachable> StatusConnection::send(std::string_view request) const {
    const auto address = LocalAddress::of(path_);
    FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    // A service that accepts nobody is not waited for without end.
    constexpr timeval patience{.tv_sec = kPatience / 1000, .tv_usec = 0};
    (void)::setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience);
    if (!address || ::connect(socket.get(), address->get(), address->size()) != 0) {
        return describeUnreachable(path_, address ? errno : ENAMETOOLONG);
    }
    const std::string line = formatted("{}\n", request);
    // One that is turned away may have been sent the reason and the end already.
    (void)::send(socket.get(), line.data(), line.size(), MSG_NOSIGNAL);
    return socket;
}

std::variant<StatusDocument, Unreachable> StatusConnection::ask(std::string_view request) const {
    auto connection = send(request);
    if (auto* const failure = std::get_if<Unreachable>(&connection)) {
        return std::move(*failure);
    }
    const auto& socket = std::get<FileDescriptor>(connection);
    auto text = readToEnd(socket.get());
    if (!text) {
        return Unreachable{ExitStatus::failed, "the service did not answer in time"};
    }
    auto value = readJson(*text);
    if (const auto* const wrong = std::get_if<JsonError>(&value)) {
        return Unreachable{ExitStatus::failed,
                           formatted("the service's answer is no JSON: {}", wrong->message)};
    }
    StatusDocument document{std::move(*text), std::get<Value>(std::move(value))};
    if (const Value& error = document["error"]; error.isString()) {
        return Unreachable{ExitStatus::failed, std::string(error.stringValue())};
    }
    return document;
}

} // namespace tamblo::tools
