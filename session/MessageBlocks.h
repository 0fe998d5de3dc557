#pragma once

#include <cstddef>
#include <vector>

namespace tamblo {

/// How many bytes the messages of a session's list take, for a few hundred of them together: a figure for
/// each message would be as large as some messages.
class MessageBlocks {
public:
    struct Block {
        std::size_t messages = 0;
        std::size_t bytes = 0;
    };

    /// One more message at the end of the list.
    void add(std::size_t bytes) {
        if (blocks_.empty() || blocks_.back().bytes >= kBytesOfBlock) {
            blocks_.emplace_back();
        }
        ++blocks_.back().messages;
        addToLast(bytes);
    }
    /// More bytes that go with the last message.
    void addToLast(std::size_t bytes) {
        blocks_.back().bytes += bytes;
        bytes_ += bytes;
    }
    /// The oldest blocks, as many as have so many bytes, or all: what they were altogether.
    [[nodiscard]] Block takeFirst(std::size_t bytes) {
        Block taken;
        auto end = blocks_.begin();
        for (; end != blocks_.end() && taken.bytes < bytes; ++end) {
            taken.messages += end->messages;
            taken.bytes += end->bytes;
        }
        blocks_.erase(blocks_.begin(), end);
        bytes_ -= taken.bytes;
        return taken;
    }
    [[nodiscard]] std::size_t bytes() const noexcept { return bytes_; }
    void clear() { *this = MessageBlocks(); }

private:
    static constexpr std::size_t kBytesOfBlock = 64U << 10U;

    std::vector<Block> blocks_;
    std::size_t bytes_ = 0;
};

} // namespace tamblo
