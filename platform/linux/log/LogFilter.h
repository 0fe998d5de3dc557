#pragma once

#include "platform/StructuredLog.h"

#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// The least level written, for all categories and for single ones: `error,zrrs=debug`.
///
/// Words between commas, each a level (`debug`, `info`, `default`, `error`, `fault`) or CODE=level; later
/// ones win. Without a level for all it is `default`. Constant once made.
class LogFilter {
public:
    explicit LogFilter(std::string_view words);

    [[nodiscard]] LogLevel threshold(std::string_view categoryCode) const noexcept;
    /// The words that mean nothing.
    [[nodiscard]] const std::vector<std::string>& unknownWords() const noexcept { return unknownWords_; }

private:
    struct Category {
        std::string code;
        LogLevel level;
    };

    LogLevel level_ = LogLevel::standard;
    std::vector<Category> categories_;
    std::vector<std::string> unknownWords_;
};

} // namespace tamblo
