#pragma once

namespace tamblo {

/// How hot the device is and whether it saves power. Any thread; may read files of the kernel's.
class DeviceConditions {
public:
    static constexpr int kUnknownThermalState = -1;

    virtual ~DeviceConditions() = default;
    /// 0 nominal, 1 fair, 2 serious (the device slows down), 3 critical; unknown on a device that cannot tell
    /// how hot is too hot for it.
    [[nodiscard]] virtual int thermalState() const = 0;
    [[nodiscard]] virtual bool isLowPowerModeEnabled() const = 0;
};

} // namespace tamblo
