#include "os/SmallFile.h"

#include "os/FileDescriptor.h"

#include <algorithm>
#include <system_error>

#include <fcntl.h>
#include <sys/stat.h>

namespace tamblo {

SmallFile SmallFile::read(const std::string& path, std::size_t limit, Links links) {
    const int linkFlag = links == Links::refused ? O_NOFOLLOW : 0;
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY | linkFlag));
    struct stat status {};
    if (!file.isOpen() || ::fstat(file.get(), &status) != 0) {
        return {.error = errno};
    }
    // The kernel's own files have no size.
    const auto size = static_cast<std::size_t>(status.st_size);
    const FileState state = FileState::of(status);
    const bool isStateOld = state.isOld();
    SmallFile content;
    if (!S_ISREG(status.st_mode)) {
        content.error = S_ISDIR(status.st_mode) ? EISDIR : EINVAL;
    } else if (size > limit) {
        content.error = EFBIG;
    } else {
        content = read(file.get(), limit, size);
    }
    content.state = state;
    content.isStateOld = isStateOld;
    return content;
}

SmallFile SmallFile::read(int descriptor, std::size_t limit, std::size_t expected) {
    constexpr std::size_t kLeastRoom = 4096;
    std::string text;
    for (std::size_t filled = 0;;) {
        // One byte beyond what is expected tells the end, one beyond the limit that there is more.
        text.resize(std::min(limit + 1, std::max({expected + 1, 2 * filled, kLeastRoom})));
        const ssize_t count = ::read(descriptor, text.data() + filled, text.size() - filled);
        if (count < 0 && errno != EINTR) {
            return {.error = errno};
        }
        if (count == 0) {
            text.resize(filled);
            return {.text = std::move(text)};
        }
        filled += static_cast<std::size_t>(std::max<ssize_t>(count, 0));
        if (filled > limit) {
            return {.error = EFBIG};
        }
    }
}

std::string SmallFile::reason() const {
    return error == EINVAL ? "not a regular file" : std::generic_category().message(error);
}

} // namespace tamblo
