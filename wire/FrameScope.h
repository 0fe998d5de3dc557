#pragma once

#include "base/TextBuffer.h"
#include "wire/Protocol.h"

#include <cstddef>

namespace tamblo::wire {

/// Writes a frame's length to its place in front of the item.
inline void storeLength(char* to, std::size_t length) noexcept {
    for (std::size_t i = 0; i < kLengthBytes; ++i) {
        to[i] = static_cast<char>(length >> (8 * i));
    }
}

/// Writes a frame's item straight behind the place of its length, which is filled in at the end.
class FrameScope {
public:
    explicit FrameScope(TextBuffer& out) : out_(out), start_(out.size()) {
        (void)out.room(kLengthBytes);
        out.commit(kLengthBytes);
    }
    FrameScope(const FrameScope&) = delete;
    FrameScope& operator=(const FrameScope&) = delete;

    /// False, and the frame taken back, when it is longer than allowed.
    [[nodiscard]] bool finish() noexcept {
        const std::size_t length = out_.size() - start_ - kLengthBytes;
        if (length > kMaximumFrameBytes) {
            out_.truncate(start_);
            return false;
        }
        storeLength(out_.data() + start_, length);
        return true;
    }

private:
    TextBuffer& out_;
    std::size_t start_;
};

} // namespace tamblo::wire
