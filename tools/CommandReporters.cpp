#include "base/Format.h"
#include "base/Json.h"
#include "tools/Command.h"
#include "tools/ServiceConnection.h"

namespace tamblo::tools {

namespace {

constexpr Option kOptions[] = {kJsonOption, kSocketOption, kTimeoutOption};

ExitStatus run(const Arguments& arguments) {
    if (!arguments.rest().empty()) {
        return complain(ExitStatus::usage, "reporters takes no arguments");
    }
    ServiceConnection service(arguments);
    if (const auto failure = service.connect()) {
        return *failure;
    }
    auto future = service.client().getAllReporters();
    std::vector<std::int64_t> reporters;
    if (const auto failure = service.await(future, reporters)) {
        return *failure;
    }
    Array lines;
    for (const std::int64_t reporter : reporters) {
        auto typeFuture = service.client().getServiceNameForReporterID(reporter);
        client::ServiceType type{};
        if (const auto failure = service.await(typeFuture, type)) {
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

} // namespace

constexpr Command kCommandReporters{
    "reporters", "list the reporters of all clients, with their service types", "[--json]", "", kOptions, run,
};

} // namespace tamblo::tools
