#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

namespace tamblo {

/// Remembers what was built for the keys used of late, in a fixed number of places: a client that invents
/// keys only pushes others out. Key 0 is not for use. For one thread.
template <typename Built, std::size_t Sets = 64> class BoundedCache {
public:
    /// What is remembered for the key, else what `build` returns. The reference holds until the next call.
    template <typename Build> const Built& get(std::uint64_t key, Build&& build) {
        Set& set = sets_[(key * 0x9E3779B97F4A7C15ULL) >> 32U & (Sets - 1)];
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
    static_assert((Sets & (Sets - 1)) == 0, "the set is chosen by the low bits");

    struct Set {
        std::array<std::uint64_t, kWays> keys{};
        std::array<Built, kWays> built{};
        std::size_t next = 0;
    };
    std::array<Set, Sets> sets_{};
};

} // namespace tamblo
