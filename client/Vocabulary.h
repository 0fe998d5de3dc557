#pragma once

#include "wire/Vocabulary.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

/// The categories, types and service types that messages and reporters carry, for clients. A value that has
/// no name here may be sent all the same, by a cast.
namespace tamblo::client {

using wire::EventCategory;
using wire::EventKind;
using wire::EventType;
using wire::ServiceType;
using wire::Subsystem;

[[nodiscard]] constexpr EventCategory category(Subsystem subsystem, EventKind kind) noexcept {
    return static_cast<EventCategory>(static_cast<std::uint32_t>(subsystem) |
                                      static_cast<std::uint32_t>(kind));
}
[[nodiscard]] constexpr EventCategory category(EventKind kind) noexcept {
    return category(Subsystem::none, kind);
}

/// By name, exact as the service writes it ("Volume", "Session_Playback", "Start", "longformaudio"), or by
/// number, decimal or with 0x.
[[nodiscard]] std::optional<EventCategory> parseCategory(std::string_view text);
[[nodiscard]] std::optional<EventType> parseType(std::string_view text);
[[nodiscard]] std::optional<ServiceType> parseServiceType(std::string_view text);

/// As above; empty for a number without a name.
[[nodiscard]] std::string categoryName(EventCategory category);
[[nodiscard]] std::string_view typeName(EventType type) noexcept;
/// "unknown" for a number without a name.
[[nodiscard]] std::string_view serviceTypeName(ServiceType type) noexcept;

} // namespace tamblo::client
