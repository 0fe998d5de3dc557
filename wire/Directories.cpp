#include "wire/Directories.h"

#include "base/Format.h"
#include "os/Directory.h"
#include "wire/Protocol.h"

#include <algorithm>
#include <string_view>
#include <system_error>
#include <utility>

namespace tamblo::wire {

namespace {

/// Where one root comes from.
struct Root {
    std::string Directories::*directory;
    std::string_view what;
    std::string_view variable;
    std::string_view forRoot;
    std::string_view userVariable;
    std::string_view belowHome; ///< empty when there is no place for it there
};

constexpr Root kRoots[] = {
    {&Directories::runtime, "runtime", "RUNTIME_DIRECTORY", "/run/tamblo", "XDG_RUNTIME_DIR", ""},
    {&Directories::configuration, "configuration", "CONFIGURATION_DIRECTORY", "/etc/tamblo",
     "XDG_CONFIG_HOME", ".config"},
    {&Directories::logs, "logs", "LOGS_DIRECTORY", "/var/log/tamblo", "XDG_STATE_HOME", ".local/state"},
};

std::string withoutTrailingSlashes(std::string path) {
    while (path.size() > 1 && path.back() == '/') {
        path.pop_back();
    }
    return path;
}

/// Empty when there is nothing to go by.
std::string placeOf(const Root& root, const Environment& environment) {
    // The variable may name several directories; the first is the unit's own.
    std::string value = environment.variable(root.variable);
    value.resize(std::min(value.find(':'), value.size()));
    if (!value.empty()) {
        return withoutTrailingSlashes(std::move(value));
    }
    if (environment.isRoot) {
        return std::string(root.forRoot);
    }
    // A relative path in one of these variables counts as none (the XDG rule for base directories).
    const std::string base = environment.variable(root.userVariable);
    if (base.starts_with('/')) {
        return withoutTrailingSlashes(base) + "/tamblo";
    }
    return root.belowHome.empty() || environment.home.empty()
               ? std::string()
               : formatted("{}/{}/tamblo", withoutTrailingSlashes(environment.home), root.belowHome);
}

} // namespace

std::string Directories::socketFile() const {
    return runtime.empty() ? std::string() : socketPath(runtime);
}

Directories Directories::find(const Environment& environment) {
    Directories directories;
    for (const Root& root : kRoots) {
        directories.*root.directory = placeOf(root, environment);
    }
    return directories;
}

std::variant<Directories, std::string> Directories::prepare(const Environment& environment) {
    Directories directories = find(environment);
    for (const Root& root : kRoots) {
        const std::string& path = directories.*root.directory;
        if (path.empty()) {
            return formatted(
                "there is no place for the {} directory: set {} to a directory, or {} to its parent",
                root.what, root.variable, root.userVariable);
        }
        if (const int failure = makeDirectories(path)) {
            return formatted(
                "cannot create the {} directory {}: {}; create it, or set {} to a directory that can be "
                "used",
                root.what, path, std::generic_category().message(failure), root.variable);
        }
    }
    for (const std::string& path : {directories.notifications(), directories.driverChannels(),
                                    directories.accessories(), directories.preferences()}) {
        // Without it what it would hold is absent, as it is without a file in it.
        static_cast<void>(makeDirectories(path));
    }
    return directories;
}

} // namespace tamblo::wire
