#include "platform/Platform.h"

#include <optional>

namespace tamblo {

namespace {

std::optional<Platform>& installed() {
    static std::optional<Platform> platform;
    return platform;
}

} // namespace

void installPlatform(const Platform& platform) {
    installed().emplace(platform);
}

const Platform& platform() noexcept {
    return *installed();
}

} // namespace tamblo
