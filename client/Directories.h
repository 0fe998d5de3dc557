#pragma once

#include <string>

namespace tamblo::client {

/// Where the service and its clients meet: the roots from the variables that systemd sets for a unit, or,
/// without them, from where such files are kept for the system or for one user. Nothing is created here. A
/// root for which there is nothing to go by is empty.
struct Directories {
    std::string runtime;
    std::string configuration;
    std::string logs;

    [[nodiscard]] static Directories ofThisProcess();

    /// The service's socket; empty without a runtime directory.
    [[nodiscard]] std::string socketFile() const;
    [[nodiscard]] std::string notifications() const { return runtime + "/notifications"; }
    [[nodiscard]] std::string preferences() const { return configuration + "/preferences"; }
};

} // namespace tamblo::client
