#pragma once

#include "os/Environment.h"

#include <string>
#include <variant>

namespace tamblo::wire {

/// Where the service, its clients and its tools meet: three roots, and what lies at fixed places below them.
///
/// The roots come from the variables that systemd sets for a unit, or, without them, from where such files
/// are kept for the system or for one user. Found once, at the start; plain values from then on.
struct Directories {
    std::string runtime;
    std::string configuration;
    std::string logs;

    /// The service's socket; empty without a runtime directory.
    [[nodiscard]] std::string socketFile() const;
    [[nodiscard]] std::string notifications() const { return runtime + "/notifications"; }
    [[nodiscard]] std::string driverChannels() const { return runtime + "/chanlog"; }
    [[nodiscard]] std::string accessories() const { return runtime + "/accessories"; }
    [[nodiscard]] std::string preferences() const { return configuration + "/preferences"; }
    [[nodiscard]] std::string deviceProperties() const { return configuration + "/device-properties.json"; }

    /// Without touching the file system. A root for which there is nothing to go by is empty.
    [[nodiscard]] static Directories find(const Environment& environment);
    [[nodiscard]] static Directories ofThisProcess() { return find(Environment::ofThisProcess()); }
    /// For the service: finds the roots and creates them where they are missing, mode 0700, parents included;
    /// the directories below them that others put files into are created too where that is possible. A root
    /// that cannot be had is a failure, told in a line that says what to do; one that exists but cannot be
    /// written is not.
    [[nodiscard]] static std::variant<Directories, std::string>
    prepare(const Environment& environment = Environment::ofThisProcess());
};

} // namespace tamblo::wire
