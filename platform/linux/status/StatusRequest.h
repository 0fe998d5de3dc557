#pragma once

#include "platform/ZRReportingServiceProtocol.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <variant>

namespace tamblo {

/// What a reader of the status socket asks for.
struct StatusRequest {
    enum class Kind : std::uint8_t { status, clients, sessions, session, metrics, plainMetrics };

    Kind kind = Kind::status;
    ReporterID reporterID = 0; ///< of a session

    /// From a line of words; an empty one asks for the status. A text says what is wrong with it.
    [[nodiscard]] static std::variant<StatusRequest, std::string> parse(std::string_view line);

    [[nodiscard]] bool isMetrics() const noexcept {
        return kind == Kind::metrics || kind == Kind::plainMetrics;
    }
    friend bool operator==(const StatusRequest&, const StatusRequest&) = default;
};

/// A request as a reader has sent it: a line, or what a browser or a monitoring system sends (HTTP), whose
/// path is the line and whose headers follow until an empty one.
struct StatusQuestion {
    std::string line;
    bool isHttp = false;
    bool takesOpenMetrics = false; ///< as the headers say

    /// Whether what has arrived is all of it.
    [[nodiscard]] static bool isWhole(std::string_view received) noexcept;
    [[nodiscard]] static StatusQuestion of(std::string_view received);
    /// What goes before a text of so many bytes that answers it: headers, or nothing.
    [[nodiscard]] std::string headOf(std::size_t bytes, const StatusRequest* request) const;
};

} // namespace tamblo
