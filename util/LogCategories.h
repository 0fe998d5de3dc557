#pragma once

#include "platform/StructuredLog.h"

#include <array>
#include <atomic>
#include <cstdint>
#include <string_view>

namespace tamblo {

/// One named log category of the subsystem "com.vandra.tamblo". The categories live as long as the process.
/// The context tells each the least level that the platform writes, so that a line that is off costs one
/// compare; without a context, all are off. Any thread.
class LogCategory {
public:
    constexpr explicit LogCategory(std::string_view code) noexcept : code_(code) {}
    LogCategory(const LogCategory&) = delete;
    LogCategory& operator=(const LogCategory&) = delete;

    [[nodiscard]] std::string_view code() const noexcept { return code_; }
    [[nodiscard]] bool isOn(LogLevel level) const noexcept {
        return static_cast<std::uint8_t>(level) >= least_.load(std::memory_order_relaxed);
    }
    void turnOn(LogLevel least) const noexcept {
        least_.store(static_cast<std::uint8_t>(least), std::memory_order_relaxed);
    }
    void turnOff() const noexcept { least_.store(kOff, std::memory_order_relaxed); }

private:
    static constexpr std::uint8_t kOff = static_cast<std::uint8_t>(LogLevel::fault) + 1;

    const std::string_view code_;
    mutable std::atomic<std::uint8_t> least_{kOff};
};

namespace log_categories {
inline constinit const std::array<LogCategory, 12> all{
    LogCategory("zrrc"), LogCategory("zrrs"), LogCategory("zrrr"), LogCategory("zrri"),
    LogCategory("zrrd"), LogCategory("zrrt"), LogCategory("zrrp"), LogCategory("zrra"),
    LogCategory("zrrb"), LogCategory("zrru"), LogCategory("zrrl"), LogCategory("zrrz")};
}

inline const LogCategory& ZRReportingClientCategory() noexcept {
    return log_categories::all[0];
}
inline const LogCategory& ZRReportingServiceDelegateCategory() noexcept {
    return log_categories::all[1];
}
inline const LogCategory& ZRReportingSessionCategory() noexcept {
    return log_categories::all[2];
}
inline const LogCategory& ZRReportingSessionLinkmeterCategory() noexcept {
    return log_categories::all[3];
}
inline const LogCategory& ZRReportingDriverUtilityCategory() noexcept {
    return log_categories::all[4];
}
inline const LogCategory& ZRReportingTraceCategory() noexcept {
    return log_categories::all[5];
}
inline const LogCategory& ZRReportingJouleryCategory() noexcept {
    return log_categories::all[6];
}
inline const LogCategory& ZRReportingQMXLogCategory() noexcept {
    return log_categories::all[7];
}
inline const LogCategory& ZRReportingZephLogCategory() noexcept {
    return log_categories::all[8];
}
inline const LogCategory& ZRReportingSummaryLogCategory() noexcept {
    return log_categories::all[9];
}
inline const LogCategory& ZRReportingDPLogCategory() noexcept {
    return log_categories::all[10];
}
inline const LogCategory& ZRReportingAudioRegistrationCategory() noexcept {
    return log_categories::all[11];
}

} // namespace tamblo
