#pragma once

#include "base/Value.h"

#include <array>
#include <cstddef>
#include <string_view>

namespace tamblo {

/// The longer texts that were read last. A client sends the same few over and over (its application, a
/// device, a route): their values then share one block, which saves the time to check and copy them and, in a
/// session that retains its messages, most of the memory of their payloads. Bounded, and used by one thread
/// at a time; the values that it gives out may go to others.
class RecentTexts {
public:
    /// Shorter texts lie in their value. Longer ones would make the memory held here large, and seldom
    /// repeat.
    static constexpr std::size_t kShortest = 15;
    static constexpr std::size_t kLongest = 96;

    [[nodiscard]] static bool covers(std::string_view text) noexcept {
        return text.size() >= kShortest && text.size() <= kLongest;
    }
    /// Where the value of this text stands, or that of another text, whose place this one may take.
    [[nodiscard]] Value& place(std::string_view text) noexcept;

private:
    static constexpr std::size_t kSlots = 256;

    std::array<Value, kSlots> slots_;
};

} // namespace tamblo
