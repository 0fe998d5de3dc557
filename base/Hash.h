#pragma once

#include <concepts>
#include <cstddef>
#include <cstdint>

namespace tamblo {

/// Spreads the bits of a number over all of a hash (the finaliser of SplitMix64).
[[nodiscard]] constexpr std::uint64_t mixBits(std::uint64_t number) noexcept {
    number = (number ^ (number >> 30U)) * 0xBF58476D1CE4E5B9ULL;
    number = (number ^ (number >> 27U)) * 0x94D049BB133111EBULL;
    return number ^ (number >> 31U);
}

/// A hash of numbers that clients choose: it differs from process to process, so that none can choose such
/// that collide.
struct SeededHash {
    SeededHash() noexcept;
    template <std::integral Number> std::size_t operator()(Number number) const noexcept {
        return mixBits(static_cast<std::uint64_t>(number) ^ seed);
    }
    std::uint64_t seed;
};

} // namespace tamblo
