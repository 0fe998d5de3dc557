#pragma once

#include "wire/Protocol.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>

namespace tamblo::wire {

/// Takes the frames off the front of a run of received bytes, which it refers to.
class FrameSplitter {
public:
    explicit FrameSplitter(std::span<const std::uint8_t> received) noexcept : rest_(received) {}

    /// The CBOR item of the next frame, or nothing: `rest` then is the beginning of a frame that has not
    /// arrived in full, or of one that is longer than allowed.
    [[nodiscard]] std::optional<std::span<const std::uint8_t>> next() noexcept {
        const std::size_t whole = wanted();
        tooLong_ = whole > kLengthBytes + kMaximumFrameBytes;
        if (tooLong_ || rest_.size() < whole) {
            return std::nullopt;
        }
        const auto item = rest_.subspan(kLengthBytes, whole - kLengthBytes);
        rest_ = rest_.subspan(whole);
        return item;
    }
    [[nodiscard]] std::span<const std::uint8_t> rest() const noexcept { return rest_; }
    [[nodiscard]] bool tooLong() const noexcept { return tooLong_; }
    /// Bytes of the whole frame that `rest` begins, length included, as far as known.
    [[nodiscard]] std::size_t wanted() const noexcept {
        std::size_t length = 0;
        for (std::size_t i = 0; rest_.size() >= kLengthBytes && i < kLengthBytes; ++i) {
            length |= static_cast<std::size_t>(rest_[i]) << (8 * i);
        }
        return kLengthBytes + length;
    }

private:
    std::span<const std::uint8_t> rest_;
    bool tooLong_ = false;
};

} // namespace tamblo::wire
