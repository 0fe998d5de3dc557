#include "wire/Directories.h"

#include "base/Format.h"

#include <algorithm>
#include <cstdlib>
#include <utility>

#include <pwd.h>
#include <unistd.h>

namespace tamblo::wire {

namespace {

std::string withoutTrailingSlashes(std::string path) {
    while (path.size() > 1 && path.back() == '/') {
        path.pop_back();
    }
    return path;
}

} // namespace

Environment Environment::ofThisProcess() {
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

std::optional<std::string> placeOf(const Root& root, const Environment& environment) {
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
    if (!root.belowHome.empty() && !environment.home.empty()) {
        return formatted("{}/{}/tamblo", withoutTrailingSlashes(environment.home), root.belowHome);
    }
    return std::nullopt;
}

} // namespace tamblo::wire
