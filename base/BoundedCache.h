#pragma once

#include "base/Hash.h"

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <utility>

namespace tamblo {

/// Remembers what was built for the keys used of late, in a fixed number of places: a client that invents
/// keys only pushes others out. For one thread.
template <typename Built, std::size_t Sets = 64> class BoundedCache {
public:
    /// What is remembered for the key, else what `build` returns; key 0 is not for use. The reference holds
    /// until the next call.
    template <typename Build> const Built& get(std::uint64_t key, Build&& build) {
        const Built* const known = find(key, [](const Built&) { return true; });
        return known != nullptr ? *known : put(key, build());
    }

    /// For keys that are hashes, which different things may share: `isMeant` says of what is remembered for
    /// the key, or of a default, whether it is what is looked for. Null when it is not there.
    template <typename IsMeant> const Built* find(std::uint64_t key, IsMeant&& isMeant) const {
        const Set& set = sets_[indexOf(key)];
        for (std::size_t way = 0; way < kWays; ++way) {
            if (set.keys[way] == key && isMeant(set.built[way])) {
                return &set.built[way];
            }
        }
        return nullptr;
    }
    const Built& put(std::uint64_t key, Built built) {
        Set& set = sets_[indexOf(key)];
        const std::size_t way = set.next++ % kWays;
        set.keys[way] = key;
        return set.built[way] = std::move(built);
    }

private:
    static constexpr std::size_t kWays = 4;
    static constexpr std::size_t kSetBits = std::countr_zero(Sets);
    static_assert(Sets > 1 && std::has_single_bit(Sets), "the set is chosen by some bits of a product");

    struct Set {
        std::array<std::uint64_t, kWays> keys{};
        std::array<Built, kWays> built{};
        std::size_t next = 0;
    };

    /// Only the highest bits of the product depend on every bit of the key.
    [[nodiscard]] std::size_t indexOf(std::uint64_t key) const noexcept {
        return ((key ^ seed_) * 0x9E3779B97F4A7C15ULL) >> (64U - kSetBits);
    }

    /// Keys may be a client's choice.
    std::uint64_t seed_ = SeededHash().seed;
    std::array<Set, Sets> sets_{};
};

} // namespace tamblo
