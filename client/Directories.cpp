#include "client/Directories.h"

#include "wire/Protocol.h"

#include <algorithm>
#include <cstdlib>

#include <pwd.h>
#include <unistd.h>

namespace tamblo::client {

namespace {

std::string variable(const char* name) {
    const char* value = std::getenv(name);
    return value == nullptr ? std::string() : std::string(value);
}

std::string home() {
    std::string directory = variable("HOME");
    if (directory.empty()) {
        if (const passwd* user = ::getpwuid(::geteuid())) {
            directory = user->pw_dir;
        }
    }
    return directory;
}

std::string withoutTrailingSlashes(std::string path) {
    while (path.size() > 1 && path.back() == '/') {
        path.pop_back();
    }
    return path;
}

struct Root {
    const char* variable;
    const char* forRoot;
    const char* userVariable;
    const char* belowHome; ///< empty when there is no place for it there
};

std::string find(const Root& root) {
    // The variable may name several directories; the first is the unit's own.
    std::string path = variable(root.variable);
    path.resize(std::min(path.find(':'), path.size()));
    if (!path.empty()) {
        return withoutTrailingSlashes(std::move(path));
    }
    if (::geteuid() == 0) {
        return root.forRoot;
    }
    // A relative path in one of these variables counts as none (XDG Base Directory Specification).
    const std::string base = variable(root.userVariable);
    if (base.starts_with('/')) {
        return withoutTrailingSlashes(base) + "/tamblo";
    }
    if (*root.belowHome == '\0' || home().empty()) {
        return {};
    }
    return home() + root.belowHome;
}

} // namespace

Directories Directories::ofThisProcess() {
    return {
        .runtime = find({"RUNTIME_DIRECTORY", "/run/tamblo", "XDG_RUNTIME_DIR", ""}),
        .configuration =
            find({"CONFIGURATION_DIRECTORY", "/etc/tamblo", "XDG_CONFIG_HOME", "/.config/tamblo"}),
        .logs = find({"LOGS_DIRECTORY", "/var/log/tamblo", "XDG_STATE_HOME", "/.local/state/tamblo"}),
    };
}

std::string Directories::socketFile() const {
    return runtime.empty() ? std::string() : wire::socketPath(runtime);
}

} // namespace tamblo::client
