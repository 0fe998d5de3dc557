#pragma once

#include <functional>
#include <string>
#include <string_view>

namespace tamblo {

/// What a process is told by whoever started it. A value, so that tests can make one up.
struct Environment {
    /// The value of a variable, empty when it is unset.
    std::function<std::string(std::string_view name)> variable;
    bool isRoot = false;
    /// The user's home directory, empty when there is none.
    std::string home;

    [[nodiscard]] static Environment ofThisProcess();
};

} // namespace tamblo
