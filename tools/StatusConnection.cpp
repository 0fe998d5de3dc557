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

std::variant<FileDescriptor, StatusConnection::Failure>
StatusConnection::send(std::string_view request) const {
    if (path_.empty()) {
        return Failure{ExitStatus::unreachable,
                       "the service's directory is not known: set RUNTIME_DIRECTORY or XDG_RUNTIME_DIR"};
    }
    const auto address = LocalAddress::of(path_);
    FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (!address || ::connect(socket.get(), address->get(), address->size()) != 0) {
        return Failure{ExitStatus::unreachable,
                       formatted("no service answers at {}: start tamblod, or set RUNTIME_DIRECTORY", path_)};
    }
    const std::string line = formatted("{}\n", request);
    // One that is turned away may have been sent the reason and the end already.
    (void)::send(socket.get(), line.data(), line.size(), MSG_NOSIGNAL);
    return socket;
}

std::variant<StatusDocument, StatusConnection::Failure>
StatusConnection::ask(std::string_view request) const {
    auto connection = send(request);
    if (auto* const failure = std::get_if<Failure>(&connection)) {
        return std::move(*failure);
    }
    const auto& socket = std::get<FileDescriptor>(connection);
    auto text = readToEnd(socket.get());
    if (!text) {
        return Failure{ExitStatus::failed, "the service did not answer in time"};
    }
    auto value = readJson(*text);
    if (const auto* const wrong = std::get_if<JsonError>(&value)) {
        return Failure{ExitStatus::failed, formatted("the service's answer is no JSON: {}", wrong->message)};
    }
    StatusDocument document{std::move(*text), std::get<Value>(std::move(value))};
    if (const Value& error = document["error"]; error.isString()) {
        return Failure{ExitStatus::failed, std::string(error.stringValue())};
    }
    return document;
}

} // namespace tamblo::tools
