#pragma once

#include "platform/StructuredLog.h"
#include "tests/Files.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstddef>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include <poll.h>

namespace tamblo {

[[nodiscard]] inline bool isReadable(int descriptor, int milliseconds = 2000) {
    pollfd question{descriptor, POLLIN, 0};
    return ::poll(&question, 1, milliseconds) == 1;
}

/// Keeps what is logged, as `LEVEL CODE TEXT` with the level as a digit, without the prefix of 32 bytes.
class RecordingLog final : public StructuredLog {
public:
    [[nodiscard]] LogLevel threshold(std::string_view) const noexcept override { return LogLevel::debug; }
    void write(LogLevel level, std::string_view code, std::string_view line) noexcept override {
        const std::lock_guard lock(mutex_);
        EXPECT_EQ(line.find(':'), 25U) << line;
        lines_.push_back(std::to_string(static_cast<int>(level)) + " " + std::string(code) + " " +
                         std::string(line.substr(std::min<std::size_t>(line.size(), 32))));
    }
    /// The lines since the last call.
    [[nodiscard]] std::vector<std::string> take() {
        const std::lock_guard lock(mutex_);
        return std::exchange(lines_, {});
    }

private:
    std::mutex mutex_;
    std::vector<std::string> lines_;
};

} // namespace tamblo
