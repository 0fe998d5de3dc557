#pragma once

namespace tamblo {

/// How hot the device is and whether it saves power. Any thread; may read files of the kernel's.
class DeviceConditions {
public:
    virtual ~DeviceConditions() = default;
    /// 0 nominal, 1 fair, 2 serious (the device slows down), 3 critical. A device that does not know how hot
    /// it is, such as a container, answers 0.
    [[nodiscard]] virtual int thermalState() const = 0;
    [[nodiscard]] virtual bool isLowPowerModeEnabled() const = 0;
};

} // namespace tamblo
