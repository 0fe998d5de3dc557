#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>

/// Where the service and its clients meet, worked out alike by both ends: each root comes from the variable
/// that systemd sets for a unit, or, without it, from where such files are kept for the system or for one
/// user. Nothing here touches the directories.
namespace tamblo::wire {

/// What the places are worked out from.
struct Environment {
    /// The value of a variable, empty when it is unset.
    std::function<std::string(std::string_view name)> variable;
    bool isRoot = false;
    /// The user's home directory, empty when there is none.
    std::string home;

    static Environment ofThisProcess();
};

/// Where one root comes from.
struct Root {
    std::string_view what;
    std::string_view variable;
    std::string_view forRoot;
    std::string_view userVariable;
    /// Below the home directory; empty when there is no place for it there.
    std::string_view belowHome;
};

inline constexpr Root kRuntimeRoot{"runtime", "RUNTIME_DIRECTORY", "/run/tamblo", "XDG_RUNTIME_DIR", ""};
inline constexpr Root kConfigurationRoot{"configuration", "CONFIGURATION_DIRECTORY", "/etc/tamblo",
                                         "XDG_CONFIG_HOME", ".config"};
inline constexpr Root kLogsRoot{"logs", "LOGS_DIRECTORY", "/var/log/tamblo", "XDG_STATE_HOME",
                                ".local/state"};

/// Nothing when there is nothing to go by.
[[nodiscard]] std::optional<std::string> placeOf(const Root& root, const Environment& environment);

} // namespace tamblo::wire
