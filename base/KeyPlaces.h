#pragma once

#include "base/BoundedCache.h"
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
        const auto address = reinterpret_cast<std::uintptr_t>(&keySet);
        if (const Known* const known = known_.find(address, [](const Known&) { return true; })) {
            return known->places;
        }
        if (keySet.size() > kMostRememberedKeys || keySet.heldBytes() > kMostRememberedBytes) {
            // What is remembered is held for as long as this is there: larger ones than messages commonly
            // have are not.
            once_ = find(keySet).places;
            return once_;
        }
        return known_.put(address, find(keySet)).places;
    }

private:
    struct Known {
        KeySetRef keySet; ///< held, so that no other can come to stand at its address
        Places places;
    };

    [[nodiscard]] Known find(const KeySet& keySet) const {
        Known known{KeySetRef(&keySet), {}};
        for (std::size_t i = 0; i < keys_.size(); ++i) {
            const std::size_t place = keySet.find(keys_[i]);
            known.places[i] = place != KeySet::kNotFound ? static_cast<std::uint32_t>(place) : kAbsent;
        }
        return known;
    }

    static constexpr std::size_t kMostRememberedKeys = 256;
    static constexpr std::size_t kMostRememberedBytes = 64U << 10U;

    const std::span<const std::string_view> keys_;
    Places once_{};
    BoundedCache<Known, 8> known_;
};

} // namespace tamblo
