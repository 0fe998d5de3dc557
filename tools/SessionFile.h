#pragma once

#include "base/Dictionary.h"
#include "client/Vocabulary.h"

#include <optional>
#include <string>
#include <string_view>
#include <variant>

namespace tamblo::tools {

inline constexpr std::string_view kTimestampKey = "zrreporting_timestamp";

/// One line of a recorded session:
///
///   {"offset_s": 0.5, "category": "Session_Playback", "type": "Start", "payload": {…}}
///
/// The offset is in seconds since the session's start and may be missing; the payload too. Category and type
/// are names or numbers; a missing type is Generic.
struct SessionLine {
    std::optional<double> offset;
    client::EventCategory category{};
    client::EventType type{};
    Dictionary payload;
};

/// Or a line that says what is wrong.
[[nodiscard]] std::variant<SessionLine, std::string> parseSessionLine(std::string_view text);

/// Says when each line of a session is due, in seconds after the first: at its offset, or, without one, as
/// long after the first as its payload's timestamp is after the first one's; without both, together with the
/// line before.
class SessionSpacing {
public:
    [[nodiscard]] double due(const SessionLine& line);

private:
    std::optional<double> timestampOfStart_; ///< what offset 0 is
    double last_ = 0;
};

} // namespace tamblo::tools
