#pragma once

#include <algorithm>
#include <cstddef>

namespace tamblo {

/// What the allocator takes for a block of this size: a word of its own, and up to the next multiple of 16.
[[nodiscard]] constexpr std::size_t allocatedBytes(std::size_t size) noexcept {
    return std::max<std::size_t>((size + 8 + 15) / 16 * 16, 32);
}

} // namespace tamblo
