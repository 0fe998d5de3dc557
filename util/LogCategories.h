#pragma once

#include "platform/StructuredLog.h"

#include <array>
#include <atomic>
#include <cstddef>
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

template <std::size_t kPlace> [[nodiscard]] const LogCategory& at() noexcept {
    return all[kPlace];
}
} // namespace log_categories

// To be called, as in `ZRReportingClientCategory()`; `docs/architecture.md` says who writes under which code.
inline constexpr auto& ZRReportingClientCategory = log_categories::at<0>;
inline constexpr auto& ZRReportingServiceDelegateCategory = log_categories::at<1>;
inline constexpr auto& ZRReportingSessionCategory = log_categories::at<2>;
inline constexpr auto& ZRReportingSessionLinkmeterCategory = log_categories::at<3>;
inline constexpr auto& ZRReportingDriverUtilityCategory = log_categories::at<4>;
inline constexpr auto& ZRReportingTraceCategory = log_categories::at<5>;
inline constexpr auto& ZRReportingJouleryCategory = log_categories::at<6>;
inline constexpr auto& ZRReportingQMXLogCategory = log_categories::at<7>;
inline constexpr auto& ZRReportingZephLogCategory = log_categories::at<8>;
inline constexpr auto& ZRReportingSummaryLogCategory = log_categories::at<9>;
inline constexpr auto& ZRReportingDPLogCategory = log_categories::at<10>;
inline constexpr auto& ZRReportingAudioRegistrationCategory = log_categories::at<11>;

} // namespace tamblo
