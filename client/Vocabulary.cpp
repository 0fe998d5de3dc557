#include "client/Vocabulary.h"

#include "base/NumberText.h"

#include <type_traits>

namespace tamblo::client {

namespace {

template <typename T>
std::optional<T> parse(std::optional<std::uint32_t> named, std::string_view unknownName,
                       std::string_view text) {
    using Number = std::underlying_type_t<T>;
    if (text == unknownName) {
        return T::unknown;
    }
    const auto number = named ? static_cast<Number>(*named) : parseDecimalOrHex<Number>(text);
    return number ? std::optional(static_cast<T>(*number)) : std::nullopt;
}

/// The kind that is named; "Undefined" names none.
std::optional<std::uint32_t> kindNamed(std::string_view name) noexcept {
    const auto kind = wire::numberNamed(wire::kKindNames, name);
    return kind == 0U ? std::nullopt : kind;
}

} // namespace

std::optional<EventCategory> parseCategory(std::string_view text) {
    const std::size_t separator = text.find('_');
    if (separator == std::string_view::npos) {
        return parse<EventCategory>(kindNamed(text), wire::kUnknownName, text);
    }
    const auto kind = kindNamed(text.substr(separator + 1));
    for (const auto& [subsystem, name] : wire::kSubsystemNames) {
        if (kind && name == text.substr(0, separator)) {
            return category(subsystem, static_cast<EventKind>(*kind));
        }
    }
    return std::nullopt;
}

std::optional<EventType> parseType(std::string_view text) {
    return parse<EventType>(wire::numberNamed(wire::kTypeNames, text), wire::kUnknownName, text);
}

std::optional<ServiceType> parseServiceType(std::string_view text) {
    return parse<ServiceType>(wire::numberNamed(wire::kServiceNames, text), wire::kUnknownServiceName, text);
}

std::string categoryName(EventCategory category) {
    if (category == EventCategory::unknown) {
        return std::string(wire::kUnknownName);
    }
    const auto value = static_cast<std::uint32_t>(category);
    const std::uint32_t kind = value & 0xFFFF;
    const std::string_view subsystem = wire::subsystemName(value);
    const bool isSubsystemNamed = kind == value || !subsystem.empty();
    if (kind == 0 || kind >= wire::kKindNames.size() || !isSubsystemNamed) {
        return {};
    }
    const std::string kindName(wire::kKindNames[kind]);
    return subsystem.empty() ? kindName : std::string(subsystem) + "_" + kindName;
}

std::string_view typeName(EventType type) noexcept {
    const auto number = static_cast<std::size_t>(type);
    if (number < wire::kTypeNames.size()) {
        return wire::kTypeNames[number];
    }
    return type == EventType::unknown ? wire::kUnknownName : std::string_view();
}

std::string_view serviceTypeName(ServiceType type) noexcept {
    const auto number = static_cast<std::size_t>(type);
    return number < wire::kServiceNames.size() ? wire::kServiceNames[number] : wire::kUnknownServiceName;
}

} // namespace tamblo::client
