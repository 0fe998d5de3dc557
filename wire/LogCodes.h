#pragma once

#include <algorithm>
#include <array>
#include <string_view>

namespace tamblo::wire {

/// The codes by which the log's lines begin and `TAMBLO_LOG` takes and leaves them, and what is logged under
/// each.
struct LogCode {
    std::string_view code;
    std::string_view what;
};

inline constexpr std::array<LogCode, 12> kLogCodes{{
    {"zrrc", "the service's end"},
    {"zrrs", "clients, their requests and connections; settings; the rest of the service"},
    {"zrrr", "sessions, messages, workers' starts and stops"},
    {"zrri", "call quality"},
    {"zrrd", "driver statistics"},
    {"zrrt", "performance files"},
    {"zrrp", "power events"},
    {"zrra", "diagnostics metrics"},
    {"zrrb", "bug captures"},
    {"zrru", "the message about the session"},
    {"zrrl", "stack captures"},
    {"zrrz", "accessories"},
}};

[[nodiscard]] constexpr bool isLogCode(std::string_view code) noexcept {
    return std::any_of(kLogCodes.begin(), kLogCodes.end(),
                       [code](const LogCode& row) { return row.code == code; });
}

} // namespace tamblo::wire
