#include "platform/linux/LinuxAccessories.h"

namespace tamblo {

std::vector<Accessory> LinuxAccessories::connectedEarbuds() {
    return {};
}

} // namespace tamblo
