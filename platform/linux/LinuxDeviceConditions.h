#pragma once

#include "platform/DeviceConditions.h"

namespace tamblo {

/// The device's conditions as the kernel shows them.
class LinuxDeviceConditions final : public DeviceConditions {
public:
    [[nodiscard]] int thermalState() const override { return 0; }
    [[nodiscard]] bool isLowPowerModeEnabled() const override { return false; }
};

} // namespace tamblo
