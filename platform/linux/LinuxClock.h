#pragma once

#include "platform/Clock.h"

namespace tamblo {

/// The system's real-time clock, read without entering the kernel.
class LinuxClock final : public Clock {
public:
    [[nodiscard]] WallTime now() const noexcept override;
    [[nodiscard]] std::chrono::seconds utcOffset(WallTime time) const override;
};

} // namespace tamblo
