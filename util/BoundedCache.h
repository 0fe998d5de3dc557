#pragma once

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>

namespace tamblo {

/// Remembers what was built for the keys used of late, in a fixed number of places: a client that invents
/// keys only pushes others out. Key 0 is not for use. For one thread.
template <typename Built, std::size_t Sets = 64> class BoundedCache {
public:
    /// What is remembered for the key, else what `build` returns. The reference holds until the next call.
    template <typename Build> const Built& get(std::uint64_t key, Build&& build) {
        // Only the highest bits of the product depend on every bit of the key.
        Set& set = sets_[(key * 0x9E3779B97F4A7C15ULL) >> (64U - kSetBits)];
        for (std::size_t way = 0; way < kWays; ++way) {
            if (set.keys[way] == key) {
                return set.built[way];
            }
        }
        const std::size_t way = set.next++ % kWays;
        set.built[way] = build();
        set.keys[way] = key;
        return set.built[way];
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
    std::array<Set, Sets> sets_{};
};

} // namespace tamblo
