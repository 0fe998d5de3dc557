#include "tools/ServiceConnection.h"

#include "base/Format.h"
#include "base/NumberText.h"

#include <algorithm>

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
    return complain(
        ExitStatus::unreachable,
        formatted("no service answers at {}: start tamblod, or set RUNTIME_DIRECTORY", client_.socketPath()));
}

ExitStatus ServiceConnection::complainAbout(const client::Error& error) {
    if (error.domain == client::kErrorDomain) {
        const bool isLost = isError(error, client::ErrorCode::connectionLost);
        return complain(isLost ? ExitStatus::unreachable : ExitStatus::failed, error.message);
    }
    return complain(ExitStatus::failed, formatted("the service refused: {} {}{}{}", error.domain, error.code,
                                                  error.message.empty() ? "" : ": ", error.message));
}

std::optional<std::int64_t> parseReporterID(std::string_view text) {
    const auto number = parseNumber<std::int64_t>(text);
    if (!number) {
        complain(ExitStatus::usage,
                 formatted("\"{}\" is no reporter ID: it is a signed 64-bit number", text));
    }
    return number;
}

} // namespace tamblo::tools
