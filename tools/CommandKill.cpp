#include "tools/Command.h"
#include "tools/ServiceConnection.h"

namespace tamblo::tools {

namespace {

constexpr Option kOptions[] = {kSocketOption, kTimeoutOption};

ExitStatus run(const Arguments& arguments) {
    if (!arguments.rest().empty()) {
        return complain(ExitStatus::usage, "kill takes no arguments");
    }
    ServiceConnection service(arguments);
    if (const auto failure = service.connect()) {
        return *failure;
    }
    auto future = service.client().killService();
    if (!service.client().wait(future, service.timeout())) {
        return complain(ExitStatus::failed, "the service still runs");
    }
    const auto error = future.get().error;
    const bool isGone = error && error->domain == client::kErrorDomain &&
                        error->code == static_cast<std::int64_t>(client::ErrorCode::connectionLost);
    if (isGone) {
        return ExitStatus::done;
    }
    return error ? ServiceConnection::complainAbout(*error)
                 : complain(ExitStatus::failed, "the service answered instead of ending");
}

} // namespace

constexpr Command kCommandKill{
    "kill",   "end the service at once, without stopping its sessions",
    "",       "Ends when the connection does. The service exits with status 2.",
    kOptions, run,
};

} // namespace tamblo::tools
