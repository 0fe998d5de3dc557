#include "wire/Protocol.h"

#include <algorithm>

namespace tamblo::wire {

std::optional<Method> methodNamed(std::string_view name) noexcept {
    const auto found = std::find(kMethodNames.begin(), kMethodNames.end(), name);
    if (found == kMethodNames.end()) {
        return std::nullopt;
    }
    return static_cast<Method>(found - kMethodNames.begin());
}

std::string socketPath(std::string_view runtimeDirectory) {
    std::string path(runtimeDirectory);
    path += '/';
    path += kServiceName;
    return path;
}

} // namespace tamblo::wire
