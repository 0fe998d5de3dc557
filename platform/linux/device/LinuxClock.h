#pragma once

#include "base/Mutex.h"
#include "platform/Clock.h"

namespace tamblo {

/// The system's real-time clock, read without entering the kernel, and the time zone that the device has
/// when asked.
class LinuxClock final : public Clock {
public:
    [[nodiscard]] WallTime now() const noexcept override;
    [[nodiscard]] std::chrono::seconds utcOffset(WallTime time) const override;
    void sleepFor(std::chrono::microseconds time) override;

private:
    mutable Mutex zone_; ///< held while the C library's zone, which is the whole process's, is read
};

} // namespace tamblo
