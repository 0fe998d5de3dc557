#include "os/Environment.h"

#include <cstdlib>

#include <pwd.h>
#include <unistd.h>

namespace tamblo {

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

} // namespace tamblo
