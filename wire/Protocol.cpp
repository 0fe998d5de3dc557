#include "wire/Protocol.h"

namespace tamblo::wire {

std::size_t beginFrame(TextBuffer& out) {
    const std::size_t start = out.size();
    (void)out.room(kLengthBytes);
    out.commit(kLengthBytes);
    return start;
}

bool finishFrame(TextBuffer& out, std::size_t start) noexcept {
    const std::size_t length = out.size() - start - kLengthBytes;
    if (length > kMaximumFrameBytes) {
        out.truncate(start);
        return false;
    }
    for (std::size_t i = 0; i < kLengthBytes; ++i) {
        out.data()[start + i] = static_cast<char>(length >> (8 * i));
    }
    return true;
}

std::string socketPath(std::string_view runtimeDirectory) {
    return std::string(runtimeDirectory).append("/").append(kServiceName);
}

} // namespace tamblo::wire
