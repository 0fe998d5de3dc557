#include "base/Format.h"
#include "base/Json.h"
#include "tools/Command.h"
#include "tools/ServiceConnection.h"

namespace tamblo::tools {

namespace {

constexpr Option kOptions[] = {kJsonOption, kSocketOption, kTimeoutOption};

ExitStatus run(const Arguments& arguments) {
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
    auto future = service.client().reporterID(*reporter);
    Dictionary answer;
    if (const auto failure = service.await(future, answer)) {
        return *failure;
    }
    const Value* found = answer.find("reporterID");
    const Value* type = answer.find("serviceType");
    const bool isValid = found != nullptr && *reporter != 0 && *found == Value(*reporter);
    if (arguments.has("--json")) {
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

} // namespace

constexpr Command kCommandValidate{
    "validate",    "ask whether a reporter exists, and for its service type",
    "ID [--json]", "Exits with 1 when the service does not know the reporter.",
    kOptions,      run,
};

} // namespace tamblo::tools
