#include "tools/Files.h"

#include "base/Format.h"

#include <cerrno>
#include <cstdio>
#include <cstring>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo::tools {

namespace {

std::string failure(std::string_view act, const std::string& path) {
    return formatted("cannot {} {}: {}", act, path, std::strerror(errno));
}

bool writeAll(int descriptor, std::string_view content) {
    while (!content.empty()) {
        const ssize_t written = ::write(descriptor, content.data(), content.size());
        if (written < 0 && errno != EINTR) {
            return false;
        }
        content.remove_prefix(written < 0 ? 0 : static_cast<std::size_t>(written));
    }
    return true;
}

} // namespace

std::optional<std::string> readFile(const std::string& path) {
    const int descriptor = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (descriptor < 0) {
        return std::nullopt;
    }
    std::string content;
    char piece[64 * 1024];
    ssize_t count = 0;
    while ((count = ::read(descriptor, piece, sizeof piece)) > 0 || (count < 0 && errno == EINTR)) {
        content.append(piece, count < 0 ? 0 : static_cast<std::size_t>(count));
    }
    const int problem = errno;
    ::close(descriptor);
    errno = problem;
    return count < 0 ? std::nullopt : std::optional(std::move(content));
}

std::optional<std::string> replaceFile(const std::string& path, const std::string& temporary,
                                       std::string_view content) {
    constexpr mode_t ownerOnly = S_IRUSR | S_IWUSR;
    const int descriptor = ::open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, ownerOnly);
    if (descriptor < 0) {
        return failure("write", temporary);
    }
    const bool isWritten = writeAll(descriptor, content) && ::fsync(descriptor) == 0;
    const bool isDone =
        ::close(descriptor) == 0 && isWritten && std::rename(temporary.c_str(), path.c_str()) == 0;
    if (isDone) {
        return std::nullopt;
    }
    std::string text = failure("write", path);
    ::unlink(temporary.c_str());
    return text;
}

std::optional<std::string> createDirectories(const std::string& path) {
    if (::mkdir(path.c_str(), S_IRWXU) == 0 || errno == EEXIST) {
        return std::nullopt;
    }
    const std::size_t slash = path.find_last_of('/');
    if (errno != ENOENT || slash == std::string::npos || slash == 0) {
        return failure("create", path);
    }
    if (auto failed = createDirectories(path.substr(0, slash))) {
        return failed;
    }
    return ::mkdir(path.c_str(), S_IRWXU) == 0 || errno == EEXIST ? std::nullopt
                                                                  : std::optional(failure("create", path));
}

} // namespace tamblo::tools
