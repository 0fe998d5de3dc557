#pragma once

#include "base/Mutex.h"
#include "os/SmallFile.h"
#include "platform/Clock.h"
#include "platform/StructuredLog.h"

#include <cstdint>
#include <string>
#include <string_view>

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

    /// Goes on from what the file holds. The count begins at 0 where there is none; and, with an error line
    /// that names the path, where it cannot be read or holds something else.
    DailyAllowance(const SmallFile& file, std::string_view path, StructuredLog& log);

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
