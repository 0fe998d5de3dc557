#include "platform/linux/Directories.h"

#include "base/Format.h"

#include <cerrno>
#include <optional>
#include <system_error>
#include <utility>

#include <sys/stat.h>

namespace tamblo {

namespace {

/// A root and where its place is kept.
struct Placed {
    wire::Root root;
    std::string Directories::*directory;
};

constexpr Placed kRoots[] = {
    {wire::kRuntimeRoot, &Directories::runtime},
    {wire::kConfigurationRoot, &Directories::configuration},
    {wire::kLogsRoot, &Directories::logs},
};

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

std::variant<Directories, std::string> Directories::find(const Environment& environment) {
    Directories directories;
    for (const auto& [root, directory] : kRoots) {
        std::optional<std::string> place = placeOf(root, environment);
        if (!place) {
            return formatted(
                "there is no place for the {} directory: set {} to a directory, or {} to its parent",
                root.what, root.variable, root.userVariable);
        }
        directories.*directory = std::move(*place);
    }
    return directories;
}

std::variant<Directories, std::string> Directories::prepare(const Environment& environment) {
    std::variant<Directories, std::string> found = find(environment);
    const Directories* directories = std::get_if<Directories>(&found);
    if (directories == nullptr) {
        return found;
    }
    for (const auto& [root, directory] : kRoots) {
        const std::string& path = directories->*directory;
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
