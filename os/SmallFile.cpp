#include "os/SmallFile.h"

#include "base/SplitText.h"
#include "os/FileDescriptor.h"

#include <algorithm>
#include <array>
#include <cerrno>

#include <fcntl.h>
#include <sys/stat.h>

namespace tamblo {

SmallFile SmallFile::read(const std::string& path, std::size_t limit, Links links) {
    const int linkFlag = links == Links::refused ? O_NOFOLLOW : 0;
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY | linkFlag));
    struct stat status {};
    if (!file.isOpen() || ::fstat(file.get(), &status) != 0) {
        return {errno};
    }
    if (!S_ISREG(status.st_mode)) {
        return {S_ISDIR(status.st_mode) ? EISDIR : EINVAL};
    }
    SmallFile content;
    std::array<char, 4096> bytes;
    for (;;) {
        // One byte beyond the limit tells that there is more. The size in `status` says nothing about the
        // kernel's own files.
        const std::size_t wanted = std::min(bytes.size(), limit + 1 - content.text.size());
        const ssize_t count = ::read(file.get(), bytes.data(), wanted);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count < 0) {
            return {errno};
        }
        if (count == 0) {
            return content;
        }
        content.text.append(bytes.data(), static_cast<std::size_t>(count));
        if (content.text.size() > limit) {
            return {EFBIG};
        }
    }
}

std::string_view SmallFile::trimmed() const noexcept {
    return tamblo::trimmed(text);
}

} // namespace tamblo
