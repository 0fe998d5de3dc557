#include "platform/linux/Directories.h"

#include "base/Format.h"

#include <cerrno>
#include <cstdlib>
#include <optional>
#include <system_error>
#include <utility>

#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo {

namespace {

/// Where one root comes from.
struct Root {
    std::string_view what;
    std::string_view variable;
    std::string_view forRoot;
    std::string_view userVariable;
    /// Below the home directory; empty when there is no place for it there.
    std::string_view belowHome;
    std::string Directories::*directory;
};

constexpr Root kRoots[] = {
    {"runtime", "RUNTIME_DIRECTORY", "/run/tamblo", "XDG_RUNTIME_DIR", "", &Directories::runtime},
    {"configuration", "CONFIGURATION_DIRECTORY", "/etc/tamblo", "XDG_CONFIG_HOME", ".config",
     &Directories::configuration},
    {"logs", "LOGS_DIRECTORY", "/var/log/tamblo", "XDG_STATE_HOME", ".local/state", &Directories::logs},
};

std::string withoutTrailingSlashes(std::string path) {
    while (path.size() > 1 && path.back() == '/') {
        path.pop_back();
    }
    return path;
}

std::optional<std::string> placeOf(const Root& root, const Directories::Environment& environment) {
    std::string value = environment.variable(root.variable);
    value.resize(std::min(value.find(':'), value.size()));
    if (!value.empty()) {
        return withoutTrailingSlashes(std::move(value));
    }
    if (environment.isRoot) {
        return std::string(root.forRoot);
    }
    // A relative path in one of these variables counts as none (XDG Base Directory Specification).
    const std::string base = environment.variable(root.userVariable);
    if (base.starts_with('/')) {
        return withoutTrailingSlashes(base) + "/tamblo";
    }
    if (!root.belowHome.empty() && !environment.home.empty()) {
        return formatted("{}/{}/tamblo", withoutTrailingSlashes(environment.home), root.belowHome);
    }
    return std::nullopt;
}

/// Creates a directory and its parents where they are missing. Returns 0 or an `errno`.
int createDirectory(const std::string& path) {
    if (::mkdir(path.c_str(), S_IRWXU) == 0) {
        return 0;
    }
    if (errno == ENOENT) {
        const std::size_t slash = path.find_last_of('/');
        if (slash == std::string::npos || slash == 0) {
            return ENOENT;
        }
        const int failure = createDirectory(path.substr(0, slash));
        if (failure != 0) {
            return failure;
        }
        if (::mkdir(path.c_str(), S_IRWXU) == 0) {
            return 0;
        }
    }
    // On a read-only file system the error need not say that the directory is there.
    const int failure = errno;
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0) {
        return failure;
    }
    return S_ISDIR(status.st_mode) ? 0 : ENOTDIR;
}

} // namespace

Directories::Environment Directories::Environment::ofThisProcess() {
    Environment environment;
    environment.variable = [](std::string_view name) {
        const char* value = std::getenv(std::string(name).c_str());
        return std::string(value != nullptr ? value : "");
    };
    environment.isRoot = ::geteuid() == 0;
    environment.home = environment.variable("HOME");
    if (environment.home.empty()) {
        const passwd* user = ::getpwuid(::geteuid());
        environment.home = user != nullptr && user->pw_dir != nullptr ? user->pw_dir : "";
    }
    return environment;
}

std::variant<Directories, std::string> Directories::find(const Environment& environment) {
    Directories directories;
    for (const Root& root : kRoots) {
        std::optional<std::string> place = placeOf(root, environment);
        if (!place) {
            return formatted(
                "there is no place for the {} directory: set {} to a directory, or {} to its parent",
                root.what, root.variable, root.userVariable);
        }
        directories.*root.directory = std::move(*place);
    }
    return directories;
}

std::variant<Directories, std::string> Directories::prepare(const Environment& environment) {
    std::variant<Directories, std::string> found = find(environment);
    const Directories* directories = std::get_if<Directories>(&found);
    if (directories == nullptr) {
        return found;
    }
    for (const Root& root : kRoots) {
        const std::string& path = directories->*root.directory;
        const int failure = createDirectory(path);
        if (failure != 0) {
            return formatted(
                "cannot create the {} directory {}: {}; create it, or set {} to a directory that can be "
                "used",
                root.what, path, std::generic_category().message(failure), root.variable);
        }
    }
    for (const std::string& path :
         {directories->notifications(), directories->driverChannels(), directories->preferences()}) {
        // Without it what it would hold is absent, as it is without a file in it.
        static_cast<void>(createDirectory(path));
    }
    return found;
}

} // namespace tamblo
