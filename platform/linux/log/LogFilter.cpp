#include "platform/linux/log/LogFilter.h"

#include "base/SplitText.h"
#include "wire/LogCodes.h"

#include <algorithm>
#include <array>
#include <optional>
#include <utility>

namespace tamblo {

namespace {

constexpr std::array<std::pair<std::string_view, LogLevel>, 5> kLevels{{
    {"debug", LogLevel::debug},
    {"info", LogLevel::info},
    {"default", LogLevel::standard},
    {"error", LogLevel::error},
    {"fault", LogLevel::fault},
}};

std::optional<LogLevel> levelNamed(std::string_view name) noexcept {
    const auto found = std::ranges::find(kLevels, name, [](const auto& row) { return row.first; });
    return found != kLevels.end() ? std::optional(found->second) : std::nullopt;
}

} // namespace

LogFilter::LogFilter(std::string_view words) {
    while (!words.empty()) {
        const std::string_view word = trimmed(takeUpTo(',', words));
        if (word.empty()) {
            continue;
        }
        const std::size_t equals = word.find('=');
        const bool isForCategory = equals != std::string_view::npos;
        const std::string_view code = isForCategory ? trimmed(word.substr(0, equals)) : std::string_view();
        const std::optional<LogLevel> level =
            levelNamed(isForCategory ? trimmed(word.substr(equals + 1)) : word);
        if (!level || (isForCategory && !wire::isLogCode(code))) {
            unknownWords_.emplace_back(word);
        } else if (isForCategory) {
            categories_.insert(categories_.begin(), {std::string(code), *level});
        } else {
            level_ = *level;
        }
    }
}

LogLevel LogFilter::threshold(std::string_view categoryCode) const noexcept {
    const auto found = std::ranges::find(categories_, categoryCode, &Category::code);
    return found != categories_.end() ? found->level : level_;
}

} // namespace tamblo
