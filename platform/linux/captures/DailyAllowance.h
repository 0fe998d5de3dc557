#pragma once

#include "base/Mutex.h"
#include "platform/Clock.h"
#include "platform/StructuredLog.h"

#include <cstdint>
#include <string>

namespace tamblo {

/// How many captures there may still be today, so that a fault that comes again and again does not fill the
/// disk or keep the device busy with looking at itself.
///
/// A day is one of UTC, as the clock has it; any other day than the last one begins anew, an earlier one too,
/// lest a clock that once ran ahead shut captures off until that day. The count outlives the process in a
/// file, which its owner writes after each capture: a service that is killed in between has one free. Any
/// thread.
class DailyAllowance {
public:
    static constexpr std::uint64_t kCapturesADay = 20;

    /// Reads what the file holds: nothing, when there is none; with rubbish in it, there is an error line,
    /// and the count begins at 0.
    DailyAllowance(const std::string& path, StructuredLog& log);

    /// Takes one capture of the day, if there is one left.
    [[nodiscard]] bool take(WallTime now);
    /// What the file is to hold.
    [[nodiscard]] std::string text() const;

private:
    mutable Mutex mutex_;
    std::string day_ TAMBLO_GUARDED_BY(mutex_); ///< as "2026-03-01"; empty before the first capture ever
    std::uint64_t taken_ TAMBLO_GUARDED_BY(mutex_) = 0;
};

} // namespace tamblo
