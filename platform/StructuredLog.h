#pragma once

#include "base/Format.h"

#include <cstdint>
#include <source_location>
#include <string>
#include <string_view>
#include <type_traits>

namespace tamblo {

enum class LogLevel : std::uint8_t { debug, info, standard, error, fault };

/// What the lines of one place in the code have in common. The texts are constants of the program.
struct LogKind {
    LogLevel level = LogLevel::standard;
    std::string_view categoryCode;
    std::string_view format;
    std::source_location place;
};

/// What every line begins with, "%25s:%-5d " of the source unit's name and the line number.
void appendLinePrefix(std::string& line, const std::source_location& place);

/// Where log lines go. Any thread; must not fail and should not block.
class StructuredLog {
public:
    virtual ~StructuredLog() = default;
    /// The least level written for a category, by its four-letter code. Constant for the life of the process.
    [[nodiscard]] virtual LogLevel threshold(std::string_view categoryCode) const noexcept = 0;
    /// Whether one more line of this kind may be written on behalf of the client for whom the thread works
    /// (`LogOrigin`). Asked before the line is formatted; what is refused is counted, and told in one line.
    [[nodiscard]] virtual bool admits(const LogKind&) noexcept { return true; }
    /// One line, without its line end; control characters in it are the implementation's to make harmless.
    virtual void write(LogLevel level, std::string_view categoryCode, std::string_view line) noexcept = 0;

    // Here the plain name is without a limit, as platform services mostly speak for themselves; in
    // `util/Log.h` it is the other way round.

    /// A line of a platform service's own, never limited: gives the text its prefix, and writes it when its
    /// level is on, whoever the thread works for.
    void report(LogLevel level, std::string_view categoryCode, std::string_view text,
                const std::source_location& place = std::source_location::current());
    /// A line of a platform service's that a client causes as often as it likes, limited: within what is
    /// admitted.
    template <typename... Arguments>
    void reportOfClient(LogLevel level, std::string_view categoryCode,
                        const FormatString<std::type_identity_t<Arguments>...>& format,
                        const Arguments&... arguments) {
        if (level >= threshold(categoryCode) &&
            admits({level, categoryCode, format.format, format.location})) {
            std::string line;
            appendLinePrefix(line, format.location);
            appendFormatted(line, format.format, arguments...);
            write(level, categoryCode, line);
        }
    }
};

} // namespace tamblo
