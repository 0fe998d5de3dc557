#pragma once

#include "wire/Vocabulary.h"

#include <cstdint>
#include <string>
#include <string_view>

/// The names of the analytics events that a recorded message becomes: one under its session's service, and
/// one that all services share.
namespace tamblo::wire {

/// In the place of a service's name, in the name that all of them share.
inline constexpr std::string_view kAllServices = "tamblo";

[[nodiscard]] inline std::string eventName(std::string_view service, std::uint32_t category,
                                           std::uint16_t type) {
    return std::string("com.vandra.")
        .append(service)
        .append(".")
        .append(eventCategoryName(category))
        .append(".")
        .append(eventTypeName(type));
}

} // namespace tamblo::wire
