#include "tools/records/AccessFault.h"

#include "base/Format.h"
#include "os/FileDescriptor.h"
#include "os/LocalAddress.h"

#include <array>
#include <cerrno>
#include <optional>
#include <string_view>
#include <system_error>

#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo::tools {

namespace {

/// Room for a line of the user or group database; a name whose line needs more is shown as its number.
constexpr std::size_t kDatabaseLine = 16UL * 1024;

std::string userName(uid_t user) {
    std::array<char, kDatabaseLine> line{};
    passwd entry{};
    passwd* found = nullptr;
    (void)::getpwuid_r(user, &entry, line.data(), line.size(), &found);
    return found != nullptr ? found->pw_name : formatted("{}", user);
}

std::string groupName(gid_t group) {
    std::array<char, kDatabaseLine> line{};
    ::group entry{};
    ::group* found = nullptr;
    (void)::getgrgid_r(group, &entry, line.data(), line.size(), &found);
    return found != nullptr ? found->gr_name : formatted("{}", group);
}

std::string octal(mode_t mode) {
    std::string text = "0";
    for (const unsigned shift : {6U, 3U, 0U}) {
        text += static_cast<char>('0' + ((mode >> shift) & 7U));
    }
    return text;
}

/// The first directory on the way to the path that may not be passed, or else the path itself.
std::string placeOfDenial(const std::string& path) {
    for (std::size_t end = path.find('/', 1); end != std::string::npos; end = path.find('/', end + 1)) {
        std::string directory = path.substr(0, end);
        if (::access(directory.c_str(), X_OK) != 0 && errno == EACCES) {
            return directory;
        }
    }
    return path;
}

} // namespace

std::string describeFault(int error, const std::string& path) {
    if (error != EACCES && error != EPERM) {
        return std::generic_category().message(error);
    }
    const std::string place = placeOfDenial(path);
    struct stat status {};
    if (::stat(place.c_str(), &status) != 0) {
        return "permission denied";
    }
    return formatted("permission denied; {} belongs to {}:{} with mode {}", place, userName(status.st_uid),
                     groupName(status.st_gid), octal(status.st_mode));
}

int faultOfReading(const std::string& path) {
    return FileDescriptor(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK)).isOpen() ? 0 : errno;
}

int faultOfConnecting(const std::string& path) {
    const auto address = LocalAddress::of(path);
    if (!address) {
        return path.empty() ? ENOENT : ENAMETOOLONG;
    }
    const FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    return socket.isOpen() && ::connect(socket.get(), address->get(), address->size()) == 0 ? 0 : errno;
}

} // namespace tamblo::tools
