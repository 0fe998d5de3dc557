#pragma once

#include "platform/DeviceConditions.h"
#include "platform/linux/device/RecentReading.h"

#include <chrono>
#include <string>

namespace tamblo {

/// The device's conditions as the kernel shows them below `/sys`.
///
/// The thermal state is the worst that any thermal zone says of itself by the highest of its trip points that
/// its temperature has reached: an active one (a fan starts) is 1, a passive one (the device is slowed down)
/// 2, a hot or critical one 3. What cannot be read or makes no sense is left out. A reading is kept for a
/// second, since a sensor may take milliseconds to answer.
class LinuxDeviceConditions final : public DeviceConditions {
public:
    static constexpr std::chrono::seconds kValidity{1};

    explicit LinuxDeviceConditions(std::string root = "/sys",
                                   SteadyNow now = &std::chrono::steady_clock::now);

    [[nodiscard]] int thermalState() const override;
    /// Whether the platform profile is the one that saves power. The quiet and the cool profile are choices
    /// about noise and heat and do not count.
    [[nodiscard]] bool isLowPowerModeEnabled() const override;

private:
    const std::string root_;
    mutable RecentReading<int> thermalState_;
    mutable RecentReading<bool> lowPower_;
};

} // namespace tamblo
