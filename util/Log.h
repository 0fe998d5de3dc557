#pragma once

#include "base/Dictionary.h"
#include "base/Format.h"
#include "base/Value.h"
#include "platform/StructuredLog.h"
#include "util/LogCategories.h"

#include <cstddef>
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

/// Numbers in a log line: "[1, 2]"; of many, the first ones and how many there are besides.
struct NumberList {
    static constexpr std::size_t kMost = 16;

    std::span<const std::int64_t> numbers;
};
void appendText(std::string& out, const NumberList& list);

[[nodiscard]] constexpr std::string_view yesOrNo(bool value) noexcept {
    return value ? "YES" : "NO";
}

} // namespace tamblo

/// One function per level. A line is the prefix, "%25s:%-5d " of the source unit's name and the line number,
/// and the formatted text. Arguments become text only when the level is on for the category, and the log has
/// room for one more such line of the client for whom the thread works (`LogOrigin`).
///
/// So the plain names are limited here, as most work is done for a client, and `ownError` alone is not; with
/// the platform's `StructuredLog` it is the other way round.
namespace tamblo::log {

namespace detail {

/// No text in a line is longer, as no line is written with more.
inline constexpr std::size_t kLongestText = 8192;

[[nodiscard]] bool admits(const LogKind& kind) noexcept;
void write(const LogKind& kind, std::string_view line) noexcept;

template <typename Argument> decltype(auto) cut(const Argument& argument) {
    if constexpr (std::is_convertible_v<const Argument&, std::string_view>) {
        return std::string_view(argument).substr(0, kLongestText);
    } else {
        return argument;
    }
}

template <typename... Arguments>
[[gnu::noinline, gnu::cold]] void writeLine(const LogKind& kind, const Arguments&... arguments) {
    std::string line;
    appendLinePrefix(line, kind.place);
    appendFormatted(line, kind.format, cut(arguments)...);
    write(kind, line);
}

template <typename... Arguments>
[[gnu::noinline, gnu::cold]] bool writeIfAdmitted(const LogKind& kind, const Arguments&... arguments) {
    const bool isAdmitted = admits(kind);
    if (isAdmitted) {
        writeLine(kind, arguments...);
    }
    return isAdmitted;
}

template <typename... Arguments>
bool at(LogLevel level, const LogCategory& category,
        const FormatString<std::type_identity_t<Arguments>...>& format, const Arguments&... arguments) {
    return category.isOn(level) &&
           writeIfAdmitted({level, category.code(), format.format, format.location}, arguments...);
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

/// The default level. Whether the line was written: many in a row may as well end with the first that is not.
template <typename... Arguments>
bool standard(const LogCategory& category, FormatString<std::type_identity_t<Arguments>...> format,
              const Arguments&... arguments) {
    return detail::at<Arguments...>(LogLevel::standard, category, format, arguments...);
}

template <typename... Arguments>
void error(const LogCategory& category, FormatString<std::type_identity_t<Arguments>...> format,
           const Arguments&... arguments) {
    detail::at<Arguments...>(LogLevel::error, category, format, arguments...);
}

/// An error of the service's own, which it says once for each state of things: written even when that shows
/// while the thread works for a client who has had its share of lines.
template <typename... Arguments>
void ownError(const LogCategory& category, FormatString<std::type_identity_t<Arguments>...> format,
              const Arguments&... arguments) {
    if (category.isOn(LogLevel::error)) {
        detail::writeLine({LogLevel::error, category.code(), format.format, format.location}, arguments...);
    }
}

template <typename... Arguments>
void fault(const LogCategory& category, FormatString<std::type_identity_t<Arguments>...> format,
           const Arguments&... arguments) {
    detail::at<Arguments...>(LogLevel::fault, category, format, arguments...);
}

} // namespace tamblo::log
