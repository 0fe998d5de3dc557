#pragma once

#include <cstdint>
#include <source_location>
#include <string>
#include <string_view>

namespace tamblo {

enum class LogLevel : std::uint8_t { debug, info, standard, error, fault };

/// Where log lines go. Any thread; must not fail and should not block.
class StructuredLog {
public:
    virtual ~StructuredLog() = default;
    /// The least level written for a category, by its four-letter code. Constant for the life of the process.
    [[nodiscard]] virtual LogLevel threshold(std::string_view categoryCode) const noexcept = 0;
    /// One line, without its line end; control characters in it are the implementation's to make harmless.
    virtual void write(LogLevel level, std::string_view categoryCode, std::string_view line) noexcept = 0;
    /// A line of a platform service's own: gives the text its prefix, and writes it when its level is on.
    void report(LogLevel level, std::string_view categoryCode, std::string_view text,
                const std::source_location& place = std::source_location::current());
};

/// What every line begins with, "%25s:%-5d " of the source unit's name and the line number.
void appendLinePrefix(std::string& line, const std::source_location& place);

} // namespace tamblo
