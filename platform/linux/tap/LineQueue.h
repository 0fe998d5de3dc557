#pragma once

#include "base/TextBuffer.h"

#include <algorithm>
#include <cstddef>
#include <deque>
#include <string_view>
#include <utility>

namespace tamblo {

/// Text that waits to be sent, in blocks: neither what is added nor what is sent moves what lies there,
/// however much that is, and memory goes back as it is sent.
class LineQueue {
public:
    [[nodiscard]] std::size_t size() const noexcept { return size_; }
    [[nodiscard]] bool empty() const noexcept { return size_ == 0; }

    void append(std::string_view text) {
        if (blocks_.empty() || blocks_.back().size() + text.size() > kBlock) {
            blocks_.emplace_back();
        }
        blocks_.back().append(text);
        size_ += text.size();
    }
    /// The next text to send: some of it, unless there is none.
    [[nodiscard]] std::string_view front(std::size_t most) const noexcept {
        return empty() ? std::string_view() : blocks_.front().view().substr(sent_, most);
    }
    /// At most as much as `front` has.
    void drop(std::size_t count) noexcept {
        sent_ += count;
        size_ -= count;
        if (blocks_.empty() || sent_ < blocks_.front().size()) {
            return;
        }
        sent_ = 0;
        if (blocks_.size() > 1) {
            blocks_.pop_front();
        } else {
            blocks_.front().clearAndKeep(kKept);
        }
    }

private:
    static constexpr std::size_t kBlock = 64U << 10U;
    /// What the last block keeps when it is empty.
    static constexpr std::size_t kKept = 16U << 10U;

    std::deque<TextBuffer> blocks_; ///< none of several is empty
    std::size_t sent_ = 0;          ///< of the first
    std::size_t size_ = 0;
};

} // namespace tamblo
