#pragma once

#include <cstdint>

namespace tamblo {

/// Spreads the bits of a number over all of a hash (the finaliser of SplitMix64).
[[nodiscard]] constexpr std::uint64_t mixBits(std::uint64_t number) noexcept {
    number = (number ^ (number >> 30U)) * 0xBF58476D1CE4E5B9ULL;
    number = (number ^ (number >> 27U)) * 0x94D049BB133111EBULL;
    return number ^ (number >> 31U);
}

/// A number that differs from process to process, for hashes of what clients choose.
[[nodiscard]] std::uint64_t processHashSeed() noexcept;

} // namespace tamblo
