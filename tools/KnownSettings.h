#pragma once

#include "base/Value.h"

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

/// What the service reads and posts besides requests, as tables for people: `preference set` holds values
/// against them, `list` prints them. The service itself reads each where it needs it.
namespace tamblo::tools {

enum class PreferenceKind : std::uint8_t {
    any,
    flag,
    number,
    limit,     ///< a number above 0
    names,     ///< an array of texts
    octalText, ///< permissions, such as "0640"
    object,
};

struct KnownPreference {
    std::string_view domain;
    std::string_view key;
    PreferenceKind kind;
    std::string what;
};

[[nodiscard]] std::span<const KnownPreference> knownPreferences();
/// Null for one that the service does not read.
[[nodiscard]] const KnownPreference* findKnownPreference(std::string_view domain, std::string_view key);
/// Whether the domain is one of the service's own.
[[nodiscard]] bool isServiceDomain(std::string_view domain) noexcept;
/// Whether the service takes such a value.
[[nodiscard]] bool isOfKind(PreferenceKind kind, const Value& value);
/// What a value of the kind is: "an array of texts, such as …".
[[nodiscard]] std::string_view describe(PreferenceKind kind) noexcept;

struct KnownNotification {
    std::string_view name;
    std::string_view what;
};
[[nodiscard]] std::span<const KnownNotification> knownNotifications() noexcept;

} // namespace tamblo::tools
