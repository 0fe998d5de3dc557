#include "tools/ServiceConnection.h"

#include "base/Format.h"
#include "client/NumberText.h"

#include <algorithm>

namespace tamblo::tools {

namespace {

std::chrono::milliseconds timeoutFrom(const Arguments& arguments) {
    constexpr double usual = 10;
    constexpr double longest = 86400;
    const double seconds =
        arguments.has("--timeout") ? Value(*arguments.last("--timeout")).doubleValue() : usual;
    return std::chrono::milliseconds(static_cast<std::int64_t>(std::clamp(seconds, 0.0, longest) * 1000));
}

} // namespace

ServiceConnection::ServiceConnection(const Arguments& arguments)
    : timeout_(timeoutFrom(arguments)),
      client_({.socketPath = std::string(arguments.last("--socket").value_or("")),
               .threading = client::Client::Threading::caller,
               .reconnect = false}) {}

bool ServiceConnection::connect() {
    if (client_.connect()) {
        return true;
    }
    if (client_.socketPath().empty()) {
        complain(ExitStatus::unreachable,
                 "the service's directory is not known: set RUNTIME_DIRECTORY or XDG_RUNTIME_DIR");
    } else {
        complain(ExitStatus::unreachable,
                 formatted("no service answers at {}: start tamblod, or set RUNTIME_DIRECTORY",
                           client_.socketPath()));
    }
    return false;
}

ExitStatus ServiceConnection::complainAbout(const client::Error& error) {
    if (error.domain == client::kErrorDomain &&
        error.code == static_cast<std::int64_t>(client::ErrorCode::connectionLost)) {
        return complain(ExitStatus::unreachable, error.message);
    }
    if (error.domain == client::kErrorDomain) {
        return complain(ExitStatus::failed, error.message);
    }
    return complain(ExitStatus::failed, formatted("the service refused: {} {}{}{}", error.domain, error.code,
                                                  error.message.empty() ? "" : ": ", error.message));
}

std::optional<std::int64_t> parseReporterID(std::string_view text) {
    const auto number = client::parseInteger(text);
    if (!number) {
        complain(ExitStatus::usage,
                 formatted("\"{}\" is no reporter ID: it is a signed 64-bit number", text));
    }
    return number;
}

} // namespace tamblo::tools
