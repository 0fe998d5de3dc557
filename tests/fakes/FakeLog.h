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
    void write(LogLevel level, std::string_view categoryCode, std::string_view line) noexcept override {
        // "%25s:%-5d ": the text begins after the blank that follows the number and its padding.
        const std::size_t colon = line.find(':');
        std::size_t text = line.find(' ', colon);
        text = text < colon + 6 ? colon + 7 : text + 1;
        const std::lock_guard held(mutex_);
        lines_.push_back({level, std::string(categoryCode), std::string(line.substr(0, text)),
                          std::string(line.substr(text))});
    }

    /// What each category is told when the context is made.
    void setThreshold(LogLevel level) noexcept { threshold_ = level; }
    [[nodiscard]] std::vector<Line> lines() const {
        const std::lock_guard held(mutex_);
        return lines_;
    }
    /// The texts that begin so, in order.
    [[nodiscard]] std::vector<std::string> texts(std::string_view beginning = {}) const {
        std::vector<std::string> found;
        for (const Line& line : lines()) {
            if (line.text.starts_with(beginning)) {
                found.push_back(line.text);
            }
        }
        return found;
    }
    [[nodiscard]] std::size_t count(std::string_view beginning) const { return texts(beginning).size(); }
    void clear() {
        const std::lock_guard held(mutex_);
        lines_.clear();
    }

private:
    std::atomic<LogLevel> threshold_{LogLevel::debug};
    mutable std::mutex mutex_;
    std::vector<Line> lines_;
};

} // namespace tamblo
