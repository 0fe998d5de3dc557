#include "wire/FrameSplitter.h"

namespace tamblo::wire {

namespace {

std::size_t lengthOf(std::span<const std::uint8_t> bytes) noexcept {
    return static_cast<std::size_t>(bytes[0]) | static_cast<std::size_t>(bytes[1]) << 8 |
           static_cast<std::size_t>(bytes[2]) << 16 | static_cast<std::size_t>(bytes[3]) << 24;
}

} // namespace

std::optional<std::span<const std::uint8_t>> FrameSplitter::next() noexcept {
    if (tooLong_ || rest_.size() < kLengthBytes) {
        return std::nullopt;
    }
    const std::size_t length = lengthOf(rest_);
    if (length > kMaximumFrameBytes) {
        tooLong_ = true;
        return std::nullopt;
    }
    if (rest_.size() - kLengthBytes < length) {
        return std::nullopt;
    }
    const std::span<const std::uint8_t> item = rest_.subspan(kLengthBytes, length);
    rest_ = rest_.subspan(kLengthBytes + length);
    return item;
}

std::size_t FrameSplitter::wanted() const noexcept {
    return rest_.size() < kLengthBytes ? kLengthBytes : kLengthBytes + lengthOf(rest_);
}

} // namespace tamblo::wire
