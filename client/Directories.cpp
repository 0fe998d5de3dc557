#include "client/Directories.h"

#include "wire/Directories.h"
#include "wire/Protocol.h"

namespace tamblo::client {

Directories Directories::ofThisProcess() {
    const auto environment = wire::Environment::ofThisProcess();
    return {
        .runtime = placeOf(wire::kRuntimeRoot, environment).value_or(""),
        .configuration = placeOf(wire::kConfigurationRoot, environment).value_or(""),
        .logs = placeOf(wire::kLogsRoot, environment).value_or(""),
    };
}

std::string Directories::socketFile() const {
    return runtime.empty() ? std::string() : wire::socketPath(runtime);
}

} // namespace tamblo::client
