#include "util/Mixing.h"

#include <random>

namespace tamblo {

std::uint64_t processSeed() noexcept {
    static const std::uint64_t seed = [] {
        std::random_device device;
        return std::uint64_t{device()} << 32U | device();
    }();
    return seed;
}

} // namespace tamblo
