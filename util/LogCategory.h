#pragma once

#include "platform/StructuredLog.h"

#include <atomic>
#include <cstdint>
#include <string_view>

namespace tamblo {

/// One named log category of the subsystem "com.vandra.tamblo". The categories live as long as the process;
/// the least level that the platform writes for each is asked for once, at its first line, and kept, so that
/// a line that is off costs one compare. Any thread.
class LogCategory {
public:
    constexpr explicit LogCategory(std::string_view code) noexcept : code_(code) {}
    LogCategory(const LogCategory&) = delete;
    LogCategory& operator=(const LogCategory&) = delete;

    [[nodiscard]] std::string_view code() const noexcept { return code_; }
    [[nodiscard]] bool isOn(LogLevel level) const noexcept {
        const std::uint8_t least = least_.load(std::memory_order_relaxed);
        return place(level) >= least && (least != kNotAsked || ask(level));
    }
    /// The next line asks the platform again.
    void forgetThreshold() const noexcept { least_.store(kNotAsked, std::memory_order_relaxed); }

private:
    static constexpr std::uint8_t kNotAsked = 0;
    static constexpr std::uint8_t place(LogLevel level) noexcept {
        return static_cast<std::uint8_t>(static_cast<std::uint8_t>(level) + 1);
    }
    bool ask(LogLevel level) const noexcept;

    std::string_view code_;
    mutable std::atomic<std::uint8_t> least_{kNotAsked};
};

} // namespace tamblo
