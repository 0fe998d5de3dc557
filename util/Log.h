#pragma once

#include "base/Dictionary.h"
#include "base/Format.h"
#include "base/Value.h"
#include "platform/StructuredLog.h"
#include "util/LogCategories.h"

#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>

namespace tamblo {

/// A payload in a log line: JSON.
void appendText(std::string& out, const Dictionary& dictionary);
/// A value in a log line: a string as it is, anything else as JSON.
void appendText(std::string& out, const Value& value);

/// Numbers in a log line: "[1, 2]".
struct NumberList {
    std::span<const std::int64_t> numbers;
};
void appendText(std::string& out, const NumberList& list);

[[nodiscard]] constexpr std::string_view yesOrNo(bool value) noexcept {
    return value ? "YES" : "NO";
}

} // namespace tamblo

/// One function per level. A line is the prefix, "%25s:%-5d " of the source unit's name and the line number,
/// and the formatted text. Arguments become text only when the level is on for the category.
namespace tamblo::log {

namespace detail {

void write(const LogCategory& category, LogLevel level, std::string_view line) noexcept;

template <typename... Arguments>
[[gnu::noinline, gnu::cold]] void writeLine(const LogCategory& category, LogLevel level,
                                            const FormatString<std::type_identity_t<Arguments>...>& format,
                                            const Arguments&... arguments) {
    std::string line;
    appendLinePrefix(line, format.location);
    appendFormatted(line, format.format, arguments...);
    write(category, level, line);
}

template <typename... Arguments>
void at(LogLevel level, const LogCategory& category,
        const FormatString<std::type_identity_t<Arguments>...>& format, const Arguments&... arguments) {
    if (category.isOn(level)) [[unlikely]] {
        writeLine<Arguments...>(category, level, format, arguments...);
    }
}

} // namespace detail

template <typename... Arguments>
void debug(const LogCategory& category, FormatString<std::type_identity_t<Arguments>...> format,
           const Arguments&... arguments) {
    detail::at<Arguments...>(LogLevel::debug, category, format, arguments...);
}

template <typename... Arguments>
void info(const LogCategory& category, FormatString<std::type_identity_t<Arguments>...> format,
          const Arguments&... arguments) {
    detail::at<Arguments...>(LogLevel::info, category, format, arguments...);
}

/// The default level.
template <typename... Arguments>
void standard(const LogCategory& category, FormatString<std::type_identity_t<Arguments>...> format,
              const Arguments&... arguments) {
    detail::at<Arguments...>(LogLevel::standard, category, format, arguments...);
}

template <typename... Arguments>
void error(const LogCategory& category, FormatString<std::type_identity_t<Arguments>...> format,
           const Arguments&... arguments) {
    detail::at<Arguments...>(LogLevel::error, category, format, arguments...);
}

template <typename... Arguments>
void fault(const LogCategory& category, FormatString<std::type_identity_t<Arguments>...> format,
           const Arguments&... arguments) {
    detail::at<Arguments...>(LogLevel::fault, category, format, arguments...);
}

} // namespace tamblo::log
