#pragma once

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <string_view>

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

/// The same of texts (SipHash-1-3): whoever does not know the seed cannot make texts that collide. Texts of
/// all kinds may be looked up in a table that has it.
struct SeededTextHash {
    using is_transparent = void;

    [[nodiscard]] std::size_t operator()(std::string_view text) const noexcept;
};

} // namespace tamblo
