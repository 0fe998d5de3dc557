#pragma once

#include "base/KeySet.h"

#include <algorithm>
#include <array>
#include <cassert>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

namespace tamblo {

/// Where a few fixed keys stand, in one dictionary after another.
///
/// Of many dictionaries most share one of a few key sets: where the keys stand in it is found once and
/// remembered, so that reading the next such dictionary searches nothing. Made for one walk over many.
class KeyPlaces {
public:
    static constexpr std::size_t kMostKeys = 16;
    static constexpr std::uint32_t kAbsent = UINT32_MAX;
    using Places = std::array<std::uint32_t, kMostKeys>;

    /// At most `kMostKeys` keys, which must outlive the places.
    explicit KeyPlaces(std::span<const std::string_view> keys) noexcept
        : keys_(keys.first(std::min(keys.size(), kMostKeys))) {
        assert(keys.size() <= kMostKeys);
    }

    /// The index of each key in the key set, `kAbsent` for those that it does not hold. Lives until the next
    /// call.
    [[nodiscard]] const Places& in(const KeySet& keySet) {
        Known& known = known_[slotOf(keySet)];
        if (known.keySet.get() != &keySet) [[unlikely]] {
            find(keySet, known);
        }
        return known.places;
    }

private:
    static constexpr std::size_t kSlots = 32;

    struct Known {
        KeySetRef keySet; ///< held, so that no other can come to stand at its address
        Places places;
    };

    static std::size_t slotOf(const KeySet& keySet) noexcept {
        return (reinterpret_cast<std::uintptr_t>(&keySet) >> 6U) % kSlots;
    }
    void find(const KeySet& keySet, Known& known) const;

    const std::span<const std::string_view> keys_;
    std::array<Known, kSlots> known_;
};

} // namespace tamblo
