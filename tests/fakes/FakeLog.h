#pragma once

#include "platform/StructuredLog.h"

#include <atomic>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// Keeps every line, taken apart.
class FakeLog final : public StructuredLog {
public:
    struct Line {
        LogLevel level;
        std::string category;
        std::string prefix; ///< source unit, colon, line number and blank
        std::string text;
    };

    [[nodiscard]] LogLevel threshold(std::string_view) const noexcept override { return threshold_; }
    void write(LogLevel level, std::string_view categoryCode, std::string_view line) noexcept override;

    /// Every category writes from this level on; takes effect with the next platform, or
    /// `forgetLogThresholds`.
    void setThreshold(LogLevel level) noexcept { threshold_ = level; }
    [[nodiscard]] std::vector<Line> lines() const;
    /// The texts that begin so, in order.
    [[nodiscard]] std::vector<std::string> texts(std::string_view beginning = {}) const;
    [[nodiscard]] std::size_t count(std::string_view beginning) const { return texts(beginning).size(); }
    void clear();

private:
    std::atomic<LogLevel> threshold_{LogLevel::debug};
    mutable std::mutex mutex_;
    std::vector<Line> lines_;
};

} // namespace tamblo
