#pragma once

#include "platform/DeviceConditions.h"

namespace tamblo {

/// Conditions that a test sets.
class FakeDeviceConditions final : public DeviceConditions {
public:
    [[nodiscard]] int thermalState() const override { return thermal; }
    [[nodiscard]] bool isLowPowerModeEnabled() const override { return lowPower; }

    int thermal = 0;
    bool lowPower = false;
};

} // namespace tamblo
