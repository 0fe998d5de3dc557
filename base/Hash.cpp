#include "base/Hash.h"

#include <random>

namespace tamblo {

std::uint64_t processHashSeed() noexcept {
    static const std::uint64_t seed = [] {
        std::random_device device;
        return std::uint64_t{device()} << 32U | device();
    }();
    return seed;
}

} // namespace tamblo
