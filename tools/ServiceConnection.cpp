#include "tools/ServiceConnection.h"

#include "base/Format.h"
#include "base/NumberText.h"
#include "tools/AccessFault.h"

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
    if (client_.socketPath().empty()) {
        return complain(ExitStatus::unreachable,
                        "the service's directory is not known: set RUNTIME_DIRECTORY or XDG_RUNTIME_DIR");
    }
    const std::string& path = client_.socketPath();
    switch (const int fault = faultOfConnecting(path)) {
    case ENAMETOOLONG:
        return complain(ExitStatus::usage,
                        formatted("{} is too long for a socket's path: it has {} bytes of at most {}", path,
                                  path.size(), sizeof(sockaddr_un::sun_path) - 1));
    case ENOENT:
    case ECONNREFUSED:
    case 0: // it came up meanwhile
        return complain(ExitStatus::unreachable,
                        formatted("no service answers at {}: start tamblod, or set RUNTIME_DIRECTORY", path));
    default:
        return complain(ExitStatus::unreachable,
                        formatted("cannot connect to {}: {}", path, describeFault(fault, path)));
    }
}

ExitStatus ServiceConnection::complainAbout(const client::Error& error) {
    if (error.domain == client::kErrorDomain) {
        const bool isLost = isError(error, client::ErrorCode::connectionLost);
        return complain(isLost ? ExitStatus::unreachable : ExitStatus::failed, error.message);
    }
    return complain(ExitStatus::failed, formatted("the service refused: {} {}{}{}", error.domain, error.code,
                                                  error.message.empty() ? "" : ": ", error.message));
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
