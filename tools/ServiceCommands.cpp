#include "base/Format.h"
#include "base/Json.h"
#include "tools/Command.h"
#include "tools/ServiceConnection.h"
#include "tools/records/Payload.h"

#include <vector>

// The commands that are one request, or a few, and print what the service answers.
namespace tamblo::tools {

namespace {

constexpr Option kQueryOptions[] = {kJsonOption, kSocketOption, kTimeoutOption};

ExitStatus reporters(const Arguments& arguments) {
    if (!arguments.rest().empty()) {
        return complain(ExitStatus::usage, "reporters takes no arguments");
    }
    ServiceConnection service(arguments);
    if (const auto failure = service.connect()) {
        return *failure;
    }
    std::vector<std::int64_t> reporters;
    if (const auto failure = service.await(service.client().getAllReporters(), &reporters)) {
        return *failure;
    }
    Array lines;
    for (const std::int64_t reporter : reporters) {
        client::ServiceType type{};
        if (const auto failure =
                service.await(service.client().getServiceNameForReporterID(reporter), &type)) {
            return *failure;
        }
        const std::string_view name = client::serviceTypeName(type);
        if (arguments.has("--json")) {
            lines.emplace_back(Dictionary{{"reporterID", reporter},
                                          {"serviceType", static_cast<unsigned>(type)},
                                          {"serviceName", name}});
        } else {
            printLine(formatted("{} {}", reporter, name));
        }
    }
    if (arguments.has("--json")) {
        printLine(jsonText(Value(std::move(lines))));
    }
    return ExitStatus::done;
}

ExitStatus validate(const Arguments& arguments) {
    if (arguments.rest().size() != 1) {
        return complain(ExitStatus::usage, "validate needs one reporter ID");
    }
    const auto reporter = parseReporterID(arguments.rest()[0]);
    if (!reporter) {
        return ExitStatus::usage;
    }
    ServiceConnection service(arguments);
    if (const auto failure = service.connect()) {
        return *failure;
    }
    Dictionary answer;
    if (const auto failure = service.await(service.client().reporterID(*reporter), &answer)) {
        return *failure;
    }
    const Value* found = answer.find("reporterID");
    const Value* type = answer.find("serviceType");
    const bool isValid = found != nullptr && *reporter != 0 && *found == Value(*reporter);
    if (arguments.has("--json")) {
        answer.set("reporterID", *reporter); // which the service answers 0 for where it knows none
        answer.set("valid", isValid);
        printLine(jsonText(answer));
    } else if (isValid && type != nullptr) {
        printLine(
            formatted("{} {}", *reporter,
                      client::serviceTypeName(static_cast<client::ServiceType>(type->unsignedValue()))));
    } else {
        printLine(formatted("{} is not a reporter", *reporter));
    }
    return isValid ? ExitStatus::done : ExitStatus::failed;
}

constexpr Option kKillOptions[] = {kSocketOption, kTimeoutOption};

ExitStatus kill(const Arguments& arguments) {
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
    if (error && isError(*error, client::ErrorCode::connectionLost)) {
        return ExitStatus::done;
    }
    return error ? ServiceConnection::complainAbout(*error)
                 : complain(ExitStatus::failed, "the service answered instead of ending");
}

} // namespace

constexpr Command kCommandReporters{
    "reporters", "list the reporters of all clients, with their service types", "[--json]", "", kQueryOptions,
    reporters,
};

constexpr Command kCommandValidate{
    "validate",    "ask whether a reporter exists, and for its service type",
    "ID [--json]", "Exits with 1 when the service does not know the reporter.",
    kQueryOptions, validate,
};

constexpr Command kCommandKill{
    "kill",       "end the service at once, without stopping its sessions",
    "",           "The command returns when the connection is gone. tamblod then exits with status 2.",
    kKillOptions, kill,
};

} // namespace tamblo::tools
