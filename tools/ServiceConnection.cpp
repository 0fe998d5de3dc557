#include "tools/ServiceConnection.h"

#include "base/Format.h"
#include "base/NumberText.h"
#include "tools/records/AccessFault.h"

#include <algorithm>
#include <cerrno>

#include <sys/un.h>

namespace tamblo::tools {

namespace {

std::optional<std::chrono::milliseconds> timeoutFrom(const Arguments& arguments) {
    constexpr double longest = 86400;
    const auto text = arguments.last("--timeout");
    const auto seconds = text ? parseNumber<double>(*text) : 10;
    if (!seconds || !(*seconds >= 0)) {
        return std::nullopt;
    }
    return std::chrono::milliseconds(static_cast<std::int64_t>(std::min(*seconds, longest) * 1000));
}

} // namespace

ServiceConnection::ServiceConnection(const Arguments& arguments)
    : timeout_(timeoutFrom(arguments)),
      client_({.socketPath = std::string(arguments.last("--socket").value_or("")),
               .threading = client::Client::Threading::caller,
               .reconnect = false}) {}

std::optional<ExitStatus> ServiceConnection::connect() {
    if (!timeout_) {
        return complain(ExitStatus::usage, "--timeout needs a number of seconds");
    }
    if (client_.connect()) {
        return std::nullopt;
    }
    const Unreachable why =
        describeUnreachable(client_.socketPath(), faultOfConnecting(client_.socketPath()));
    return complain(why.status, why.text);
}

ExitStatus ServiceConnection::complainAbout(const client::Error& error) {
    if (error.domain == client::kErrorDomain) {
        const bool isLost = isError(error, client::ErrorCode::connectionLost);
        return complain(isLost ? ExitStatus::unreachable : ExitStatus::failed, error.message);
    }
    return complain(ExitStatus::failed, formatted("the service refused: {} {}{}{}", error.domain, error.code,
                                                  error.message.empty() ? "" : ": ", error.message));
}

Unreachable describeUnreachable(const std::string& path, int fault) {
    if (path.empty()) {
        return {.status = ExitStatus::unreachable,
                .text = "the service's directory is not known: set RUNTIME_DIRECTORY or XDG_RUNTIME_DIR"};
    }
    switch (fault) {
    case ENAMETOOLONG:
        return {.status = ExitStatus::usage,
                .text = formatted("{} is too long for a socket's path: it has {} bytes of at most {}", path,
                                  path.size(), sizeof(sockaddr_un::sun_path) - 1)};
    case ENOENT:
    case ECONNREFUSED:
    case 0: // it came up meanwhile
        return {.status = ExitStatus::unreachable,
                .text = formatted("no service answers at {}: start tamblod, or set RUNTIME_DIRECTORY", path)};
    case EAGAIN:
        return {.status = ExitStatus::unreachable,
                .text =
                    formatted("the service at {} takes no more connections: it is busy, or stopped", path)};
    default:
        return {.status = ExitStatus::unreachable,
                .text = formatted("cannot connect to {}: {}", path, describeFault(fault, path))};
    }
}

std::string notAReporterID(std::string_view text) {
    return formatted("\"{}\" is no reporter ID: it is a signed 64-bit number", text);
}

std::optional<std::int64_t> parseReporterID(std::string_view text) {
    const auto number = parseNumber<std::int64_t>(text);
    if (!number) {
        complain(ExitStatus::usage, notAReporterID(text));
    }
    return number;
}

} // namespace tamblo::tools
