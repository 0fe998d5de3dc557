#include "base/Hash.h"

#include <random>

namespace tamblo {

SeededHash::SeededHash() noexcept {
    static const std::uint64_t ofProcess = [] {
        std::random_device device;
        return std::uint64_t{device()} << 32U | device();
    }();
    seed = ofProcess;
}

} // namespace tamblo
